// The fake install transaction log.
#include "platform/fake/fake_transaction_log.h"

namespace appsync {

std::string TransactionLogEntry::describe() const {
  std::string out;
  if (kind == Kind::Step) {
    out = "step " + std::to_string(step) + " party " + std::to_string(party) + " phase " +
          std::to_string(phase);
  } else {
    out = "scenario \"" + scenario + "\" step " + std::to_string(step);
  }
  out += std::string(" success ") + (success ? "1" : "0") + " " + bundleID + ": " + description;
  return out;
}

std::vector<std::shared_ptr<const OSLogObject>> FakeTransactionLog::initializeCalls() const {
  std::lock_guard lock(mutex_);
  return initializeCalls_;
}

std::vector<TransactionLogEntry> FakeTransactionLog::entries() const {
  std::lock_guard lock(mutex_);
  return entries_;
}

std::vector<TransactionLogEntry> FakeTransactionLog::entriesOfKind(
    TransactionLogEntry::Kind kind) const {
  std::lock_guard lock(mutex_);
  std::vector<TransactionLogEntry> out;
  for (const auto& e : entries_) {
    if (e.kind == kind) out.push_back(e);
  }
  return out;
}

std::vector<TransactionLogEntry> FakeTransactionLog::steps() const {
  return entriesOfKind(TransactionLogEntry::Kind::Step);
}

std::vector<TransactionLogEntry> FakeTransactionLog::scenarios() const {
  return entriesOfKind(TransactionLogEntry::Kind::Scenario);
}

void FakeTransactionLog::clear() {
  std::lock_guard lock(mutex_);
  entries_.clear();
  initializeCalls_.clear();
}

void FakeTransactionLog::setEntryListener(
    std::function<void(const TransactionLogEntry&)> listener) {
  std::lock_guard lock(mutex_);
  listener_ = std::move(listener);
}

void FakeTransactionLog::initializeWithLog(const std::shared_ptr<const OSLogObject>& log) {
  std::lock_guard lock(mutex_);
  initializeCalls_.push_back(log);
}

void FakeTransactionLog::logStep(std::uint64_t step, std::uint64_t party, std::uint64_t phase,
                                 bool success, const std::string& bundleID,
                                 const std::string& description) {
  TransactionLogEntry e;
  e.kind = TransactionLogEntry::Kind::Step;
  e.step = step;
  e.party = party;
  e.phase = phase;
  e.success = success;
  e.bundleID = bundleID;
  e.description = description;
  add(std::move(e));
}

void FakeTransactionLog::logScenario(const std::string& scenario, std::uint64_t step, bool success,
                                     const std::string& bundleID, const std::string& description) {
  TransactionLogEntry e;
  e.kind = TransactionLogEntry::Kind::Scenario;
  e.scenario = scenario;
  e.step = step;
  e.success = success;
  e.bundleID = bundleID;
  e.description = description;
  add(std::move(e));
}

void FakeTransactionLog::add(TransactionLogEntry entry) {
  // Held across the listener call so that the listener sees entries in the order they were kept.
  std::lock_guard order(listenerMutex_);
  std::function<void(const TransactionLogEntry&)> listener;
  {
    std::lock_guard lock(mutex_);
    entries_.push_back(entry);
    listener = listener_;
  }
  if (listener) listener(entry);
}

}  // namespace appsync
