// The fake application registry: placeholder and package installs, enumeration, uninstall,
// progress objects and observer delivery.
#include "platform/fake/fake_ar.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <future>
#include <mutex>
#include <thread>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using AppRecord = FakeARWorkspace::AppRecord;

// Writes a bundle directory: Info.plist with the given keys, and optionally an icon and a file.
void writeBundle(const std::string& dir, const plist::Dict& info, bool icon = true) {
  ASSERT_TRUE(createDirectories(dir));
  ASSERT_TRUE(writePlistAtomically(dir + "/Info.plist", info, plist::Format::Xml));
  if (icon) {
    ASSERT_TRUE(writeFileAtomically(dir + "/Icon.png", plist::Bytes{1, 2, 3}));
  }
}

plist::Dict placeholderInfo(const std::string& id) {
  return {{"BNBundleIdentifier", id},
          {"BNBundleVersion", "1.0"},
          {"BNBundleDisplayName", "Example"},
          {"BNBundleExecutable", "Example"},
          {"BNBundleIconFile", "Icon.png"}};
}

plist::Dict placeholderOptions(const std::string& id, std::uint64_t installType) {
  return {
      {"PackageType", "Placeholder"}, {"BNBundleIdentifier", id}, {"ARInstallType", installType}};
}

// Records every event with the thread it arrived on.
class RecordingObserver : public ARApplicationWorkspaceObserverProtocol {
 public:
  struct Event {
    std::string kind;
    std::vector<std::string> identifiers;
    std::vector<std::string> paused;
    ARProxyList proxies;
    std::thread::id thread;
  };
  void applicationInstallsArePrioritized(const ARProxyList& p, const ARProxyList& q) override {
    add("prioritized", p, q);
  }
  void applicationInstallsDidCancel(const ARProxyList& p) override { add("cancel", p, {}); }
  void applicationsDidInstall(const ARProxyList& p) override { add("install", p, {}); }
  void applicationsDidUninstall(const ARProxyList& p) override { add("uninstall", p, {}); }
  std::vector<Event> events() const {
    std::lock_guard lock(mutex_);
    return events_;
  }

 private:
  void add(std::string kind, const ARProxyList& p, const ARProxyList& q) {
    Event e{std::move(kind), {}, {}, p, std::this_thread::get_id()};
    for (const auto& proxy : p) e.identifiers.push_back(proxy->applicationIdentifier);
    for (const auto& proxy : q) e.paused.push_back(proxy->applicationIdentifier);
    std::lock_guard lock(mutex_);
    events_.push_back(std::move(e));
  }
  mutable std::mutex mutex_;
  std::vector<Event> events_;
};

class FakeARTest : public ::testing::Test {
 protected:
  testing::TempDir root_;
  FakeARWorkspace ar_{root_.path()};
  std::string container(const std::string& id) {
    return root_ / ("private/var/containers/Bundle/Application/" + id);
  }
};

TEST_F(FakeARTest, PlaceholderInstallRecordsWhatInfoPlistAndOptionsSay) {
  const std::string dir = root_ / "tmp/com.vantor.trc.Apps/com.example.app.app";
  writeBundle(dir, placeholderInfo("com.example.app"));
  const plist::Dict options = placeholderOptions("com.example.app", ARInstallTypeRestore);
  ASSERT_TRUE(ar_.installApplication(dir, options));

  std::optional<AppRecord> r = ar_.application("com.example.app");
  ASSERT_TRUE(r);
  EXPECT_TRUE(r->isPlaceholder);
  EXPECT_EQ(r->installType, ARInstallTypeRestore);
  EXPECT_EQ(r->name, "Example");
  EXPECT_EQ(r->version, "1.0");
  EXPECT_EQ(r->bundleDirectory, dir);
  EXPECT_EQ(r->iconPath, dir + "/Icon.png");
  EXPECT_EQ(r->lastInstallOptions, options);
  EXPECT_FALSE(r->containerDirectory);  // no store metadata in the options
  EXPECT_FALSE(ar_.applicationIsInstalled("com.example.app"));

  // Without an icon file there is no icon path; the record is replaced in place.
  fs::remove(dir + "/Icon.png");
  ASSERT_TRUE(ar_.installApplication(dir, placeholderOptions("com.example.app", 4)));
  r = ar_.application("com.example.app");
  EXPECT_FALSE(r->iconPath);
  EXPECT_EQ(r->installType, 4u);
  EXPECT_EQ(ar_.applications().size(), 1u);
}

