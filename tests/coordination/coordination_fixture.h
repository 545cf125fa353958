// A device on the coordinated road whose install-coordination service records what the client
// obtains from it, and the readers the coordination tests share.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "platform/kc_wrapper.h"
#include "restore/placeholder_fixture.h"

namespace appsync::testing {

// Keeps every coordinator lookup, placeholder and file promise the client obtains, so that a
// test still sees them after the service has let them go (a cancelled coordinator is
// forgotten). Coordinator events may call the service from its thread: the lists are read once
// the service is drained.
class RecordingCoordination : public KCInstallCoordinationWrapper {
 public:
  struct Lookup {
    KCCoordinatorKind kind;
    std::uint64_t client;
    bool create;
  };
  using KCInstallCoordinationWrapper::KCInstallCoordinationWrapper;

  std::shared_ptr<KCAppInstallCoordinator> coordinatorForAppWithBundleID(
      KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t clientID, bool create,
      bool* created, ErrorRef* error) override {
    std::lock_guard lock(mutex);
    lookups.push_back({kind, clientID, create});
    return staleAnswer ? staleAnswer
                       : KCInstallCoordinationWrapper::coordinatorForAppWithBundleID(
                             kind, bundleID, clientID, create, created, error);
  }
  std::shared_ptr<KCPlaceholder> initAppPlaceholder(const std::string& name, const std::string& id,
                                                    std::uint64_t installType,
                                                    std::uint64_t client) override {
    std::lock_guard lock(mutex);
    auto p = KCInstallCoordinationWrapper::initAppPlaceholder(name, id, installType, client);
    if (p) placeholders.push_back(std::dynamic_pointer_cast<FakeKCPlaceholder>(p));
    return p;
  }
  // A refused one is recorded as null.
  std::shared_ptr<KCPromisedTransferToPath> initPromisedTransferToPath(
      const std::string& name, std::uint64_t client, const std::optional<std::string>& path,
      std::uint64_t diskSpaceNeeded) override {
    std::lock_guard lock(mutex);
    made.push_back(KCInstallCoordinationWrapper::initPromisedTransferToPath(name, client, path,
                                                                            diskSpaceNeeded));
    return made.back();
  }
  void uninstallAppWithBundleID(const std::string& bundleID, bool requestUserConfirmation,
                                std::function<void(ErrorRef)> completion) override {
    {
      std::lock_guard lock(mutex);
      uninstallConfirmations.push_back(requestUserConfirmation);
    }
    KCInstallCoordinationWrapper::uninstallAppWithBundleID(bundleID, requestUserConfirmation,
                                                           std::move(completion));
  }

  std::mutex mutex;
  // When set, every lookup answers this coordinator (one the service has already let go of).
  std::shared_ptr<KCAppInstallCoordinator> staleAnswer;
  std::vector<Lookup> lookups;
  std::vector<std::shared_ptr<FakeKCPlaceholder>> placeholders;
  std::vector<std::shared_ptr<KCPromisedTransferToPath>> made;
  std::vector<bool> uninstallConfirmations;
};

// An error a scripted service call reports.
inline ErrorRef serviceError() { return makeKCError(77, "scripted"); }
inline std::string serviceErrorText() { return serviceError()->describe(); }

// "Error Domain=TRError Code=N" for a cancellation reason; "(not cancelled)" for none.
inline std::string reasonText(const ErrorRef& reason) {
  return reason ? reason->describe() : "(not cancelled)";
}

// A promise as the fake describes it (name, client, size, progress, path), and why it was
// cancelled; "(none)" for no promise.
inline std::string promiseState(const std::shared_ptr<KCPromise>& promise) {
  if (!promise) return "(none)";
  return promise->describe() + " " +
         reasonText(dynamic_cast<FakeKCPromiseBase&>(*promise).cancelReason());
}
// What promiseState gives for a file promise "com.example.app-SUFFIX" of client 3.
inline std::string filePromise(const std::string& suffix, std::uint64_t diskSpace,
                               const std::string& percent, bool complete, const std::string& path,
                               const std::string& reason = "(not cancelled)") {
  return "<KCPromisedTransferToPath name=com.example.app-" + suffix +
         " client=3 diskSpaceNeeded=" + std::to_string(diskSpace) + " percentComplete=" + percent +
         " complete=" + (complete ? "YES" : "NO") +
         " cancelled=" + (reason == "(not cancelled)" ? "NO" : "YES") + " transferPath=" + path +
         "> " + reason;
}
// A placeholder as the fake describes it, whether it is configured, and why it was cancelled.
inline std::string placeholderState(const std::shared_ptr<FakeKCPlaceholder>& placeholder) {
  if (!placeholder) return "(none)";
  return placeholder->describe() +
         (placeholder->isConfigurationComplete() ? " configured " : " unconfigured ") +
         reasonText(placeholder->cancelReason());
}

// Hears the cancellations of coordinators made under client 3 or 7, as
// "ID REASON by client N". Safe from the service's thread.
class CancellationWatcher : public KCAppInstallObserverDelegate {
 public:
  void coordinator(const std::shared_ptr<KCAppInstallCoordinator>& c, const ErrorRef& reason,
                   std::uint64_t client) override {
    std::lock_guard lock(mutex_);
    seen_.push_back(c->bundleID() + " " + reasonText(reason) + " by client " +
                    std::to_string(client));
  }
  std::vector<std::string> seen() const {
    std::lock_guard lock(mutex_);
    return seen_;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> seen_;
};

inline FakePlatform::Options coordinatedRoad() {
  FakePlatform::Options options;
  options.coordination = true;
  return options;
}

struct CoordinationDevice {
  TempDir root;
  FakePlatform device{root.path(), coordinatedRoad()};
  RecordingCoordination kc{device.kc()};
  AppsClient client{device.platform().with(kc)};
  CancellationWatcher cancellations;
  std::shared_ptr<KCAppInstallObserver> watching =
      device.kc().initAppInstallObserver("test.cancellations", {3, 7}, &cancellations);

