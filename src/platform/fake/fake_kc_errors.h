// The errors the fake install-coordination service reports: its domain and codes.
#pragma once

#include <cstdint>
#include <string_view>

#include "runtime/error.h"

namespace appsync {

inline constexpr std::string_view kKCErrorDomain = "KCErrorDomain";

// A scripted failure without an error of its own (the default of FakeService).
inline constexpr std::int64_t kKCErrorScriptedFailure = 1;
// A required object was absent, or was not made by this service.
inline constexpr std::int64_t kKCErrorInvalidArgument = 2;
// The object can no longer be changed: configuration complete, cancelled, or finished.
inline constexpr std::int64_t kKCErrorInvalidState = 3;
// A coordinator of another kind exists for the bundle identifier.
inline constexpr std::int64_t kKCErrorCoordinatorKindMismatch = 4;
// A placeholder was handed over before its configuration was complete.
inline constexpr std::int64_t kKCErrorPlaceholderNotConfigured = 5;
// The coordinator (or placeholder) already holds such an object; each is set once.
inline constexpr std::int64_t kKCErrorAlreadySet = 6;
// Uninstall of an application the registry does not know.
inline constexpr std::int64_t kKCErrorUnknownApplication = 7;
// The registry refused to remove the application.
inline constexpr std::int64_t kKCErrorUninstallFailed = 8;
// The registry refused to install the delivered package; the underlying error says why.
inline constexpr std::int64_t kKCErrorInstallFailed = 9;
// A coordinator cancelled without a reason of its own.
inline constexpr std::int64_t kKCErrorCanceled = 10;

// userInfo key of KCCreateUserPresentableError's detail number.
inline constexpr std::string_view kKCErrorDetailKey = "detail";

inline ErrorRef makeKCError(std::int64_t code, std::string_view description) {
  return makeError(kKCErrorDomain, code, description);
}

}  // namespace appsync
