// Assets and the fake host sync framework: thread-safe assets, descriptions, the recoverable
// error test, the log categories and the device service.
#include "platform/fake/fake_tr.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <future>
#include <thread>

namespace appsync {
namespace {

TEST(TRAssetTest, DownloadAssetAndDescriptions) {
  auto asset = TRAsset::downloadAssetWithIdentifier("com.example.app", "Application", "Example");
  EXPECT_TRUE(asset->isDownload());
  EXPECT_EQ(asset->prettyName(), "Example");
  EXPECT_EQ(asset->shortDescription(), "<TRAsset Application com.example.app>");
  asset->setPath("/var/mobile/Media/PublicStaging/a b.zip");
  asset->setVariantOptions({{"AssetParts", 3}, {"Version", "1.0"}});
  const std::string text = asset->describe();
  EXPECT_EQ(text.find('\n'), std::string::npos);
  EXPECT_NE(text.find("com.example.app"), std::string::npos);
  EXPECT_NE(text.find("path=/var/mobile/Media/PublicStaging/a b.zip"), std::string::npos);

  TRAsset upload("com.example.app", "Application", std::nullopt, false);
  EXPECT_FALSE(upload.isDownload());
  EXPECT_NE(upload.describe().find("prettyName=(null)"), std::string::npos);
}

// Run under ThreadSanitizer: a writer and a reader on the same asset.
TEST(TRAssetTest, AccessorsAreThreadSafe) {
  auto asset = TRAsset::downloadAssetWithIdentifier("com.example.app", "Application", "Example");
  std::thread writer([&] {
    for (int i = 0; i < 2000; ++i) {
      asset->setPath("/p/" + std::to_string(i));
      asset->setCompletedAssetParts(static_cast<std::uint64_t>(i % 4));
      asset->setVariantOptions({{"AssetParts", i}});
      asset->setDownloadProgress(static_cast<float>(i));
      asset->setIsRestore(i % 2 == 0);
    }
  });
  std::size_t seen = 0;
  for (int i = 0; i < 2000; ++i) {
    seen += asset->path().value_or("").size();
    seen += asset->variantOptions().size();
    seen += asset->describe().size() > 0 ? 1 : 0;
    seen += asset->completedAssetParts() < 4 ? 1 : 0;
  }
  writer.join();
  EXPECT_GT(seen, 0u);
  EXPECT_EQ(asset->path(), "/p/1999");
}

TEST(TRMutableAccountInfoTest, DescribeIsOneLine) {
  TRMutableAccountInfo info;
  info.setVantorID("buyer@example.com");
  info.setPRID(1234);
  EXPECT_EQ(info.describe(),
            "<TRMutableAccountInfo vantorID=buyer@example.com PRID=1234 altPRID=(null)>");
}

TEST(FakeTRHostTest, RecoverableErrors) {
  auto withFlag = [](plist::Value flag) {
    auto e = std::make_shared<Error>();
    e->domain = "Other";
    e->userInfo.set("recoverable", std::move(flag));
    return ErrorRef(e);
  };
  const struct {
    const char* what;
    ErrorRef error;
    bool recoverable;
  } cases[] = {
      {"null", nullptr, false},
      {"EAGAIN", makeError(kPOSIXErrorDomain, EAGAIN), true},
      {"ETIMEDOUT", makeError(kPOSIXErrorDomain, ETIMEDOUT), true},
      {"ECONNRESET", makeError(kPOSIXErrorDomain, ECONNRESET), true},
      {"ENETDOWN", makeError(kPOSIXErrorDomain, ENETDOWN), true},
      {"ENETUNREACH", makeError(kPOSIXErrorDomain, ENETUNREACH), true},
      {"EINVAL", makeError(kPOSIXErrorDomain, EINVAL), false},
      {"EAGAIN code in another domain", makeError(kTRErrorDomain, EAGAIN), false},
      {"flag true", withFlag(true), true},
      {"flag false", withFlag(false), false},
      {"flag as string", withFlag("YES"), false},
  };
  FakeTRHost host;
  for (const auto& c : cases) {
    EXPECT_EQ(host.TRIsRecoverableError(c.error), c.recoverable) << c.what;
  }
  host.setRecoverableErrorPredicate([](const ErrorRef& e) { return e && e->code == 7; });
  EXPECT_TRUE(host.TRIsRecoverableError(makeError(kTRErrorDomain, 7)));
  EXPECT_FALSE(host.TRIsRecoverableError(makeError(kPOSIXErrorDomain, EAGAIN)));
  host.setRecoverableErrorPredicate(nullptr);
  EXPECT_TRUE(host.TRIsRecoverableError(makeError(kPOSIXErrorDomain, EAGAIN)));
}

TEST(FakeTRHostTest, LogCategoriesWriteToTheMemorySink) {
  FakeTRHost host;
  LogCategory& category = host.TRGetLogCategory(8);
  EXPECT_EQ(&category, &host.TRGetLogCategory(8));
  EXPECT_EQ(category.number(), 8);
  pluginLog(category, LogLevel::Error, "%s|Uninstall of %{public}@ failed.",
            std::string("com.example.app"));
  logMessage(host.TRGetLogCategory(0), LogLevel::Error, "unexpected type for %{public}@",
             std::string("PRPersonID"));
  auto lines = host.logSink()->lines();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].category, 8);
  EXPECT_EQ(lines[0].level, LogLevel::Error);
  EXPECT_EQ(lines[0].message, "com.vantor.trc.AppSync|Uninstall of com.example.app failed.");
  EXPECT_EQ(lines[1].category, 0);
  EXPECT_EQ(lines[1].message, "unexpected type for PRPersonID");
}

