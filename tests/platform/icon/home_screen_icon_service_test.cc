// The icon service beyond what the client's icon rendering shows: rendering from several threads
// while faults are injected.
#include "platform/icon/home_screen_icon_service.h"

#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <thread>

#include "platform/icon/png_fixtures.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

// A bundle whose only icon is a side x side file of one colour.
std::string makeBundle(const std::filesystem::path& bundle, int side) {
  testing::writeInfoPlist(bundle, "<key>BNBundleIconFile</key><string>Icon</string>");
  testing::writeBytes(bundle / "Icon.png", testing::solidPng(side, side, 200, 40, 90));
  return bundle.string();
}

// Under ThreadSanitizer: exactly the injected number of renderings fail.
TEST(IconServiceTest, ConcurrentRenderingAndFaults) {
  testing::TempDir dir;
  const std::string path = makeBundle(dir.path() / "App.app", 256);
  HomeScreenIconService service(60);
  service.failNext(QIStep::RenderIcon, 3);
  std::atomic<int> rendered{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 3; ++i) {
        auto bundle = service.openBundle(path);
        if (bundle && service.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(*bundle)) {
          ++rendered;
        }
      }
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(rendered.load(), 12 - 3);
}

}  // namespace
}  // namespace appsync