  CoordinationDevice() {
    device.log().clear();
    device.transactionLog().clear();
  }
  // Background work of the service may reach the client: it ends before the client does.
  ~CoordinationDevice() { device.kc().drain(); }

  // The messages of one category without their "%s|" prefix; error-level ones marked.
  std::vector<std::string> logged(int category = 8) {
    const std::string prefix = pluginLine("");
    std::vector<std::string> out;
    for (const auto& line : device.log().lines()) {
      if (line.category != category) continue;
      std::string text = line.message.starts_with(prefix) ? line.message.substr(prefix.size())
                                                          : "(no prefix) " + line.message;
      out.push_back((line.level == LogLevel::Error ? "[error] " : "") + text);
    }
    return out;
  }
  std::vector<std::string> steps() {
    std::vector<std::string> out;
    for (const auto& e : device.transactionLog().steps()) out.push_back(e.describe());
    return out;
  }
  std::string placeholderDir(const std::string& id) {
    return client.placeholderAppPathForBundleIdentifier(id).value_or("(none)");
  }
  std::shared_ptr<FakeKCAppInstallCoordinator> put(KCCoordinatorKind kind, const std::string& id,
                                                   std::uint64_t creator = 3) {
    return device.kc().putCoordinator(kind, id, creator);
  }
};

// "step N party 1 phase P success S ID: TEXT", as the fake transaction log describes a step.
inline std::string step(int n, int phase, bool success, const std::string& id,
                        const std::string& text) {
  return "step " + std::to_string(n) + " party 1 phase " + std::to_string(phase) + " success " +
         (success ? "1 " : "0 ") + id + ": " + text;
}

// The message of a lookup for "com.example.app" that came back with the initiating (or, for an
// existing app, updating) coordinator of `creator`, with no error.
inline std::string coordinatorLine(bool existingApp, bool create, std::uint64_t creator = 3) {
  const std::string kind = existingApp ? "updating" : "initiating";
  const std::string flags = "createIfNotExisting:" + std::to_string(create) +
                            ", existingApp:" + std::to_string(existingApp);
  const std::string object =
      std::string("<") + (existingApp ? "KCUpdating" : "KCInitiating") +
      "AppInstallCoordinator bundleID=com.example.app creator=" + std::to_string(creator) + ">";
  if (creator == kAppSyncCoordinationClient) {
    return "Created " + kind + " coordinator " + object + " (" + flags +
           ") for com.example.app with error (null)";
  }
  return "IC returned " + kind + " coordinator " + object + " (" + flags +
         ", creatorIdentifier=" + std::to_string(creator) +
         ") for com.example.app with error (null) - Will not perform install/update for this "
         "bundle";
}

}  // namespace appsync::testing
