// The icon service as its callers see it: rendered icons, PNG destinations, injected failures,
// and the command-line rendering.
#include "platform/icon/home_screen_icon_service.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <thread>

#include "platform/icon/png_codec.h"
#include "platform/icon/png_fixtures.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

class IconServiceTest : public ::testing::Test {
 protected:
  // A bundle whose only icon is a side x side file of one colour.
  std::string makeBundle(const std::string& name, int side) {
    const fs::path bundle = dir_.path() / name;
    testing::writeInfoPlist(bundle, "<key>BNBundleIconFile</key><string>Icon</string>");
    testing::writeBytes(bundle / "Icon.png", testing::solidPng(side, side, 200, 40, 90));
    return bundle.string();
  }

  testing::TempDir dir_;
};

TEST_F(IconServiceTest, RendersTheMaskedIconAtTheDeviceSize) {
  for (int source : {1024, 60}) {
    SCOPED_TRACE(source);
    HomeScreenIconService service;
    const auto bundle = service.openBundle(makeBundle("App" + std::to_string(source), source));
    ASSERT_TRUE(bundle);
    const auto icon = service.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(*bundle);
    ASSERT_TRUE(icon);
    const icon::Image& image = icon->image();
    ASSERT_EQ(image.width, 120);
    ASSERT_EQ(image.height, 120);
    for (auto [x, y] : {std::pair{0, 0}, {119, 0}, {0, 119}, {119, 119}}) {
      EXPECT_EQ(image.pixel(x, y)[3], 0) << x << "," << y;
    }
    const std::uint8_t* centre = image.pixel(60, 60);
    EXPECT_NEAR(centre[0], 200, 1);
    EXPECT_NEAR(centre[1], 40, 1);
    EXPECT_NEAR(centre[2], 90, 1);
    EXPECT_EQ(centre[3], 255);
    // Somewhere on the diagonal the curve passes through a pixel: partly transparent.
    int partial = 0;
    for (int i = 0; i < 60; ++i) partial += image.pixel(i, i)[3] > 0 && image.pixel(i, i)[3] < 255;
    EXPECT_GE(partial, 1);
  }
}

TEST_F(IconServiceTest, SizeAndIdiomAreTheServices) {
  const fs::path bundle = dir_.path() / "Pad.app";
  testing::writeInfoPlist(bundle,
                          "<key>BNBundleIconFile</key><string>Phone</string>"
                          "<key>BNBundleIcons~tablet</key><dict><key>BNBundlePrimaryIcon</key>"
                          "<dict><key>BNBundleIconFiles</key><array><string>Pad</string>"
                          "</array></dict></dict>");
  testing::writeBytes(bundle / "Phone.png", testing::solidPng(120, 120, 255, 0, 0));
  testing::writeBytes(bundle / "Pad~tablet.png", testing::solidPng(152, 152, 0, 0, 255));
  HomeScreenIconService tablet(76, icon::DeviceIdiom::Tablet);
  const auto icon =
      tablet.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(QIBundle(bundle.string()));
  ASSERT_TRUE(icon);
  EXPECT_EQ(icon->image().width, 76);
  EXPECT_EQ(icon->image().pixel(38, 38)[2], 255);
}

TEST_F(IconServiceTest, BundlesWithoutAnIcon) {
  HomeScreenIconService service;
  EXPECT_FALSE(service.openBundle((dir_.path() / "missing").string()));
  testing::writeBytes(dir_.path() / "file", {1});
  EXPECT_FALSE(service.openBundle((dir_.path() / "file").string()));
  EXPECT_FALSE(service.openBundle(""));

  fs::create_directories(dir_.path() / "Empty.app");
  const auto empty = service.openBundle((dir_.path() / "Empty.app").string());
  ASSERT_TRUE(empty);
  EXPECT_FALSE(service.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(*empty));
  std::string why;
  EXPECT_FALSE(service.renderIcon(*empty, &why));
  EXPECT_NE(why.find("no Info.plist"), std::string::npos) << why;
}