TEST(FakeTRDeviceServiceTest, PrioritizeCompletesOnAnotherThreadWithTheScriptedError) {
  FakeTRHost host;
  std::shared_ptr<TRDeviceService> service = host.TRDeviceServiceSharedInstance();
  EXPECT_EQ(service.get(), &host.deviceService());
  EXPECT_TRUE(service->respondsTo(TRDeviceService::Operation::prioritizeAsset));
  EXPECT_TRUE(service->respondsTo(TRDeviceService::Operation::cancelAssetTransferForFailedAsset));

  auto asset = TRAsset::downloadAssetWithIdentifier("com.example.a", "Application", "A");
  std::promise<std::pair<ErrorRef, std::thread::id>> first;
  service->prioritizeAsset(asset, [&](ErrorRef error) {
    first.set_value({error, std::this_thread::get_id()});
  });
  auto [error, thread] = first.get_future().get();
  EXPECT_EQ(error, nullptr);
  EXPECT_NE(thread, std::this_thread::get_id());

  ErrorRef scripted = makeError(kTRErrorDomain, 42);
  host.deviceService().failOperation("prioritizeAsset:withCompletion:", scripted, 1);
  ErrorRef received;
  service->prioritizeAsset(asset, [&](ErrorRef e) { received = e; });
  host.deviceService().drain();
  EXPECT_EQ(received, scripted);
  ErrorRef afterwards = scripted;
  service->prioritizeAsset(asset, [&](ErrorRef e) { afterwards = e; });
  host.deviceService().drain();
  EXPECT_EQ(afterwards, nullptr);  // the failure was for one call only

  service->cancelAssetTransferForFailedAsset(
      TRAsset::downloadAssetWithIdentifier("com.example.b", "Application", "B"));
  EXPECT_EQ(host.deviceService().prioritizedIdentifiers(),
            (std::vector<std::string>{"com.example.a", "com.example.a", "com.example.a"}));
  EXPECT_EQ(host.deviceService().cancelledIdentifiers(), std::vector<std::string>{"com.example.b"});
  EXPECT_EQ(host.deviceService().callCount("prioritizeAsset:withCompletion:"), 3u);

  host.deviceService().setRespondsTo(TRDeviceService::Operation::prioritizeAsset, false);
  EXPECT_FALSE(service->respondsTo(TRDeviceService::Operation::prioritizeAsset));
  EXPECT_TRUE(service->respondsTo(TRDeviceService::Operation::cancelAssetTransferForFailedAsset));
}

}  // namespace
}  // namespace appsync
