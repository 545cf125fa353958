// The device's saved state: what one process saves, the next loads and saves again byte for
// byte, and a malformed file is refused with a message naming the file and the field.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <map>

#include "platform/fake/fake_platform.h"
#include "platform/fake/state_fields.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr const char* kSyncing = "com.vantor.appsync.syncing";

// Something in every service, scripted failures included.
void fillDevice(FakePlatform& device, const fs::path& root) {
  device.manualClock()->advance(std::chrono::seconds(90));
  device.ar().putApplication({.identifier = "com.a", .version = "2"});
  device.kc().failOperation("setSinfData:error:", nullptr, 2);

  device.em().addUninstalled("com.gone");
  device.em().addUninstalled("com.cleared");
  device.em().EmplaceClearUninstalled({"com.cleared"}, nullptr);
  device.em().failOperation("EmplaceLookupUninstalled");

  device.sw().setRestoreData("com.a", 4096);
  device.sw().newManager()->cancelApplicationRestoreWithBundleID("com.b", nullptr);
  auto full = std::make_shared<Error>(
      Error{"SWBackupErrorDomain", 7, {{"description", "full"}}, makePOSIXError(ENOSPC, "/var")});
  device.sw().failOperation("cancelApplicationRestoreWithBundleID:error:", full, 3);
  device.rs().setValue("allowAppInstallation", 2);
  device.bz().failOperation(FakeBZStoreService::kRefresh);

  FakePVHomeScreen& pv = device.pv();
  pv.setIconOrder({"com.a", "com.b"});
  const std::uint8_t layout[] = {1, 2, 3};
  pv.PVSetIconState(pv.PVSPavilionBlockableServerPort(), layout, sizeof layout);
  PVBuffer buffer;
  std::uint32_t length = 0;
  pv.PVGetFlattenedIconState(pv.PVSPavilionBlockableServerPort(), 3, &buffer, &length);
  pv.scriptAssertionOutcomes("com.a", {kPVSAssertionDenied, kPVSAssertionApplicationNotFound});
  std::int32_t outcome = 0;
  pv.PVSApplicationTerminationAssertionCreateWithError("com.a", 0, &outcome);

  FakeSystemServices& system = device.system();
  int token = 0;
  system.notifyRegisterCheck(kSyncing, &token);
  system.notifyPost(kSyncing);
  system.notifySetState(token, 1);
  system.notifyPost(kSyncing);
  system.notifyPost("com.vantor.other");
  system.setOwnerAndGroup((root / "tmp").string(), "no-such-user", "no-such-group", nullptr);
  system.failOperation("setFileTimesToNow", makePOSIXError(EACCES), 2);

  FakeTRDeviceService& host = device.tr().deviceService();
  host.prioritizeAsset(TRAsset::downloadAssetWithIdentifier("com.a", "Apps", std::nullopt), {});
  host.cancelAssetTransferForFailedAsset(
      TRAsset::downloadAssetWithIdentifier("com.b", "Apps", std::nullopt));
  host.setRespondsTo(TRDeviceService::Operation::cancelAssetTransferForFailedAsset, false);
  host.failOperation("prioritizeAsset:withCompletion:");
  device.transactionLog().logStep(3, 1, 1, true, "com.a", "Create coordinator");
  device.transactionLog().logScenario("Asset install", 0, false, "com.a", "assertion failed");
}

std::map<std::string, FileIdentity> identities(const fs::path& directory) {
  std::map<std::string, FileIdentity> out;
  for (const auto& entry : fs::directory_iterator(directory)) {
    out[entry.path().filename().string()] = *fileIdentity(entry.path().string());
  }
  return out;
}

TEST(DeviceStateTest, ALoadedDeviceSavesTheSameBytesAndRewritesNothingUnchanged) {
  testing::TempDir root, first, second;
  const fs::path saved = first.path() / ".platform";
  {
    FakePlatform device(root.path(),
                        {.coordination = true, .mainBundleIdentifier = "com.vantor.trc"});
    fillDevice(device, root.path());
    device.saveState(saved);
  }
  FakePlatform loaded(root.path(), FakePlatform::loadOptions(saved));
  loaded.loadState(saved);
  loaded.saveState(second.path());

  const std::map<std::string, FileIdentity> written = identities(second.path());
  EXPECT_EQ(written.size(), 12u);
  EXPECT_EQ(identities(saved).size(), written.size());
  for (const auto& [name, identity] : written) {
    EXPECT_EQ(testing::readText(second.path() / name), testing::readText(saved / name)) << name;
  }
  loaded.saveState(second.path());
  for (const auto& [name, identity] : identities(second.path())) {
    EXPECT_TRUE(identity == written.at(name)) << name << " was rewritten";
  }

  // What the loaded fakes answer (after saving: answering counts calls).
  EXPECT_EQ(loaded.clock().now().time_since_epoch(), std::chrono::seconds(90));
  EXPECT_EQ(loaded.em().uninstalled(), std::vector<std::string>{"com.gone"});
  EXPECT_EQ(loaded.em().EmplaceLookupUninstalled(nullptr), nullptr);
  EXPECT_EQ(loaded.system().mainBundleIdentifier(), "com.vantor.trc");
  EXPECT_EQ(loaded.system().statesAtPosts(kSyncing),
            (std::vector<std::optional<std::uint64_t>>{std::nullopt, 1}));
  std::int32_t outcome = 0;
  loaded.pv().PVSApplicationTerminationAssertionCreateWithError("com.a", 0, &outcome);
  EXPECT_EQ(outcome, kPVSAssertionApplicationNotFound);
  ErrorRef error;
  EXPECT_FALSE(loaded.sw().newManager()->cancelApplicationRestoreWithBundleID("com.c", &error));
  ASSERT_TRUE(error && error->underlying);
  EXPECT_EQ(error->underlying->code, ENOSPC);
}

TEST(DeviceStateTest, MalformedFilesAreRefusedNamingTheFileAndTheField) {
  struct Case {
    const char* file;
    const char* contents;
    const char* message;
  };
  const Case cases[] = {
      {"installer.plist", "uninstalled = (com.a)", "/installer.plist: not a property list"},
      {"backup.plist", "<plist><array/></plist>",
       "/backup.plist: expected a dictionary at the root"},
      {"notifications.plist",
       "<dict><key>notifications</key><dict><key>com.a</key><dict><key>state</key>"
       "<string>1</string></dict></dict></dict>",
       "/notifications.plist: notifications.com.a.state: expected an unsigned integer"},
      {"store.plist",
       "<dict><key>scriptedFailures</key><dict><key>refreshReceipts</key><dict><key>calls</key>"
       "<integer>1</integer></dict></dict></dict>",
       "/store.plist: scriptedFailures.refreshReceipts: not an operation of FakeBZStoreService"},
      {"homescreen.plist",
       "<dict><key>scriptedFailures</key><dict><key>PVSPavilionBlockableServerPort</key><dict>"
       "<key>calls</key><integer>0</integer><key>failing</key><dict/></dict></dict></dict>",
       "/homescreen.plist: scriptedFailures.PVSPavilionBlockableServerPort.failing: the operation "
       "cannot fail"},
  };
  for (const Case& c : cases) {
    testing::TempDir root, saved;
    testing::writeText(saved.path() / c.file, c.contents);
    FakePlatform device(root.path());
    EXPECT_THAT([&] { device.loadState(saved.path()); },
                ::testing::ThrowsMessage<StateFormatError>(::testing::HasSubstr(c.message)));
  }
}

}  // namespace
}  // namespace appsync
