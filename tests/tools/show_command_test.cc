// appsync-host show: the device gathered as JSON (every service's state, property lists with
// data and dates), the tables a person reads, and the command run against a saved device.
#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <limits>
#include <map>
#include <string>
#include <vector>

#include "device_lock.h"
#include "device_session.h"
#include "device_table.h"
#include "device_view.h"
#include "input_error.h"
#include "platform/fake/fake_kc_objects.h"
#include "platform/fake/fake_platform.h"
#include "plist_json.h"
#include "runtime/plist/codec.h"
#include "support/host_process.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync::host {
namespace {

using json = nlohmann::ordered_json;
using testing::writeText;

TEST(PlistToJsonTest, EveryTypeHasItsJsonForm) {
  const struct {
    const char* what;
    plist::Value value;
    json expected;
  } cases[] = {
      {"negative integer", std::int64_t{-5}, -5},
      {"integer above INT64_MAX", std::numeric_limits<std::uint64_t>::max(),
       std::numeric_limits<std::uint64_t>::max()},
      {"data", plist::Bytes{0x00, 0xff, 0x10}, {{"data", "AP8Q"}}},
      {"date", plist::Date{0}, {{"date", "2001-01-01T00:00:00Z"}}},
      {"date outside years 0001-9999", plist::Date{1e300}, {{"date", 1e300}}},
      {"uid", plist::Uid{3}, {{"uid", 3}}},
      {"nested, with a boolean, a real and a string",
       plist::Array{plist::Dict{{"a", plist::Array{1, "x", true, 2.5}}}},
       json::array({{{"a", json::array({1, "x", true, 2.5})}}})},
      {"null", plist::Value::null(), nullptr},
  };
  for (const auto& c : cases) {
    const json got = plistToJson(c.value);
    EXPECT_EQ(got, c.expected) << c.what;
    // Whatever it is, it must survive the trip through JSON text.
    EXPECT_EQ(json::parse(got.dump()), got) << c.what;
  }
}

TEST(LastLinesOfFileTest, KeepsOnlyTheLastLines) {
  testing::TempDir dir;
  std::string big;
  for (int i = 0; i < 20000; ++i) big += "line " + std::to_string(i) + "\n";
  const struct {
    const char* text;  // null: no file
    std::size_t count;
    std::vector<std::string> expected;
  } cases[] = {
      {nullptr, 3, {}},
      {"", 3, {}},
      {"a\nb\nc\n", 2, {"b", "c"}},
      {"a\nb\nc", 2, {"b", "c"}},
      {"a\nb\n", 5, {"a", "b"}},
      {"a\nb\n", 0, {}},
      {big.c_str(), 2, {"line 19998", "line 19999"}},
  };
  for (const auto& c : cases) {
    const auto path = dir.path() / "log.txt";
    std::filesystem::remove(path);
    if (c.text) writeText(path, c.text);
    EXPECT_EQ(lastLinesOfFile(path, c.count), c.expected) << (c.text ? c.text : "(missing)");
  }
}

// A device with something in every service.
class ShowViewTest : public ::testing::Test {
 protected:
  ShowViewTest() : device_(dir_.path(), {.coordination = true}) {
    device_.ar().putApplication(
        {.identifier = "com.a", .version = "1.0", .name = "Alpha", .staticDiskUsage = 4096});
    device_.ar().putApplication(
        {.identifier = "com.b", .version = "2.0", .name = "Beta", .isPlaceholder = true});
    device_.ar().putApplication({.identifier = "com.plugin", .isApplication = false});
    device_.em().addUninstalled("com.gone");
    device_.rs().setValue(RSFeatureAppRemovalAllowed, RSRestrictedBoolExplicitNo);
    int token = 0;
    device_.system().notifyRegisterCheck(kSyncNotificationName, &token);
    device_.system().notifySetState(token, 1);
    device_.system().notifyPost(kSyncNotificationName);
    const plist::Bytes layout = *plist::writeBinary(
        plist::Dict{{"iconLists", plist::Array{plist::Value(plist::Array{"com.a"})}},
                    {"badge", plist::Bytes{0xde, 0xad}}});
    device_.pv().PVSetIconState(device_.pv().PVSPavilionBlockableServerPort(), layout.data(),
                                layout.size());
    device_.transactionLog().logStep(1, 1, 1, true, "com.a", "first");
    device_.transactionLog().logStep(2, 1, 1, true, "com.a", "second");
    device_.transactionLog().logScenario("Asset install", 3, false, "com.b", "third");
    writeText(logFile(), "one\ntwo\nthree\n");
  }