TEST_F(FakeARTest, PlaceholderInstallRefusals) {
  const std::string good = root_ / "good.app";
  writeBundle(good, placeholderInfo("com.example.good"));
  const std::string noInfo = root_ / "noinfo.app";
  ASSERT_TRUE(createDirectories(noInfo));
  const std::string garbage = root_ / "garbage.app";
  ASSERT_TRUE(createDirectories(garbage));
  ASSERT_TRUE(writeFileAtomically(garbage + "/Info.plist", plist::Bytes{'<', 'p', 'l'}));
  const std::string noId = root_ / "noid.app";
  writeBundle(noId, {{"BNBundleVersion", "1"}});

  plist::Dict customer = placeholderOptions("com.example.good", 4);
  customer.set("PackageType", "Customer");
  plist::Dict untyped = placeholderOptions("com.example.good", 4);
  untyped.erase("PackageType");

  const struct {
    const char* what;
    std::string path;
    plist::Dict options;
    bool scriptFailure;
  } cases[] = {
      {"told to fail", good, placeholderOptions("com.example.good", 4), true},
      {"no Info.plist", noInfo, placeholderOptions("com.example.good", 4), false},
      {"unparsable Info.plist", garbage, placeholderOptions("com.example.good", 4), false},
      {"Info.plist without identifier", noId, placeholderOptions("com.example.good", 4), false},
      {"identifier disagrees", good, placeholderOptions("com.example.other", 4), false},
      {"package type Customer", good, customer, false},
      {"no package type", good, untyped, false},
  };
  for (const auto& c : cases) {
    if (c.scriptFailure) ar_.failOperation("installApplication:withOptions:");
    EXPECT_FALSE(ar_.installApplication(c.path, c.options)) << c.what;
    EXPECT_TRUE(ar_.applications().empty()) << c.what;
    ar_.succeedOperation("installApplication:withOptions:");
  }
  EXPECT_EQ(ar_.callCount("installApplication:withOptions:"), std::size(cases));
  ASSERT_EQ(ar_.installCalls().size(), std::size(cases));
  EXPECT_FALSE(ar_.installCalls().back().succeeded);
  EXPECT_TRUE(ar_.installApplication(good, placeholderOptions("com.example.good", 4)));
}

TEST_F(FakeARTest, PackageInstallMovesIntoAContainerUnderTheRoot) {
  // A restore placeholder with store metadata, then the delivered package.
  const std::string placeholder = root_ / "tmp/com.vantor.trc.Apps/com.example.app.app";
  writeBundle(placeholder, placeholderInfo("com.example.app"));
  plist::Dict options = placeholderOptions("com.example.app", ARInstallTypeRestore);
  const plist::Bytes metadata = *plist::writeBinary(plist::Dict{{"vantorId", "a@b.c"}});
  options.set(std::string(ARCaravelMetadataKey), metadata);
  ASSERT_TRUE(ar_.installApplication(placeholder, options));
  EXPECT_EQ(readFile(container("com.example.app") + "/CaravelMetadata.plist"), metadata);

  const std::string package = root_ / "var/mobile/Media/PublicStaging/Example.app";
  writeBundle(package,
              {{"BNBundleIdentifier", "com.example.app"},
               {"BNBundleVersion", "2.0"},
               {"BNBundleDisplayName", "Example Two"}},
              false);
  ASSERT_TRUE(writeFileAtomically(package + "/Example", plist::Bytes(1000, 7)));
  const plist::Dict customer{{"PackageType", "Customer"},
                             {"BNBundleIdentifier", "com.example.app"}};
  ErrorRef error;
  ASSERT_TRUE(ar_.installApplication(package, customer, &error)) << error->describe();

  std::optional<AppRecord> r = ar_.application("com.example.app");
  ASSERT_TRUE(r);
  EXPECT_FALSE(r->isPlaceholder);
  EXPECT_EQ(r->containerDirectory, container("com.example.app"));
  EXPECT_EQ(r->bundleDirectory, container("com.example.app") + "/Example.app");
  EXPECT_EQ(r->version, "2.0");
  EXPECT_EQ(r->name, "Example Two");
  EXPECT_EQ(r->installType, ARInstallTypeRestore);  // the install that made it kept its type
  EXPECT_EQ(readFile(*r->bundleDirectory + "/Example"), plist::Bytes(1000, 7));
  EXPECT_GE(r->staticDiskUsage.value_or(0), 1000u);
  EXPECT_TRUE(fileExists(package + "/Example"));  // the package itself stays for its owner
  EXPECT_EQ(readFile(container("com.example.app") + "/CaravelMetadata.plist"), metadata);
  EXPECT_TRUE(ar_.applicationIsInstalled("com.example.app"));

  // Uninstalling removes the container this registry made.
  ASSERT_TRUE(ar_.uninstallApplication("com.example.app", std::nullopt));
  EXPECT_FALSE(fs::exists(container("com.example.app")));
}

