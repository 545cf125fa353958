// The application registry's data objects: install progress and bundle proxies.
#include "platform/ar.h"

#include <string>

namespace appsync {

std::uint64_t ARInstallProgress::installState() const {
  std::lock_guard lock(mutex_);
  return state_;
}

void ARInstallProgress::setInstallState(std::uint64_t state) {
  std::lock_guard lock(mutex_);
  state_ = state;
}

std::uint64_t ARInstallProgress::installPhase() const {
  std::lock_guard lock(mutex_);
  return phase_;
}

void ARInstallProgress::setInstallPhase(std::uint64_t phase) {
  std::lock_guard lock(mutex_);
  phase_ = phase;
}

std::int64_t ARInstallProgress::totalUnitCount() const {
  std::lock_guard lock(mutex_);
  return total_;
}

void ARInstallProgress::setTotalUnitCount(std::int64_t units) {
  std::lock_guard lock(mutex_);
  total_ = units;
}

std::int64_t ARInstallProgress::completedUnitCount() const {
  std::lock_guard lock(mutex_);
  return completed_;
}

void ARInstallProgress::setCompletedUnitCount(std::int64_t units) {
  std::lock_guard lock(mutex_);
  completed_ = units;
}

void ARInstallProgress::cancel() {
  std::lock_guard lock(mutex_);
  cancelled_ = true;
}

bool ARInstallProgress::isCancelled() const {
  std::lock_guard lock(mutex_);
  return cancelled_;
}

std::string ARInstallProgress::describe() const {
  std::lock_guard lock(mutex_);
  return "<ARInstallProgress " + identifier_ + " state=" + std::to_string(state_) +
         " phase=" + std::to_string(phase_) + " completed=" + std::to_string(completed_) + "/" +
         std::to_string(total_) + " cancelled=" + (cancelled_ ? "1" : "0") + ">";
}

std::string ARBundleProxy::describe() const { return "<ARBundleProxy " + bundleIdentifier + ">"; }

std::string ARApplicationProxy::describe() const {
  return "<ARApplicationProxy " + applicationIdentifier + " (" + applicationType +
         ") placeholder=" + (appState.isPlaceholder ? "1" : "0") +
         " installType=" + std::to_string(installType) + ">";
}

}  // namespace appsync
