// The fake install transaction log: keeps every entry, in order.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "runtime/plist/value.h"
#include "platform/transaction_log.h"

namespace appsync {

class StateFields;

struct TransactionLogEntry {
  enum class Kind { Step, Scenario };
  Kind kind = Kind::Step;
  std::uint64_t step = 0;
  std::uint64_t party = 0;  // steps only
  std::uint64_t phase = 0;  // steps only
  std::string scenario;     // scenarios only
  bool success = false;
  std::string bundleID;
  std::string description;

  // One line: "step 3 party 1 phase 1 success 1 com.example.app: Create coordinator" or
  // "scenario \"Asset install\" step 0 success 1 com.example.app: assertion succeeded".
  std::string describe() const;
  bool operator==(const TransactionLogEntry&) const = default;
};

// No operation fails. Safe from any thread.
class FakeTransactionLog final : public AITransactionLog {
 public:
  // The log objects passed to initializeWithLog, in call order (null ones included).
  std::vector<std::shared_ptr<const OSLogObject>> initializeCalls() const;
  std::vector<TransactionLogEntry> entries() const;
  // Entries of one kind.
  std::vector<TransactionLogEntry> steps() const;
  std::vector<TransactionLogEntry> scenarios() const;
  void clear();
  // Every entry as a property list, and back (replacing the entries without calling the
  // listener; the objects passed to initializeWithLog are not state). loadState throws
  // StateFormatError naming the bad field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);
  // Called with each new entry, in the order they are kept (the simulator writes its file so).
  // The listener must not log to this transaction log.
  void setEntryListener(std::function<void(const TransactionLogEntry&)> listener);

  void initializeWithLog(const std::shared_ptr<const OSLogObject>& log) override;
  void logStep(std::uint64_t step, std::uint64_t party, std::uint64_t phase, bool success,
               const std::string& bundleID, const std::string& description) override;
  void logScenario(const std::string& scenario, std::uint64_t step, bool success,
                   const std::string& bundleID, const std::string& description) override;

 private:
  void add(TransactionLogEntry entry);
  std::vector<TransactionLogEntry> entriesOfKind(TransactionLogEntry::Kind kind) const;

  std::mutex listenerMutex_;  // taken before mutex_
  mutable std::mutex mutex_;
  std::vector<std::shared_ptr<const OSLogObject>> initializeCalls_;
  std::vector<TransactionLogEntry> entries_;
  std::function<void(const TransactionLogEntry&)> listener_;
};

}  // namespace appsync
