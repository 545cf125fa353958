// The fake application registry's observers: registration, and events delivered on the
// registry's callback thread to observers still registered.
#include <utility>

#include "platform/fake/fake_ar.h"

namespace appsync {

std::vector<std::uint64_t> FakeARWorkspace::registrationsLocked() const {
  std::vector<std::uint64_t> out;
  for (const auto& [registration, observer] : observers_) out.push_back(registration);
  return out;
}

ARApplicationWorkspaceObserverProtocol* FakeARWorkspace::observerFor(
    std::uint64_t registration) const {
  std::lock_guard lock(mutex_);
  for (const auto& [r, observer] : observers_) {
    if (r == registration) return observer;
  }
  return nullptr;
}

void FakeARWorkspace::postEvent(std::vector<std::uint64_t> registrations, ProxyEvent event,
                                ARProxyList proxies) {
  if (registrations.empty()) return;
  callbacks_.post(
      [this, registrations = std::move(registrations), event, proxies = std::move(proxies)] {
        for (std::uint64_t registration : registrations) {
          if (auto* observer = observerFor(registration)) (observer->*event)(proxies);
        }
      });
}

void FakeARWorkspace::postPrioritized(std::vector<std::uint64_t> registrations,
                                      ARProxyList prioritized, ARProxyList paused) {
  if (registrations.empty()) return;
  callbacks_.post([this, registrations = std::move(registrations),
                   prioritized = std::move(prioritized), paused = std::move(paused)] {
    for (std::uint64_t registration : registrations) {
      if (auto* observer = observerFor(registration)) {
        observer->applicationInstallsArePrioritized(prioritized, paused);
      }
    }
  });
}

void FakeARWorkspace::addObserver(ARApplicationWorkspaceObserverProtocol* observer) {
  beginCall(kAddObserver);
  if (!observer) return;
  std::uint64_t registration;
  ARProxyList prioritized, paused;
  {
    std::lock_guard lock(mutex_);
    registration = nextRegistration_++;
    observers_.emplace_back(registration, observer);
    prioritized = proxiesLocked(prioritized_);
    paused = proxiesLocked(paused_);
  }
  postPrioritized({registration}, std::move(prioritized), std::move(paused));
}

void FakeARWorkspace::removeObserver(ARApplicationWorkspaceObserverProtocol* observer) {
  beginCall(kRemoveObserver);
  {
    std::lock_guard lock(mutex_);
    std::erase_if(observers_, [&](const auto& item) { return item.second == observer; });
  }
  // A delivery looks its observer up right before calling it, so once the callback that may
  // have looked it up already has finished, none will follow.
  callbacks_.waitUntilIdle();
}

std::size_t FakeARWorkspace::observerCount() const {
  std::lock_guard lock(mutex_);
  return observers_.size();
}

void FakeARWorkspace::setInstallsInProgress(std::vector<std::string> prioritized,
                                            std::vector<std::string> paused) {
  std::lock_guard lock(mutex_);
  prioritized_ = std::move(prioritized);
  paused_ = std::move(paused);
}

void FakeARWorkspace::notifyInstallsArePrioritized() {
  std::vector<std::uint64_t> registrations;
  ARProxyList prioritized, paused;
  {
    std::lock_guard lock(mutex_);
    registrations = registrationsLocked();
    prioritized = proxiesLocked(prioritized_);
    paused = proxiesLocked(paused_);
  }
  postPrioritized(std::move(registrations), std::move(prioritized), std::move(paused));
}

void FakeARWorkspace::notifyInstallsDidCancel(const std::vector<std::string>& identifiers) {
  std::vector<std::uint64_t> registrations;
  ARProxyList proxies;
  {
    std::lock_guard lock(mutex_);
    registrations = registrationsLocked();
    proxies = proxiesLocked(identifiers);
  }
  postEvent(std::move(registrations),
            &ARApplicationWorkspaceObserverProtocol::applicationInstallsDidCancel,
            std::move(proxies));
}

}  // namespace appsync
