// appsync-host demo: builds a simulated device in a fresh directory, runs the client through
// what it can do today, and prints what happened.
#include <cstdio>
#include <memory>
#include <string>

#include "commands.h"
#include "client/apps_client.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "platform/fake/fake_platform.h"

namespace appsync::host {

namespace {

// Prints every message as it is logged, and keeps the device's log file.
class EchoSink : public LogSink {
 public:
  explicit EchoSink(const std::string& path) : file_(path) {}
  void write(int category, LogLevel level, std::string_view message) override {
    file_.write(category, level, message);
    std::printf("  log[%d %s] %.*s\n", category, logLevelName(level),
                static_cast<int>(message.size()), message.data());
  }

 private:
  FileLogSink file_;
};

plist::Dict todoRecord(const char* id, const char* op, const char* name) {
  plist::Dict record;
  record.set("identifier", id);
  record.set("operation", op);
  record.set("version", "1.0");
  record.set("name", name);
  return record;
}

int runDemo(const std::string& root) {
  if (!createDirectories(root)) {
    std::fprintf(stderr, "demo: cannot create %s\n", root.c_str());
    return 1;
  }
  FakePlatform::Options options;
  options.manualClock = false;
  options.coordination = true;
  options.mainBundleIdentifier = std::string(kHostDaemonBundleIdentifier);
  FakePlatform device(root, options);
  device.tr().logger().setSink(std::make_shared<EchoSink>(root + "/appsync.log"));
  const Paths& paths = device.paths();

  std::printf("device root: %s\n\n", root.c_str());
  std::printf("1. The host daemon creates the client.\n");
  auto client = std::make_unique<AppsClient>(device.platform());
  std::printf("   road: %s; registry observers: %zu\n",
              client->useInstallCoordinator() ? "install coordination" : "legacy",
              device.ar().observerCount());

  std::printf("2. The daemon posts its start-up notification.\n");
  device.system().postNotification(std::string(kHostStartupNotification));
  std::printf("   coordination observer created: %s\n",
              client->hasInstallCoordinatorObserver() ? "yes" : "no");

  std::printf("3. The host computer leaves a todo list; the client records progress in it.\n");
  createDirectories(paths.syncFolder());
  plist::Array todo{todoRecord("com.example.notes", "install", "Notes"),
                    todoRecord("com.example.maps", "install", "Maps"),
                    todoRecord("com.example.old", "remove", "Old")};
  writePlistAtomically(paths.todoList(), plist::Value(todo), plist::Format::Xml);
  client->changeAssetID("com.example.notes", "DOWNLOADED");
  client->changeAssetID("com.example.notes", "INSTALLED");
  client->changeAssetID("com.example.maps", "FAILED");
  auto list = AppsClient::_loadPlist(device.tr(), paths.todoList(), nullptr);
  std::printf("   todo list now: %s\n", list ? plist::Value(*list).describe().c_str() : "(none)");

  std::printf("4. The sync starts; downloads follow the home screen's icon order.\n");
  AppsClient::_notifyPavilion(device.platform(), true);
  const std::string syncNotification = "com.vantor.pavilion.trc.wsyncnotify";
  std::printf("   home screen sync state: %llu\n",
              static_cast<unsigned long long>(
                  device.system().notificationState(syncNotification).value_or(0)));
  device.pv().setIconOrder({"com.example.maps", "com.example.clock", "com.example.notes"});
  plist::Dict candidates;
  for (const char* id : {"com.example.notes", "com.example.weather", "com.example.maps"}) {
    candidates.set(id, plist::Dict{{"BNBundleIdentifier", id}});
  }
  plist::Array order = AppsClient::_orderTheItems(device.platform(), candidates);
  std::printf("   download order: %s\n", plist::Value(order).describe().c_str());

  std::printf("5. A restored app gets a placeholder on the home screen.\n");
  plist::Dict metadata{{"title", "Weather"}, {"bundleVersion", "2.1"}, {"itemName", "Weather"}};
  auto metadataBytes = plist::writeBinary(plist::Value(metadata));
  client->_processCaravelRestoreInfoForApp("com.example.weather", *metadataBytes, std::nullopt,
                                           std::nullopt);
  if (auto placeholder = device.ar().application("com.example.weather")) {
    std::printf("   registry: %s is a placeholder named %s, version %s, install type %llu\n",
                placeholder->identifier.c_str(), placeholder->name.value_or("?").c_str(),
                placeholder->version.value_or("?").c_str(),
                static_cast<unsigned long long>(placeholder->installType));
  }
  AppsClient::_notifyPavilion(device.platform(), false);

  std::printf("6. A restore package waits for its data; its path is remembered, then dropped.\n");
  client->_setRestoreStatePropertyValue("/var/mobile/Media/PublicStaging/notes.zip", "path",
                                        "com.example.notes", std::string("1.0"));
  auto recorded = client->_restoreStatePropertyForKey("path", "com.example.notes",
                                                      std::string("1.0"));
  std::printf("   recorded: %s\n", recorded ? recorded->describe().c_str() : "(none)");
  client->cleanRestoreStateForIdentifier("com.example.notes");
  std::printf("   restore state file left: %s\n", fileExists(paths.restoreState()) ? "yes" : "no");

  std::printf("7. The daemon releases the client.\n");
  client.reset();
  std::printf("   registry observers: %zu\n\nlog file: %s/appsync.log\n",
              device.ar().observerCount(), root.c_str());
  return 0;
}

}  // namespace

void addDemoCommand(CLI::App& app, int& status) {
  auto* demo = app.add_subcommand("demo", "Run the client against a fresh simulated device");
  auto root = std::make_shared<std::string>();
  demo->add_option("--root", *root, "Directory that holds the device")->required();
  demo->callback([root, &status] { status = runDemo(*root); });
}

}  // namespace appsync::host
