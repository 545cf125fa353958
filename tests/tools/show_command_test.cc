// appsync-host show: the device gathered as JSON (every service's state, property lists with
// data and dates) and as the tables a person reads, run against a device saved by another process.
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
      {nullptr, 3, {}},           {"a\nb\nc\n", 2, {"b", "c"}},
      {"a\nb\nc", 2, {"b", "c"}}, {"a\nb\n", 5, {"a", "b"}},
      {"a\nb\n", 0, {}},          {big.c_str(), 2, {"line 19998", "line 19999"}},
  };
  for (const auto& c : cases) {
    const auto path = dir.path() / "log.txt";
    std::filesystem::remove(path);
    if (c.text) writeText(path, c.text);
    EXPECT_EQ(lastLinesOfFile(path, c.count), c.expected) << (c.text ? c.text : "(missing)");
  }
}

// The line of the table that starts (after its indent) with `first`.
std::string rowOf(const std::string& table, const std::string& first) {
  const std::size_t at = table.find("\n  " + first + " ");
  if (at == std::string::npos) return "";
  return table.substr(at + 1, table.find('\n', at + 1) - at - 1);
}

TEST(ShowViewTest, AnUnusableTodoListIsReportedNotLogged) {
  testing::TempDir dir;
  FakePlatform device(dir.path());
  std::filesystem::create_directories(
      std::filesystem::path(device.paths().todoList()).parent_path());
  for (const char* text : {"<plist><array><string>broken", "<plist><dict/></plist>"}) {
    writeText(device.paths().todoList(), text);
    const json view = collectDevice(device, dir.path() / "appsync.log", 2);
    EXPECT_EQ(view["todoList"]["present"], false) << text;
    EXPECT_TRUE(view["todoList"]["error"].is_string()) << text;
    EXPECT_NE(renderDeviceTable(view, false).find("unreadable"), std::string::npos) << text;
  }
  EXPECT_TRUE(device.log().lines().empty());
}

// Something in every service.
void fillDevice(FakePlatform& device) {
  device.ar().putApplication(
      {.identifier = "com.a", .version = "1.0", .name = "Alpha", .staticDiskUsage = 4096});
  device.ar().putApplication(
      {.identifier = "com.b", .version = "2.0", .name = "Beta", .isPlaceholder = true});
  device.ar().putApplication({.identifier = "com.plugin", .isApplication = false});
  device.rs().setValue(RSFeatureAppRemovalAllowed, RSRestrictedBoolExplicitNo);
  const plist::Bytes layout = *plist::writeBinary(
      plist::Dict{{"iconLists", plist::Array{plist::Value(plist::Array{"com.a"})}},
                  {"badge", plist::Bytes{0xde, 0xad}}});
  device.pv().PVSetIconState(device.pv().PVSPavilionBlockableServerPort(), layout.data(),
                             layout.size());
  device.transactionLog().logStep(1, 1, 1, true, "com.a", "first");
  device.transactionLog().logStep(2, 1, 1, true, "com.a", "second");
  device.transactionLog().logScenario("Asset install", 3, false, "com.b", "third");
  FakeKCInstallCoordination& kc = device.kc();
  kc.putCoordinator(KCCoordinatorKind::Updating, "com.c", 7)
      ->cancelForReason(makeError("Test", 5, "no"), 1, nullptr);
  auto asset = kc.initPromisedTransferToPath("asset", 1, "/staging/B.zip", 100);
  asset->setPercentComplete(0.25);
  kc.putCoordinator(KCCoordinatorKind::Restoring, "com.b", 7)->setAppAssetPromise(asset, nullptr);
  kc.drain();
}

// Every saved state file under `directory` with its bytes (the lock file names its holder).
std::map<std::string, std::string> filesUnder(const std::filesystem::path& directory) {
  std::map<std::string, std::string> files;
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    if (entry.path().extension() == ".plist") files[entry.path()] = testing::readText(entry.path());
  }
  return files;
}

TEST(ShowCommandTest, ShowsEveryServiceOfASavedDeviceAndChangesNothing) {
  const char* host = std::getenv("APPSYNC_HOST");
  ASSERT_NE(host, nullptr) << "APPSYNC_HOST is set by the build";
  testing::TempDir dir;
  const auto root = dir.path() / "device";
  {
    auto session = DeviceSession::create(root, {.coordination = true});
    fillDevice(session->device());
    session->close();
  }
  const auto show = [&](const std::string& arguments) {
    return testing::runHost(host, "show --root '" + root.string() + "' " + arguments, dir.path());
  };
  const auto before = filesUnder(DeviceSession::stateDirectory(root));
  ASSERT_FALSE(before.empty());

  const testing::HostRun asJson = show("--json --lines 2");
  ASSERT_EQ(asJson.status, 0) << asJson.stderrText;
  const json view = json::parse(asJson.stdoutText);
  std::vector<std::string> kinds;
  for (const json& app : view["registry"]) kinds.push_back(app["kind"]);
  EXPECT_EQ(kinds, (std::vector<std::string>{"installed", "placeholder", "bundle"}));
  EXPECT_EQ(
      view["homeScreen"]["iconState"],
      (json{{"iconLists", json::array({json::array({"com.a"})})}, {"badge", {{"data", "3q0="}}}}));
  EXPECT_EQ(view["restrictions"],
            (json{{"allowAppInstallation", "unset"}, {"allowAppRemoval", "no"}}));
  ASSERT_EQ(view["transactions"].size(), 2u);
  EXPECT_EQ(view["transactions"][0]["description"], "second");
  EXPECT_EQ(view["transactions"][1]["scenario"], "Asset install");
  ASSERT_EQ(view["coordinators"].size(), 1u);
  EXPECT_EQ(view["coordinators"][0]["kind"], "Restoring");
  EXPECT_EQ(view["finishedCoordinators"],
            json::parse(R"([{"bundleID": "com.c", "kind": "Updating", "state": "cancelled",
                             "errorDomain": "Test", "errorCode": 5, "cancellingClient": 1}])"));
  EXPECT_NE(renderDeviceTable(view, true).find("\033[1m"), std::string::npos);

  // Every registry row has its kind where the heading has KIND; no styling off a terminal.
  const testing::HostRun asTable = show("");
  ASSERT_EQ(asTable.status, 0) << asTable.stderrText;
  const std::string& table = asTable.stdoutText;
  const std::string heading = rowOf(table, "IDENTIFIER");
  EXPECT_EQ(rowOf(table, "com.a").find(" installed "), heading.find("KIND") - 1) << table;
  EXPECT_EQ(rowOf(table, "com.b").find(" placeholder "), heading.find("KIND") - 1) << table;
  EXPECT_NE(table.find("25%"), std::string::npos) << table;
  EXPECT_NE(rowOf(table, "com.c").find(" cancelled  Test 5 "), std::string::npos) << table;
  EXPECT_EQ(table.find('\033'), std::string::npos);
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