TEST_F(IconServiceTest, PngDestinationHoldsExactlyOneImage) {
  HomeScreenIconService service;
  const QIImage image(testing::solidImage(8, 8, 1, 2, 3));
  struct Case {
    const char* type;
    std::size_t capacity;
    int images;
    bool created;
    bool finalized;
  };
  const Case cases[] = {
      {"public.png", 1, 1, true, true},   {"public.png", 1, 0, true, false},
      {"public.png", 1, 2, true, false},  {"public.png", 0, 0, false, false},
      {"public.png", 2, 1, false, false}, {"public.jpeg", 1, 1, false, false},
      {"", 1, 1, false, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.type) + " x" + std::to_string(c.capacity) + " with " +
                 std::to_string(c.images));
    auto png = service.createImageDestination(c.type, c.capacity);
    ASSERT_EQ(png != nullptr, c.created);
    if (!png) continue;
    for (int i = 0; i < c.images; ++i) png->addImage(image);
    EXPECT_EQ(png->finalize(), c.finalized);
    EXPECT_FALSE(png->finalize());  // once only
    if (!c.finalized) {
      EXPECT_TRUE(png->data().empty());
      continue;
    }
    const std::optional<icon::Image> back = icon::decodePng(png->data());
    ASSERT_TRUE(back);
    EXPECT_EQ(back->rgba, image.image().rgba);
  }
}

TEST_F(IconServiceTest, InjectedFailures) {
  const std::string path = makeBundle("App.app", 120);
  const QIImage image(testing::solidImage(4, 4, 1, 2, 3));
  // Runs each step once; true when it succeeded.
  auto run = [&](HomeScreenIconService& s, QIStep step) {
    switch (step) {
      case QIStep::OpenBundle:
        return s.openBundle(path) != nullptr;
      case QIStep::RenderIcon:
        return s.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(QIBundle(path)) != nullptr;
      case QIStep::CreateImageDestination:
        return s.createImageDestination(kPNGTypeIdentifier, 1) != nullptr;
      case QIStep::Finalize: {
        auto png = s.createImageDestination(kPNGTypeIdentifier, 1);
        png->addImage(image);
        return png->finalize();
      }
    }
    return false;
  };
  const QIStep steps[] = {QIStep::OpenBundle, QIStep::RenderIcon, QIStep::CreateImageDestination,
                          QIStep::Finalize};
  for (QIStep step : steps) {
    SCOPED_TRACE(static_cast<int>(step));
    HomeScreenIconService service;
    service.failNext(step, 2);
    EXPECT_FALSE(run(service, step));
    EXPECT_FALSE(run(service, step));
    EXPECT_TRUE(run(service, step));
    for (QIStep other : steps) {
      if (other != step) {
        EXPECT_TRUE(run(service, other));
      }
    }
    service.setFailing(step, true);
    EXPECT_FALSE(run(service, step));
    EXPECT_FALSE(run(service, step));
    service.setFailing(step, false);
    EXPECT_TRUE(run(service, step));
  }

  // A destination handed out before the switch still obeys it.
  HomeScreenIconService service;
  auto png = service.createImageDestination(kPNGTypeIdentifier, 1);
  png->addImage(image);
  service.failNext(QIStep::Finalize);
  EXPECT_FALSE(png->finalize());
}

TEST_F(IconServiceTest, ConcurrentRenderingAndFaults) {
  const std::string path = makeBundle("App.app", 256);
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

TEST_F(IconServiceTest, RenderIconPngForTheCommandLine) {
  const std::string path = makeBundle("App.app", 180);
  std::string why;
  const auto png = renderIconPng(path, 64, &why);
  ASSERT_TRUE(png) << why;
  ASSERT_GE(png->size(), 8u);
  EXPECT_EQ(std::vector<std::uint8_t>(png->begin(), png->begin() + 8),
            (std::vector<std::uint8_t>{137, 80, 78, 71, 13, 10, 26, 10}));
  const std::optional<icon::Image> image = icon::decodePng(*png);
  ASSERT_TRUE(image);
  EXPECT_EQ(image->width, 64);
  EXPECT_EQ(image->pixel(0, 0)[3], 0);
  EXPECT_EQ(image->pixel(32, 32)[0], 200);

  struct Case {
    std::string dir;
    int size;
    const char* reason;
  };
  fs::create_directories(dir_.path() / "Empty.app");
  const Case failures[] = {
      {path, 0, "icon size 0 is outside"},
      {path, 5000, "outside"},
      {(dir_.path() / "missing").string(), 120, "no bundle directory at"},
      {(dir_.path() / "Empty.app").string(), 120, "no Info.plist"},
  };
  for (const Case& c : failures) {
    SCOPED_TRACE(c.reason);
    why.clear();
    EXPECT_FALSE(renderIconPng(c.dir, c.size, &why));
    EXPECT_NE(why.find(c.reason), std::string::npos) << why;
  }
}

}  // namespace
}  // namespace appsync
