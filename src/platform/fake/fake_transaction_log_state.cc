// Saved state of the fake install transaction log: every entry, in order.
#include "platform/fake/fake_transaction_log.h"
#include "platform/fake/state_fields.h"

namespace appsync {

namespace {

plist::Dict transactionEntryState(const TransactionLogEntry& entry) {
  plist::Dict state;
  if (entry.kind == TransactionLogEntry::Kind::Step) {
    state.set("kind", "step");
    state.set("step", plist::Integer::fromUnsigned(entry.step));
    state.set("party", plist::Integer::fromUnsigned(entry.party));
    state.set("phase", plist::Integer::fromUnsigned(entry.phase));
  } else {
    state.set("kind", "scenario");
    state.set("scenario", entry.scenario);
    state.set("step", plist::Integer::fromUnsigned(entry.step));
  }
  state.set("success", entry.success);
  state.set("bundleID", entry.bundleID);
  state.set("description", entry.description);
  return state;
}

TransactionLogEntry transactionEntryFromState(const StateFields& fields) {
  TransactionLogEntry entry;
  const std::string kind = fields.string("kind");
  if (kind == "step") {
    entry.kind = TransactionLogEntry::Kind::Step;
    entry.party = fields.unsignedInteger("party");
    entry.phase = fields.unsignedInteger("phase");
  } else if (kind == "scenario") {
    entry.kind = TransactionLogEntry::Kind::Scenario;
    entry.scenario = fields.string("scenario");
  } else {
    fields.fail("kind", "expected \"step\" or \"scenario\"");
  }
  entry.step = fields.unsignedInteger("step");
  entry.success = fields.boolean("success", false);
  entry.bundleID = fields.string("bundleID");
  entry.description = fields.string("description");
  return entry;
}

}  // namespace

plist::Dict FakeTransactionLog::saveState() const {
  std::lock_guard lock(mutex_);
  plist::Array entries;
  for (const TransactionLogEntry& entry : entries_)
    entries.emplace_back(transactionEntryState(entry));
  return {{"entries", std::move(entries)}};
}

void FakeTransactionLog::loadState(const StateFields& state) {
  std::vector<TransactionLogEntry> entries;
  for (const StateFields& fields : state.records("entries")) {
    entries.push_back(transactionEntryFromState(fields));
  }
  std::lock_guard lock(mutex_);
  entries_ = std::move(entries);
}

}  // namespace appsync
