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
// test still sees them after the service has let them go. Read once the service is drained.
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
    return KCInstallCoordinationWrapper::coordinatorForAppWithBundleID(kind, bundleID, clientID,
                                                                       create, created, error);
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

  std::mutex mutex;
  std::vector<Lookup> lookups;
  std::vector<std::shared_ptr<FakeKCPlaceholder>> placeholders;
  std::vector<std::shared_ptr<KCPromisedTransferToPath>> made;
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

struct CoordinationDevice {
  TempDir root;
  FakePlatform device{root.path(), {.coordination = true}};
  RecordingCoordination kc{device.kc()};
  AppsClient client{device.platform().with(kc)};

  CoordinationDevice() {
    device.log().clear();
    device.transactionLog().clear();
  }
  // Background work of the service may reach the client: it ends before the client does.
  ~CoordinationDevice() { device.kc().drain(); }

  // The messages of category 8 without their "%s|" prefix; error-level ones marked.
  std::vector<std::string> logged() {
    const std::string prefix = pluginLine("");
    std::vector<std::string> out;
    for (const auto& line : device.log().lines()) {
      if (line.category != 8) continue;
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
};

// "step N party 1 phase P success S ID: TEXT", as the fake transaction log describes a step.
inline std::string step(int n, int phase, bool success, const std::string& id,
                        const std::string& text) {
  return "step " + std::to_string(n) + " party 1 phase " + std::to_string(phase) + " success " +
         (success ? "1 " : "0 ") + id + ": " + text;
}

}  // namespace appsync::testing