TEST_F(FakeARTest, PackageInstallErrors) {
  const std::string package = root_ / "Other.app";
  writeBundle(package, {{"BNBundleIdentifier", "com.example.other"}}, false);
  const plist::Dict wantsApp{{"PackageType", "Customer"},
                             {"BNBundleIdentifier", "com.example.app"}};
  const plist::Dict wantsOther{{"PackageType", "Customer"},
                               {"BNBundleIdentifier", "com.example.other"}};
  const plist::Dict wantsEscape{{"PackageType", "Customer"}, {"BNBundleIdentifier", ".."}};
  const std::string escape = root_ / "Escape.app";
  writeBundle(escape, {{"BNBundleIdentifier", ".."}}, false);

  ErrorRef scripted = makeError(kAppRegistryErrorDomain, 99, "disk full");
  const struct {
    const char* what;
    std::string path;
    plist::Dict options;
    ErrorRef script;
    std::int64_t code;
  } cases[] = {
      {"identifier mismatch", package, wantsApp, nullptr, 3},
      {"not a directory", root_ / "missing.app", wantsOther, nullptr, 2},
      {"escaping identifier", escape, wantsEscape, nullptr, 2},
      {"told to fail", package, wantsOther, scripted, 99},
  };
  for (const auto& c : cases) {
    if (c.script) ar_.failOperation("installApplication:withOptions:error:", c.script, 1);
    ErrorRef error;
    EXPECT_FALSE(ar_.installApplication(c.path, c.options, &error)) << c.what;
    ASSERT_TRUE(error) << c.what;
    EXPECT_EQ(error->domain, kAppRegistryErrorDomain) << c.what;
    EXPECT_EQ(error->code, c.code) << c.what;
    EXPECT_TRUE(plist::stringAt(error->userInfo, kErrorDescriptionKey)) << c.what;
    if (c.script) {
      EXPECT_EQ(error, scripted);
    } else {
      EXPECT_FALSE(ar_.installApplication(c.path, c.options, nullptr)) << c.what;
    }
  }
  EXPECT_FALSE(fs::exists(root_ / "private/var/containers/Bundle/Application/com.example.app"));
  EXPECT_TRUE(ar_.applications().empty());
}

TEST_F(FakeARTest, EnumerationKindsAndTheStopFlag) {
  ar_.putApplication({.identifier = "user.app", .staticDiskUsage = 500});
  ar_.putApplication(
      {.identifier = "system.placeholder", .applicationType = "System", .isPlaceholder = true});
  ar_.putApplication({.identifier = "plugin.bundle", .isApplication = false});
  ar_.putApplication({.identifier = "system.app", .applicationType = "System"});
  ar_.putApplication({.identifier = "user.placeholder", .isPlaceholder = true});

  auto walk = [&](int kind, int stopAfter = 0) {
    std::vector<std::string> seen;
    ar_.enumerateBundlesOfType(kind,
                               [&](const std::shared_ptr<const ARBundleProxy>& p, bool* stop) {
                                 seen.push_back(p->bundleIdentifier);
                                 if (stopAfter && static_cast<int>(seen.size()) == stopAfter)
                                   *stop = true;
                               });
    return seen;
  };
  using V = std::vector<std::string>;
  EXPECT_EQ(walk(0), (V{"user.app", "system.placeholder", "plugin.bundle", "system.app",
                        "user.placeholder"}));
  EXPECT_EQ(walk(1), (V{"user.app", "system.placeholder", "system.app", "user.placeholder"}));
  EXPECT_EQ(walk(7), (V{"system.placeholder", "system.app"}));
  EXPECT_EQ(walk(3), V{});
  EXPECT_EQ(walk(0, 2), (V{"user.app", "system.placeholder"}));
  EXPECT_EQ(walk(1, 1), V{"user.app"});

  std::map<std::string, std::shared_ptr<const ARBundleProxy>> proxies;
  ar_.enumerateBundlesOfType(0, [&](const auto& p, bool*) { proxies[p->bundleIdentifier] = p; });
  EXPECT_EQ(proxies["plugin.bundle"]->asApplicationProxy(), nullptr);
  const ARApplicationProxy* placeholder = proxies["user.placeholder"]->asApplicationProxy();
  ASSERT_NE(placeholder, nullptr);
  EXPECT_TRUE(placeholder->appState.isPlaceholder);
  EXPECT_FALSE(placeholder->isInstalled);
  EXPECT_EQ(placeholder->describe(),
            "<ARApplicationProxy user.placeholder (User) placeholder=1 installType=0>");
  EXPECT_EQ(proxies["user.app"]->asApplicationProxy()->diskUsage.staticUsage, 500u);

  ar_.failOperation("enumerateBundlesOfType:block:");
  EXPECT_EQ(walk(0), V{});
}