  std::filesystem::path logFile() const { return dir_.path() / "appsync.log"; }
  json collect() { return collectDevice(device_, logFile(), 2); }
  // A file of the device, with the directories on its way.
  static void put(const std::string& path, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    writeText(path, text);
  }

  testing::TempDir dir_;
  FakePlatform device_;
};

// The line of the table that starts (after its indent) with `first`.
std::string rowOf(const std::string& table, const std::string& first) {
  const std::size_t at = table.find("\n  " + first + " ");
  if (at == std::string::npos) return "";
  return table.substr(at + 1, table.find('\n', at + 1) - at - 1);
}

TEST_F(ShowViewTest, GathersEveryServiceIntoAlignedTables) {
  put(device_.paths().restoreState(),
      *plist::writeXml(
          plist::Dict{{"com.b", plist::Dict{{"2.0", plist::Dict{{"path", "/x/B.zip"}}}}}}));
  const json view = collect();

  std::vector<std::string> kinds;
  for (const json& app : view["registry"]) kinds.push_back(app["kind"]);
  EXPECT_EQ(kinds, (std::vector<std::string>{"installed", "placeholder", "bundle"}));
  EXPECT_EQ(view["restore"]["state"]["com.b"]["2.0"]["path"], "/x/B.zip");
  EXPECT_EQ(view["restore"]["listWaiting"], false);
  EXPECT_EQ(view["homeScreen"]["syncNotificationState"], 1);
  EXPECT_EQ(view["homeScreen"]["syncNotificationPosts"], 1);
  EXPECT_EQ(
      view["homeScreen"]["iconState"],
      (json{{"iconLists", json::array({json::array({"com.a"})})}, {"badge", {{"data", "3q0="}}}}));
  EXPECT_EQ(view["installer"]["uninstalled"], json::array({"com.gone"}));
  EXPECT_EQ(view["restrictions"],
            (json{{"allowAppInstallation", "unset"}, {"allowAppRemoval", "no"}}));
  EXPECT_EQ(view["log"]["lines"], json::array({"two", "three"}));
  ASSERT_EQ(view["transactions"].size(), 2u);
  EXPECT_EQ(view["transactions"][0]["description"], "second");
  EXPECT_EQ(view["transactions"][1]["scenario"], "Asset install");
  EXPECT_EQ(json::parse(view.dump()), view);

  // Every registry row has its kind where the heading has KIND; no styling unless asked for.
  const std::string table = renderDeviceTable(view, false);
  const std::string heading = rowOf(table, "IDENTIFIER");
  EXPECT_EQ(rowOf(table, "com.a").find(" installed "), heading.find("KIND") - 1) << table;
  EXPECT_EQ(rowOf(table, "com.b").find(" placeholder "), heading.find("KIND") - 1) << table;
  EXPECT_EQ(table.find("Finished coordinators"), std::string::npos) << table;
  EXPECT_EQ(table.find('\033'), std::string::npos);
  EXPECT_NE(renderDeviceTable(view, true).find("\033[1m"), std::string::npos);
}

TEST_F(ShowViewTest, CurrentCoordinatorsWithTheirPromisesAndFinishedOnesWithTheirOutcome) {
  FakeKCInstallCoordination& kc = device_.kc();
  kc.putCoordinator(KCCoordinatorKind::Updating, "com.c", 7)
      ->cancelForReason(makeError("Test", 5, "no"), 1, nullptr);
  kc.drain();
  kc.hold();  // the placeholder stays uninstalled while the view is taken
  auto coordinator = kc.putCoordinator(KCCoordinatorKind::Restoring, "com.b", 7);
  auto placeholder = kc.initAppPlaceholder("Beta", "com.b", 1, 7);
  ASSERT_TRUE(placeholder->setConfigurationCompleteWithError(nullptr));
  ASSERT_TRUE(coordinator->setPlaceholderPromise(placeholder, nullptr));
  auto asset = kc.initPromisedTransferToPath("asset", 1, "/staging/B.zip", 100);
  asset->setPercentComplete(0.25);
  ASSERT_TRUE(coordinator->setAppAssetPromise(asset, nullptr));

  const json view = collect();
  ASSERT_EQ(view["coordinators"].size(), 1u);
  const json& c = view["coordinators"][0];
  EXPECT_EQ(c["kind"], "Restoring");
  EXPECT_EQ(c["placeholder"]["configurationComplete"], true);
  ASSERT_EQ(c["promises"].size(), 1u);
  EXPECT_EQ(c["promises"][0]["role"], "asset");
  EXPECT_EQ(c["promises"][0]["transferPath"], "/staging/B.zip");
  EXPECT_EQ(c["promises"][0]["percentComplete"], 0.25);
  EXPECT_EQ(view["finishedCoordinators"],
            json::parse(R"([{"bundleID": "com.c", "kind": "Updating", "state": "cancelled",
                             "errorDomain": "Test", "errorCode": 5, "cancellingClient": 1}])"));
  const std::string table = renderDeviceTable(view, false);
  EXPECT_NE(table.find("25%"), std::string::npos) << table;
  EXPECT_NE(table.find("Finished coordinators (1)"), std::string::npos) << table;
  EXPECT_NE(rowOf(table, "com.c").find(" Updating "), std::string::npos) << table;
  EXPECT_NE(rowOf(table, "com.c").find(" cancelled  Test 5 "), std::string::npos) << table;
  kc.release();
}

