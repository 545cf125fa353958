// What the coordinated road's files share: the cancellation reasons, the transaction-log steps
// and the file URLs handed to promises.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/platform.h"
#include "runtime/error.h"

namespace appsync::coordination {

// "TRError" codes of the reasons given when something is cancelled.
inline constexpr std::int64_t kPreparationFailedReason = 1;
inline constexpr std::int64_t kRestoreFailedReason = 29;
inline constexpr std::int64_t kInstallFailedReason = 30;

// Transaction-log steps of the coordinated road; the party is always 1.
inline constexpr std::uint64_t kInstallStep = 1;
inline constexpr std::uint64_t kCoordinatorStep = 3;
inline constexpr std::uint64_t kPlaceholderStep = 4;
inline constexpr std::uint64_t kIconCopyStep = 5;
inline constexpr std::uint64_t kUninstallStep = 7;

// Registry install types given to placeholders and install options.
inline constexpr std::uint64_t kSyncInstallType = 4;
inline constexpr std::uint64_t kRestoreInstallType = 2;
inline constexpr std::uint64_t kDowngradeInstallType = 7;
inline constexpr std::uint64_t kIntentionallyDemotedInstallType = 8;

// An error of the sync framework's domain with no user information.
inline ErrorRef reason(std::int64_t code) { return makeError(kTRErrorDomain, code); }

// "file://PATH".
inline std::string fileURL(std::string_view path) { return "file://" + std::string(path); }

// Phase 1 (begin, success true) or phase 2 (end) of one step.
inline void beginStep(const Platform& platform, std::uint64_t step, const std::string& bundleID,
                      const std::string& description) {
  platform.transactionLog.logStep(step, 1, 1, true, bundleID, description);
}
inline void endStep(const Platform& platform, std::uint64_t step, bool success,
                    const std::string& bundleID, const std::string& description) {
  platform.transactionLog.logStep(step, 1, 2, success, bundleID, description);
}

}  // namespace appsync::coordination
