// The install transaction log: a record of install steps and scenario events per application.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

namespace appsync {

// A log object of a subsystem and category, handed to the transaction log at start-up.
struct OSLogObject {
  std::string subsystem;
  std::string category;
};

// The transaction log. Safe from any thread; entries keep the order of the calls. No operation
// fails or reports anything.
class AITransactionLog {
 public:
  AITransactionLog() = default;
  virtual ~AITransactionLog() = default;
  AITransactionLog(const AITransactionLog&) = delete;
  AITransactionLog& operator=(const AITransactionLog&) = delete;

  // Names where entries go; `log` is shared with the transaction log, which may keep it.
  virtual void initializeWithLog(const std::shared_ptr<const OSLogObject>& log) = 0;
  // One step of one application's install: phase 1 begins it, phase 2 ends it.
  virtual void logStep(std::uint64_t step, std::uint64_t party, std::uint64_t phase, bool success,
                       const std::string& bundleID, const std::string& description) = 0;
  // One event of a named scenario.
  virtual void logScenario(const std::string& scenario, std::uint64_t step, bool success,
                           const std::string& bundleID, const std::string& description) = 0;
};

}  // namespace appsync