TEST_F(ShowViewTest, AnUnusableTodoListIsReportedNotLogged) {
  for (const char* text : {"<plist><array><string>broken", "<plist><dict/></plist>"}) {
    put(device_.paths().todoList(), text);
    const json view = collect();
    EXPECT_EQ(view["todoList"]["present"], false) << text;
    EXPECT_TRUE(view["todoList"]["error"].is_string()) << text;
    EXPECT_NE(renderDeviceTable(view, false).find("unreadable"), std::string::npos) << text;
  }
  EXPECT_TRUE(device_.log().lines().empty());
}

// Every saved state file under `directory` with its bytes (the lock file names its holder).
std::map<std::string, std::string> filesUnder(const std::filesystem::path& directory) {
  std::map<std::string, std::string> files;
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    if (entry.path().extension() == ".plist") {
      files[entry.path().string()] = testing::readText(entry.path());
    }
  }
  return files;
}

TEST(ShowCommandTest, ShowsADeviceSavedByAnotherProcessAndChangesNothing) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is not set";
  testing::TempDir dir;
  const auto root = dir.path() / "device";
  {
    auto session = DeviceSession::create(root, {.coordination = true});
    session->device().ar().putApplication({.identifier = "com.a", .version = "1.0"});
    session->device().ar().putApplication({.identifier = "com.b", .isPlaceholder = true});
    session->close();
  }
  const auto show = [&](const std::string& arguments) {
    return testing::runHost(host, "show --root '" + root.string() + "' " + arguments, dir.path());
  };
  const auto before = filesUnder(DeviceSession::stateDirectory(root));
  ASSERT_FALSE(before.empty());

  const testing::HostRun asJson = show("--json");
  ASSERT_EQ(asJson.status, 0) << asJson.stderrText;
  const json view = json::parse(asJson.stdoutText);
  ASSERT_EQ(view["registry"].size(), 2u);
  EXPECT_EQ(view["registry"][0]["kind"], "installed");
  EXPECT_EQ(view["registry"][1]["kind"], "placeholder");

  const testing::HostRun asTable = show("--lines 3");
  ASSERT_EQ(asTable.status, 0) << asTable.stderrText;
  EXPECT_NE(rowOf(asTable.stdoutText, "com.b").find(" placeholder "), std::string::npos)
      << asTable.stdoutText;
  EXPECT_EQ(asTable.stdoutText.find('\033'), std::string::npos);
  EXPECT_EQ(filesUnder(DeviceSession::stateDirectory(root)), before);

  {
    const DeviceLock held = DeviceLock::acquire(DeviceSession::stateDirectory(root));
    const testing::HostRun busy = show("");
    EXPECT_EQ(busy.status, kExitFailed) << busy.stderrText;
    EXPECT_FALSE(busy.stderrText.empty());
  }
  const testing::HostRun noDevice =
      testing::runHost(host, "show --root '" + dir.str() + "'", dir.path());
  EXPECT_EQ(noDevice.status, kExitBadInput);
  EXPECT_NE(noDevice.stderrText.find("holds no device"), std::string::npos) << noDevice.stderrText;
}

}  // namespace
}  // namespace appsync::host
