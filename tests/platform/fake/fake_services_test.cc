// The small fakes: backup, restrictions, store, transaction log; and the data objects'
// descriptions.
#include <gtest/gtest.h>

#include <future>
#include <thread>

#include "platform/ar.h"
#include "platform/em.h"
#include "platform/fake/fake_bz.h"
#include "platform/fake/fake_rs.h"
#include "platform/fake/fake_sw.h"
#include "platform/fake/fake_transaction_log.h"
#include "platform/kc.h"

namespace appsync {
namespace {

TEST(FakeSWBackupServiceTest, RestoreDataAndCancellation) {
  FakeSWBackupService sw;
  std::shared_ptr<SWManager> manager = sw.newManager();
  sw.setRestoreData("a.app", 4096);
  std::uint64_t size = 0;
  EXPECT_TRUE(manager->restoreDataExistsForApplicationWithBundleID("a.app", &size));
  EXPECT_EQ(size, 4096u);
  EXPECT_TRUE(manager->restoreDataExistsForApplicationWithBundleID("a.app", nullptr));
  size = 1;
  EXPECT_FALSE(manager->restoreDataExistsForApplicationWithBundleID("b.app", &size));
  EXPECT_EQ(size, 1u);

  ErrorRef error;
  EXPECT_TRUE(manager->cancelApplicationRestoreWithBundleID("a.app", &error));
  sw.failOperation("cancelApplicationRestoreWithBundleID:error:");
  EXPECT_FALSE(manager->cancelApplicationRestoreWithBundleID("b.app", &error));
  ASSERT_TRUE(error);
  EXPECT_NE(error->describe().find("cancelApplicationRestoreWithBundleID:error:"),
            std::string::npos);
  EXPECT_EQ(sw.cancelledRestores(), (std::vector<std::string>{"a.app", "b.app"}));
  sw.failOperation("restoreDataExistsForApplicationWithBundleID:size:");
  EXPECT_FALSE(sw.newManager()->restoreDataExistsForApplicationWithBundleID("a.app", &size));
}

TEST(FakeRSProfileConnectionTest, SettingsDefaultToNoData) {
  FakeRSProfileConnection rs;
  EXPECT_EQ(rs.effectiveBoolValueForSetting(RSFeatureAppInstallationAllowed),
            RSRestrictedBoolNoData);
  rs.setValue(RSFeatureAppInstallationAllowed, RSRestrictedBoolExplicitNo);
  EXPECT_EQ(rs.effectiveBoolValueForSetting(RSFeatureAppInstallationAllowed),
            RSRestrictedBoolExplicitNo);
  EXPECT_EQ(rs.effectiveBoolValueForSetting(RSFeatureAppRemovalAllowed), RSRestrictedBoolNoData);
}

TEST(FakeBZStoreServiceTest, RefreshCompletesOnTheStoreThread) {
  FakeBZStoreService bz;
  auto library = bz.newSoftwareLibrary();
  std::promise<std::pair<ErrorRef, std::thread::id>> done;
  library->refreshReceiptsWithCompletionBlock([&](ErrorRef e) {
    done.set_value({e, std::this_thread::get_id()});
  });
  auto [error, thread] = done.get_future().get();
  EXPECT_EQ(error, nullptr);
  EXPECT_NE(thread, std::this_thread::get_id());

  bz.failOperation("refreshReceiptsWithCompletionBlock:");
  ErrorRef received;
  library->refreshReceiptsWithCompletionBlock([&](ErrorRef e) { received = e; });
  bz.drain();
  ASSERT_TRUE(received);
  EXPECT_EQ(received->domain, "BZStoreErrorDomain");
  EXPECT_EQ(bz.refreshCount(), 2u);
}

TEST(FakeTransactionLogTest, KeepsEntriesInOrder) {
  FakeTransactionLog log;
  auto object =
      std::make_shared<const OSLogObject>(OSLogObject{"com.vantor.appinstallation", "trc.appsync"});
  log.initializeWithLog(object);
  std::vector<std::string> heard;
  log.setEntryListener([&](const TransactionLogEntry& e) { heard.push_back(e.describe()); });
  log.logStep(3, 1, 1, true, "a.app", "Create coordinator");
  log.logScenario("Asset install", 0, true, "a.app", "assertion succeeded");
  log.logStep(3, 1, 2, false, "a.app", "Finished creating coordinator");

  ASSERT_EQ(log.initializeCalls().size(), 1u);
  EXPECT_EQ(log.initializeCalls()[0]->category, "trc.appsync");
  ASSERT_EQ(log.entries().size(), 3u);
  EXPECT_EQ(log.steps().size(), 2u);
  ASSERT_EQ(log.scenarios().size(), 1u);
  EXPECT_EQ(log.scenarios()[0].scenario, "Asset install");
  EXPECT_EQ(heard, (std::vector<std::string>{
                       "step 3 party 1 phase 1 success 1 a.app: Create coordinator",
                       "scenario \"Asset install\" step 0 success 1 a.app: assertion succeeded",
                       "step 3 party 1 phase 2 success 0 a.app: Finished creating coordinator"}));
}

TEST(DataObjectDescriptionTest, SingleLineDescriptions) {
  auto metadata = std::make_shared<const EMStoreMetadata>(plist::Dict{{"itemName", "Example"}});
  EMInstallOptions options;
  options.setArInstallType(2);
  EXPECT_EQ(options.describe(),
            "<EMInstallOptions arInstallType=2 installTargetType=0 caravelMetadata=(null)>");
  options.setCaravelMetadata(metadata);
  EXPECT_NE(options.describe().find("caravelMetadata=<EMStoreMetadata "), std::string::npos);

  KCPlaceholderAttributes attributes(plist::Dict{{"BNBundleIdentifier", "a.app"}});
  attributes.setBundleVersion("1.2");
  attributes.setLaunchProhibited(true);
  const std::string text = attributes.describe();
  EXPECT_EQ(text.rfind("<KCPlaceholderAttributes bundleVersion=1.2 launchProhibited=1 ", 0), 0u);

  ARInstallProgress progress("a.app");
  progress.setInstallState(ARInstallStateActive);
  progress.setTotalUnitCount(10);
  progress.setCompletedUnitCount(4);
  progress.cancel();
  EXPECT_EQ(progress.describe(),
            "<ARInstallProgress a.app state=1 phase=0 completed=4/10 cancelled=1>");

  for (const std::string& d : {options.describe(), text, metadata->describe()}) {
    EXPECT_EQ(d.find('\n'), std::string::npos) << d;
  }
}

}  // namespace
}  // namespace appsync
