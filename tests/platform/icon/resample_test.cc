// Scaling: area averaging down, interpolation up, premultiplied alpha, centre crop.
#include "platform/icon/resample.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>

#include "platform/icon/png_fixtures.h"

namespace appsync::icon {
namespace {

TEST(ResampleTest, CheckerboardShrinksToGrey) {
  struct Case {
    int side;
    int tolerance;  // around 127.5; non-integer ratios see uneven shares at window edges
  };
  for (const Case& c : {Case{480, 1}, Case{1000, 12}, Case{241, 30}}) {
    SCOPED_TRACE(c.side);
    Image board = testing::solidImage(c.side, c.side, 0, 0, 0);
    for (int y = 0; y < c.side; ++y) {
      for (int x = (y + 1) % 2; x < c.side; x += 2) std::fill_n(board.pixel(x, y), 3, 255);
    }
    const Image out = scaleToSquare(board, 120);
    ASSERT_EQ(out.width, 120);
    double sum = 0;
    for (int y = 0; y < 120; ++y) {
      for (int x = 0; x < 120; ++x) {
        const std::uint8_t* p = out.pixel(x, y);
        ASSERT_LE(std::abs(2 * int(p[0]) - 255), 2 * c.tolerance) << x << "," << y;
        ASSERT_EQ(p[0], p[1]);
        ASSERT_EQ(p[3], 255);
        sum += p[0];
      }
    }
    EXPECT_NEAR(sum / (120 * 120), 127.5, 1.0);
  }
}

TEST(ResampleTest, TransparentPixelsLendNoColour) {
  Image pair(2, 1);
  pair.rgba = {255, 0, 0, 0, 0, 0, 255, 255};  // invisible red, opaque blue
  const Image shrunk = resample(pair, {0, 0, 2, 1}, 1, 1);
  EXPECT_EQ(shrunk.rgba, (std::vector<std::uint8_t>{0, 0, 255, 128}));
  // Enlarged, output centres fall at -0.25, 0.25, 0.75 and 1.25 source pixels (clamped).
  const Image grown = resample(pair, {0, 0, 2, 1}, 4, 1);
  EXPECT_EQ(grown.pixel(0, 0)[3], 0);
  EXPECT_EQ(grown.pixel(1, 0)[0], 0);  // a quarter of blue, no red
  EXPECT_EQ(grown.pixel(1, 0)[2], 255);
  EXPECT_EQ(grown.pixel(1, 0)[3], 64);
}

TEST(ResampleTest, NonSquareSourcesAreCroppedToTheirCentre) {
  // Thirds of red, green and blue along the long side: only green remains.
  for (bool wide : {true, false}) {
    SCOPED_TRACE(wide ? "wide" : "tall");
    Image stripes(wide ? 300 : 100, wide ? 100 : 300);
    for (int y = 0; y < stripes.height; ++y) {
      for (int x = 0; x < stripes.width; ++x) {
        const int third = (wide ? x : y) / 100;
        std::uint8_t* p = stripes.pixel(x, y);
        p[third] = 255;
        p[3] = 255;
      }
    }
    const Image out = scaleToSquare(stripes, 50);
    for (std::size_t i = 0; i < out.rgba.size(); i += 4) {
      ASSERT_EQ(out.rgba[i], 0);
      ASSERT_EQ(out.rgba[i + 1], 255);
      ASSERT_EQ(out.rgba[i + 2], 0);
    }
  }
  // One extra column: the crop starts half a pixel in, so the first output pixel (two source
  // pixels wide) is a quarter red.
  Image odd = testing::solidImage(101, 100, 0, 255, 0);
  for (int y = 0; y < 100; ++y) odd.pixel(0, y)[0] = 255, odd.pixel(0, y)[1] = 0;
  const Image out = scaleToSquare(odd, 50);
  EXPECT_NEAR(out.pixel(0, 10)[0], 64, 1);
  EXPECT_NEAR(out.pixel(0, 10)[1], 191, 1);
  EXPECT_EQ(out.pixel(1, 10)[0], 0);
}

}  // namespace
}  // namespace appsync::icon
