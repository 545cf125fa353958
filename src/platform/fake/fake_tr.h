// The fake host sync framework: an in-memory log, a settable recoverable-error test, and a
// device service that records what it is asked to prioritise and cancel.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "runtime/log/log.h"
#include "platform/fake/callback_thread.h"
#include "platform/fake/fake_service.h"
#include "platform/tr.h"

namespace appsync {

// Operations: "prioritizeAsset:withCompletion:" (can fail: the completion receives the error),
// "cancelAssetTransferForFailedAsset:".
class FakeTRDeviceService final : public TRDeviceService, public FakeService {
 public:
  FakeTRDeviceService();

  // Whether the host offers `operation` (both are offered by default). Calling an operation
  // that is not offered aborts, as it would on an older host.
  void setRespondsTo(Operation operation, bool responds);
  bool respondsTo(Operation operation) const override;

  // Records the identifier and runs `completion` on the callback thread with the scripted
  // error, or null.
  void prioritizeAsset(std::shared_ptr<TRAsset> asset,
                       std::function<void(ErrorRef)> completion) override;
  // Records the identifier.
  void cancelAssetTransferForFailedAsset(std::shared_ptr<TRAsset> asset) override;

  // Identifiers of the assets passed, in call order.
  std::vector<std::string> prioritizedIdentifiers() const;
  std::vector<std::string> cancelledIdentifiers() const;

  // The identifiers and what the host offers, as a property list, and back (replacing them, with
  // no events; a missing field is empty, a missing switch is offered). Completions are not
  // state. loadState throws StateFormatError naming the bad field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);

  // Waits until every completion handed out so far has run.
  void drain() { callbacks_.drain(); }
  // Hold and release the completions.
  CallbackThread& callbackThread() { return callbacks_; }

 private:
  mutable std::mutex mutex_;
  bool respondsToPrioritize_ = true;
  bool respondsToCancel_ = true;
  std::vector<std::string> prioritized_;
  std::vector<std::string> cancelled_;
  CallbackThread callbacks_{"fake-tr-device"};  // last: stops first
};

class FakeTRHost final : public TRHostFramework {
 public:
  FakeTRHost();

  // The logger behind TRGetLogCategory. Its sink is logSink() until a test sets another.
  Logger& logger() { return logger_; }
  const std::shared_ptr<MemoryLogSink>& logSink() const { return sink_; }

  // Replaces the recoverable-error test; null restores the default.
  void setRecoverableErrorPredicate(std::function<bool(const ErrorRef&)> predicate);
  // The default test: POSIX errors EAGAIN, ETIMEDOUT, ECONNRESET, ENETDOWN and ENETUNREACH, and
  // any error whose userInfo has "recoverable" set to boolean true. Null is not recoverable.
  static bool defaultIsRecoverable(const ErrorRef& error);

  FakeTRDeviceService& deviceService() { return *deviceService_; }
  const FakeTRDeviceService& deviceService() const { return *deviceService_; }

  LogCategory& TRGetLogCategory(int category) override;
  bool TRIsRecoverableError(const ErrorRef& error) override;
  std::shared_ptr<TRDeviceService> TRDeviceServiceSharedInstance() override;

 private:
  Logger logger_;
  std::shared_ptr<MemoryLogSink> sink_;
  mutable std::mutex mutex_;
  std::function<bool(const ErrorRef&)> predicate_;
  std::shared_ptr<FakeTRDeviceService> deviceService_;
};

}  // namespace appsync
