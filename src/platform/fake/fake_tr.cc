// The fake host sync framework and its device service.
#include "platform/fake/fake_tr.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <utility>

namespace appsync {

namespace {

constexpr std::string_view kPrioritize = "prioritizeAsset:withCompletion:";
constexpr std::string_view kCancel = "cancelAssetTransferForFailedAsset:";

[[noreturn]] void notOffered(std::string_view operation) {
  std::fprintf(stderr, "TRDeviceService: %.*s called on a host that does not offer it\n",
               static_cast<int>(operation.size()), operation.data());
  std::abort();
}

}  // namespace

FakeTRDeviceService::FakeTRDeviceService()
    : FakeService("FakeTRDeviceService", std::string(kTRErrorDomain),
                  {{kPrioritize, true}, {kCancel, false}}) {}

void FakeTRDeviceService::setRespondsTo(Operation operation, bool responds) {
  std::lock_guard lock(mutex_);
  if (operation == Operation::prioritizeAsset) {
    respondsToPrioritize_ = responds;
  } else {
    respondsToCancel_ = responds;
  }
}

bool FakeTRDeviceService::respondsTo(Operation operation) const {
  std::lock_guard lock(mutex_);
  return operation == Operation::prioritizeAsset ? respondsToPrioritize_ : respondsToCancel_;
}

void FakeTRDeviceService::prioritizeAsset(std::shared_ptr<TRAsset> asset,
                                          std::function<void(ErrorRef)> completion) {
  if (!respondsTo(Operation::prioritizeAsset)) notOffered(kPrioritize);
  ErrorRef error = beginCall(kPrioritize);
  {
    std::lock_guard lock(mutex_);
    prioritized_.push_back(asset ? asset->identifier() : std::string());
  }
  if (completion) {
    callbacks_.post(
        [completion = std::move(completion), error = std::move(error)] { completion(error); });
  }
}

void FakeTRDeviceService::cancelAssetTransferForFailedAsset(std::shared_ptr<TRAsset> asset) {
  if (!respondsTo(Operation::cancelAssetTransferForFailedAsset)) notOffered(kCancel);
  beginCall(kCancel);
  std::lock_guard lock(mutex_);
  cancelled_.push_back(asset ? asset->identifier() : std::string());
}

std::vector<std::string> FakeTRDeviceService::prioritizedIdentifiers() const {
  std::lock_guard lock(mutex_);
  return prioritized_;
}

std::vector<std::string> FakeTRDeviceService::cancelledIdentifiers() const {
  std::lock_guard lock(mutex_);
  return cancelled_;
}

FakeTRHost::FakeTRHost()
    : sink_(std::make_shared<MemoryLogSink>()),
      deviceService_(std::make_shared<FakeTRDeviceService>()) {
  logger_.setSink(sink_);
}

void FakeTRHost::setRecoverableErrorPredicate(std::function<bool(const ErrorRef&)> predicate) {
  std::lock_guard lock(mutex_);
  predicate_ = std::move(predicate);
}

bool FakeTRHost::defaultIsRecoverable(const ErrorRef& error) {
  if (!error) return false;
  if (error->domain == kPOSIXErrorDomain) {
    switch (error->code) {
      case EAGAIN:
      case ETIMEDOUT:
      case ECONNRESET:
      case ENETDOWN:
      case ENETUNREACH:
        return true;
      default:
        break;
    }
  }
  const plist::Value* flag = error->userInfo.find("recoverable");
  return flag && flag->boolean() && *flag->boolean();
}

LogCategory& FakeTRHost::TRGetLogCategory(int category) { return logger_.category(category); }

bool FakeTRHost::TRIsRecoverableError(const ErrorRef& error) {
  std::function<bool(const ErrorRef&)> predicate;
  {
    std::lock_guard lock(mutex_);
    predicate = predicate_;
  }
  return predicate ? predicate(error) : defaultIsRecoverable(error);
}

std::shared_ptr<TRDeviceService> FakeTRHost::TRDeviceServiceSharedInstance() {
  return deviceService_;
}

}  // namespace appsync
