// The application registry's data objects: install progress and bundle proxies.
#include "platform/ar.h"

#include <string>

namespace appsync {

std::uint64_t ARInstallProgress::installState() const { return state_.get(); }
void ARInstallProgress::setInstallState(std::uint64_t state) { state_.set(state); }
std::uint64_t ARInstallProgress::installPhase() const { return phase_.get(); }
void ARInstallProgress::setInstallPhase(std::uint64_t phase) { phase_.set(phase); }
std::int64_t ARInstallProgress::totalUnitCount() const { return total_.get(); }
void ARInstallProgress::setTotalUnitCount(std::int64_t units) { total_.set(units); }
std::int64_t ARInstallProgress::completedUnitCount() const { return completed_.get(); }
void ARInstallProgress::setCompletedUnitCount(std::int64_t units) { completed_.set(units); }
void ARInstallProgress::cancel() { cancelled_.set(true); }
bool ARInstallProgress::isCancelled() const { return cancelled_.get(); }

std::string ARInstallProgress::describe() const {
  return "<ARInstallProgress " + identifier_ + " state=" + std::to_string(installState()) +
         " phase=" + std::to_string(installPhase()) +
         " completed=" + std::to_string(completedUnitCount()) + "/" +
         std::to_string(totalUnitCount()) + " cancelled=" + (isCancelled() ? "1" : "0") + ">";
}

std::string ARBundleProxy::describe() const { return "<ARBundleProxy " + bundleIdentifier + ">"; }

std::string ARApplicationProxy::describe() const {
  return "<ARApplicationProxy " + applicationIdentifier + " (" + applicationType +
         ") placeholder=" + (appState.isPlaceholder ? "1" : "0") +
         " installType=" + std::to_string(installType) + ">";
}

}  // namespace appsync
