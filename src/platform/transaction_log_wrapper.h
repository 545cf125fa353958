// A forwarding wrapper of the install transaction log, for tests that change one operation and
// keep the rest.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <type_traits>

#include "platform/transaction_log.h"

namespace appsync {

// Forwards every call to `target` (not owned; it must outlive the wrapper). Derive and
// override the operations to change.
class AITransactionLogWrapper : public AITransactionLog {
 public:
  explicit AITransactionLogWrapper(AITransactionLog& target) : target_(target) {}

  AITransactionLog& target() const { return target_; }

  void initializeWithLog(const std::shared_ptr<const OSLogObject>& log) override {
    target_.initializeWithLog(log);
  }
  void logStep(std::uint64_t step, std::uint64_t party, std::uint64_t phase, bool success,
               const std::string& bundleID, const std::string& description) override {
    target_.logStep(step, party, phase, success, bundleID, description);
  }
  void logScenario(const std::string& scenario, std::uint64_t step, bool success,
                   const std::string& bundleID, const std::string& description) override {
    target_.logScenario(scenario, step, success, bundleID, description);
  }

 private:
  AITransactionLog& target_;
};

static_assert(!std::is_abstract_v<AITransactionLogWrapper>, "forward every operation");

}  // namespace appsync
