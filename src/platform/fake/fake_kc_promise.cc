// The fake install-coordination service's promises: progress, completion, path and
// cancellation, and the report to the coordinator that holds them.
#include "platform/fake/fake_kc_promise.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include "platform/fake/fake_kc_coordinator.h"
#include "platform/fake/fake_kc_errors.h"
#include "platform/fake/fake_kc_object_support.h"

namespace appsync {

using fake_kc::fail;

FakeKCPromiseBase::FakeKCPromiseBase(std::weak_ptr<FakeKCServiceHooks> service,
                                     std::string_view className, bool hasPath, std::string name,
                                     std::uint64_t client, std::optional<std::string> transferPath,
                                     std::uint64_t diskSpaceNeeded, std::uint64_t identifier)
    : name_(std::move(name)),
      client_(client),
      diskSpaceNeeded_(diskSpaceNeeded),
      service_(std::move(service)),
      className_(className),
      hasPath_(hasPath),
      identifier_(identifier),
      state_(State{.transferPath = std::move(transferPath)}) {}

bool FakeKCPromiseBase::isFulfilled() const {
  State s = state_.get();
  return s.complete && !s.cancelled;
}

void FakeKCPromiseBase::attachTo(std::weak_ptr<FakeKCAppInstallCoordinator> coordinator) {
  state_.with([&](State& s) { s.owner = std::move(coordinator); });
}

void FakeKCPromiseBase::setPercent(double fraction) {
  state_.with([&](State& s) { s.percent = std::clamp(fraction, 0.0, 1.0); });
}

void FakeKCPromiseBase::setCompleteFlag(bool complete) {
  std::weak_ptr<FakeKCAppInstallCoordinator> owner;
  bool changed = state_.with([&](State& s) {
    if (s.cancelled || s.complete == complete) return false;
    s.complete = complete;
    owner = s.owner;
    return true;
  });
  if (changed && complete) reportChange(owner);
}

void FakeKCPromiseBase::setPath(std::string path) {
  std::weak_ptr<FakeKCAppInstallCoordinator> owner;
  bool wasComplete = state_.with([&](State& s) {
    s.transferPath = std::move(path);
    owner = s.owner;
    return s.complete;
  });
  // A promise completed before its path was known becomes installable now.
  if (wasComplete) reportChange(owner);
}

bool FakeKCPromiseBase::cancelOnce(const ErrorRef& reason) {
  return state_.with([&](State& s) {
    if (s.cancelled) return false;
    s.cancelled = true;
    s.cancelReason = reason;
    return true;
  });
}

void FakeKCPromiseBase::cancelByService(const ErrorRef& reason) { cancelOnce(reason); }

bool FakeKCPromiseBase::cancel(const ErrorRef& reason, ErrorRef* error) {
  if (ErrorRef e = fake_kc::scripted(service_, "KCPromise cancelForReason:client:error:")) {
    return fail(error, e);
  }
  if (cancelOnce(reason)) return true;
  return fail(error,
              makeKCError(kKCErrorInvalidState, "promise " + name_ + " is already cancelled"));
}

void FakeKCPromiseBase::reportChange(const std::weak_ptr<FakeKCAppInstallCoordinator>& owner) {
  if (auto coordinator = owner.lock()) coordinator->reportChange();
}

std::string FakeKCPromiseBase::describeState() const {
  using fake_kc::oneLine, fake_kc::yesNo;
  State s = state_.get();
  char percent[32];
  std::snprintf(percent, sizeof percent, "%g", s.percent);
  std::string text =
      "<" + className_ + " name=" + oneLine(name_) + " client=" + std::to_string(client_) +
      " diskSpaceNeeded=" + std::to_string(diskSpaceNeeded_) + " percentComplete=" + percent +
      " complete=" + yesNo(s.complete) + " cancelled=" + yesNo(s.cancelled);
  if (hasPath_) text += " transferPath=" + (s.transferPath ? oneLine(*s.transferPath) : "(null)");
  return text + ">";
}

FakeKCPromisedTransferToPath::FakeKCPromisedTransferToPath(
    std::weak_ptr<FakeKCServiceHooks> service, std::string name, std::uint64_t client,
    std::optional<std::string> transferPath, std::uint64_t diskSpaceNeeded,
    std::uint64_t identifier)
    : FakeKCPromiseImpl(std::move(service), "KCPromisedTransferToPath", true, std::move(name),
                        client, std::move(transferPath), diskSpaceNeeded, identifier) {}

FakeKCPromisedOutOfBandTransfer::FakeKCPromisedOutOfBandTransfer(
    std::weak_ptr<FakeKCServiceHooks> service, std::string name, std::uint64_t client,
    std::uint64_t diskSpaceNeeded, std::uint64_t identifier)
    : FakeKCPromiseImpl(std::move(service), "KCPromisedOutOfBandTransfer", false, std::move(name),
                        client, std::nullopt, diskSpaceNeeded, identifier) {}

}  // namespace appsync
