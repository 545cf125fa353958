// Errors as they cross every boundary of the plugin: a domain, a code, details and a cause.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "runtime/plist/value.h"

namespace appsync {

// The domains the plugin creates or tests.
inline constexpr std::string_view kTRErrorDomain = "TRError";
inline constexpr std::string_view kPOSIXErrorDomain = "POSIX";
inline constexpr std::string_view kEMInstallerErrorDomain = "EMInstallerErrorDomain";
inline constexpr std::string_view kAppRegistryErrorDomain = "AppRegistryError";
// Our own: property-list files that cannot be read as such.
inline constexpr std::string_view kPropertyListErrorDomain = "PropertyListError";

// userInfo key holding a human-readable explanation.
inline constexpr std::string_view kErrorDescriptionKey = "description";
// userInfo key holding the file path an error is about.
inline constexpr std::string_view kErrorPathKey = "path";

struct Error {
  std::string domain;
  std::int64_t code = 0;
  plist::Dict userInfo;
  std::shared_ptr<const Error> underlying;

  // Single line: Error Domain=TRError Code=30 "text" UserInfo={...} (underlying: ...).
  std::string describe() const;
};

using ErrorRef = std::shared_ptr<const Error>;

// An error with no user information, e.g. makeError(kTRErrorDomain, 30).
ErrorRef makeError(std::string_view domain, std::int64_t code);
// An error whose userInfo carries a description (and optionally a path).
ErrorRef makeError(std::string_view domain, std::int64_t code, std::string_view description,
                   std::string_view path = {});
// The POSIX error for errno value `err` about `path`, described with strerror's text.
ErrorRef makePOSIXError(int err, std::string_view path = {});

// Stores `error` through `out` when the caller gave an out-parameter.
inline void setError(ErrorRef* out, ErrorRef error) {
  if (out) *out = std::move(error);
}

}  // namespace appsync