TEST_F(FakeARTest, ProxyLookupAndProgressObjects) {
  ar_.putApplication({.identifier = "installed.app"});
  ar_.putApplication({.identifier = "placeholder.app", .isPlaceholder = true});
  ar_.putApplication({.identifier = "plugin", .isApplication = false});
  const struct {
    const char* id;
    bool placeholder;
    bool found;
  } cases[] = {
      {"installed.app", false, true},    {"installed.app", true, true},
      {"placeholder.app", false, false}, {"placeholder.app", true, true},
      {"plugin", true, false},           {"unknown", true, false},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(ar_.applicationProxyForIdentifier(c.id, c.placeholder) != nullptr, c.found)
        << c.id << " placeholder=" << c.placeholder;
  }

  auto proxy = ar_.applicationProxyForIdentifier("placeholder.app", true);
  EXPECT_EQ(proxy->installProgressSync, nullptr);
  auto loading = ar_.installProgressForApplication(*proxy, ARInstallPhaseLoading);
  ASSERT_NE(loading, nullptr);
  EXPECT_EQ(loading->installPhase(), ARInstallPhaseLoading);
  EXPECT_EQ(ar_.installProgressForApplication(*proxy, ARInstallPhaseLoading), loading);
  EXPECT_EQ(ar_.applicationProxyForIdentifier("placeholder.app", true)->installProgressSync,
            loading);
  ARApplicationProxy unknown;
  unknown.applicationIdentifier = "unknown";
  EXPECT_EQ(ar_.installProgressForApplication(unknown, 0), nullptr);

  ar_.installPhaseFinishedForProgress(loading);
  ASSERT_EQ(ar_.finishedPhases().size(), 1u);
  EXPECT_EQ(ar_.finishedPhases()[0], loading);

  ar_.failOperation("applicationProxyForIdentifier:placeholder:");
  EXPECT_EQ(ar_.applicationProxyForIdentifier("installed.app", true), nullptr);
  ar_.failOperation("installProgressForApplication:withPhase:");
  EXPECT_EQ(ar_.installProgressForApplication(*proxy, 0), nullptr);
}

TEST_F(FakeARTest, UninstallRules) {
  ar_.putApplication({.identifier = "installed.app"});
  ar_.putApplication({.identifier = "placeholder.app", .isPlaceholder = true});
  std::vector<std::string> hooked;
  ar_.setUninstallHook([&](const std::string& id) { hooked.push_back(id); });
  const plist::Dict placeholdersOnly{{"UninstallPlaceholdersOnly", true}};

  EXPECT_FALSE(ar_.uninstallApplication("installed.app", placeholdersOnly));
  EXPECT_TRUE(ar_.application("installed.app"));
  EXPECT_TRUE(ar_.uninstallApplication("placeholder.app", placeholdersOnly));
  EXPECT_FALSE(ar_.uninstallApplication("unknown.app", std::nullopt));
  ar_.failOperation("uninstallApplication:withOptions:", nullptr, 1);
  EXPECT_FALSE(ar_.uninstallApplication("installed.app", std::nullopt));
  EXPECT_TRUE(ar_.uninstallApplication("installed.app", std::nullopt));
  EXPECT_TRUE(ar_.applications().empty());
  EXPECT_EQ(hooked, (std::vector<std::string>{"placeholder.app", "installed.app"}));
  auto calls = ar_.uninstallCalls();
  ASSERT_EQ(calls.size(), 5u);
  EXPECT_EQ(calls[0].options, placeholdersOnly);
  EXPECT_FALSE(calls[0].succeeded);
  EXPECT_FALSE(calls[4].options);
  EXPECT_TRUE(calls[4].succeeded);
}

