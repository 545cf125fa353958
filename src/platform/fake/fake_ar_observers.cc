// The fake application registry's observers: registration, the installs it reports as
// prioritized and paused, and events delivered on the registry's callback thread to observers
// still registered.
#include <algorithm>
#include <utility>

#include "platform/fake/fake_ar.h"

namespace appsync {

std::vector<std::uint64_t> FakeARWorkspace::registrationsLocked() const {
  std::vector<std::uint64_t> out;
  for (const auto& [registration, observer] : observers_) out.push_back(registration);
  return out;
}

void FakeARWorkspace::installsInProgressLocked(ARProxyList* prioritized,
                                               ARProxyList* paused) const {
  std::vector<std::string> running, waiting;
  for (const Entry& e : entries_) {
    if (!e.record.isApplication) continue;
    if (e.currentProgress) {
      const std::uint64_t state = e.currentProgress->installState();
      if (state == ARInstallStateWaiting || state == ARInstallStateActive) {
        running.push_back(e.record.identifier);
      } else if (state == ARInstallStatePaused) {
        waiting.push_back(e.record.identifier);
      }
    } else if (e.record.isPlaceholder && e.record.installType == ARInstallTypeRestore) {
      running.push_back(e.record.identifier);  // a restore placeholder awaits its data
    }
  }
  // What a test added by hand follows, once.
  auto addScripted = [](std::vector<std::string>& list, const std::vector<std::string>& extra) {
    for (const std::string& identifier : extra) {
      if (std::find(list.begin(), list.end(), identifier) == list.end()) list.push_back(identifier);
    }
  };
  addScripted(running, prioritized_);
  addScripted(waiting, paused_);
  *prioritized = proxiesLocked(running);
  *paused = proxiesLocked(waiting);
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
    installsInProgressLocked(&prioritized, &paused);
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
    installsInProgressLocked(&prioritized, &paused);
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