TEST_F(FakeARTest, ObserversGetTheInitialObservationOnARegistryThread) {
  ar_.putApplication(
      {.identifier = "restoring.app", .installType = ARInstallTypeRestore, .isPlaceholder = true});
  ar_.putApplication({.identifier = "paused.app", .isPlaceholder = true});
  auto progress = ar_.installProgress("restoring.app", ARInstallPhaseLoading);
  progress->setInstallState(ARInstallStateActive);
  ar_.setInstallsInProgress({"restoring.app", "unknown.app"}, {"paused.app"});

  RecordingObserver observer;
  ar_.addObserver(&observer);
  ar_.drain();
  auto events = observer.events();
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ(events[0].kind, "prioritized");
  EXPECT_NE(events[0].thread, std::this_thread::get_id());
  EXPECT_EQ(events[0].identifiers, std::vector<std::string>{"restoring.app"});
  EXPECT_EQ(events[0].paused, std::vector<std::string>{"paused.app"});
  const auto& proxy = events[0].proxies[0];
  EXPECT_TRUE(proxy->isPlaceholder);
  EXPECT_EQ(proxy->installType, ARInstallTypeRestore);
  EXPECT_EQ(proxy->installProgressSync, progress);
  EXPECT_EQ(proxy->installProgressSync->installState(), ARInstallStateActive);

  // Later events reach every observer, in order.
  const std::string dir = root_ / "p.app";
  writeBundle(dir, placeholderInfo("new.app"));
  ASSERT_TRUE(ar_.installApplication(dir, placeholderOptions("new.app", 4)));
  ar_.notifyInstallsDidCancel({"new.app"});
  ASSERT_TRUE(ar_.uninstallApplication("new.app", std::nullopt));
  ar_.notifyInstallsArePrioritized();
  ar_.drain();
  events = observer.events();
  ASSERT_EQ(events.size(), 5u);
  EXPECT_EQ(events[1].kind, "install");
  EXPECT_EQ(events[1].identifiers, std::vector<std::string>{"new.app"});
  EXPECT_EQ(events[2].kind, "cancel");
  EXPECT_EQ(events[3].kind, "uninstall");
  EXPECT_EQ(events[3].identifiers, std::vector<std::string>{"new.app"});
  EXPECT_EQ(events[4].kind, "prioritized");
  ar_.removeObserver(&observer);
  EXPECT_EQ(ar_.observerCount(), 0u);
}

TEST_F(FakeARTest, NoCallbackAfterRemoveObserver) {
  ar_.putApplication({.identifier = "a.app"});
  RecordingObserver observer;
  ar_.callbackThread().hold();
  ar_.addObserver(&observer);
  ar_.notifyInstallsDidCancel({"a.app"});
  ar_.removeObserver(&observer);  // must not wait for the held events
  ar_.callbackThread().release();
  ar_.drain();
  EXPECT_TRUE(observer.events().empty());
}

// An observer whose first callback blocks until the test lets it go.
class BlockingObserver : public ARApplicationWorkspaceObserverProtocol {
 public:
  void applicationInstallsArePrioritized(const ARProxyList&, const ARProxyList&) override {
    entered.set_value();
    letGo.get_future().wait();
    finished = true;
  }
  std::promise<void> entered;
  std::promise<void> letGo;
  std::atomic<bool> finished{false};
};

TEST_F(FakeARTest, RemoveObserverWaitsForARunningCallback) {
  BlockingObserver observer;
  ar_.addObserver(&observer);
  observer.entered.get_future().wait();
  auto remover = std::async(std::launch::async, [&] {
    ar_.removeObserver(&observer);
    return observer.finished.load();
  });
  EXPECT_EQ(remover.wait_for(std::chrono::milliseconds(5)), std::future_status::timeout);
  observer.letGo.set_value();
  EXPECT_TRUE(remover.get());
}

}  // namespace
}  // namespace appsync
