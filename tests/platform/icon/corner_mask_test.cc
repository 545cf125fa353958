// The home-screen outline: cut corners, untouched middle, antialiased edge, and the area a
// continuous corner of radius 0.225 x side removes.
#include "platform/icon/corner_mask.h"

#include <gtest/gtest.h>

#include <cmath>

namespace appsync::icon {
namespace {

TEST(CornerMaskTest, OutlineShape) {
  for (int size : {29, 120, 180}) {
    SCOPED_TRACE(size);
    const ContinuousCornerMask mask(size);
    const int last = size - 1;
    EXPECT_EQ(mask.coverage(0, 0), 0.0f);
    EXPECT_EQ(mask.coverage(size / 2, size / 2), 1.0f);
    EXPECT_EQ(mask.coverage(size / 2, 0), 1.0f);  // straight edges are not touched
    double total = 0;
    int partial = 0;
    for (int y = 0; y < size; ++y) {
      for (int x = 0; x < size; ++x) {
        const float c = mask.coverage(x, y);
        ASSERT_EQ(c, mask.coverage(last - x, y));
        ASSERT_EQ(c, mask.coverage(x, last - y));
        ASSERT_EQ(c, mask.coverage(y, x));
        partial += c > 0 && c < 1;
        total += c;
      }
    }
    // Antialiased: the curve leaves partly covered pixels all along it.
    EXPECT_GT(partial, size / 4);
    // Along the diagonal coverage grows from nothing to full without going back.
    for (int i = 1; i < size / 2; ++i) ASSERT_GE(mask.coverage(i, i), mask.coverage(i - 1, i - 1));

    // Each corner removes the part of an E x E square outside a quarter superellipse of
    // exponent n, whose area is E^2 Gamma(1 + 1/n)^2 / Gamma(1 + 2/n).
    const double n = ContinuousCornerMask::exponent();
    const double e = kCornerExtent * kCornerRadius * size;
    const double quarter = e * e * std::pow(std::tgamma(1 + 1 / n), 2) / std::tgamma(1 + 2 / n);
    EXPECT_NEAR(total, double(size) * size - 4 * (e * e - quarter), 0.02 * size);
  }
}

TEST(CornerMaskTest, CornerCrossesTheDiagonalWhereACircularCornerWould) {
  // A circle of radius r = 0.225 x side meets the diagonal (1 - 1/sqrt 2) r from each edge.
  const double n = ContinuousCornerMask::exponent();
  const double crossing = kCornerExtent * (1 - std::pow(2.0, -1 / n));
  EXPECT_NEAR(crossing, 1 - 1 / std::sqrt(2.0), 1e-9);
  // On a 1000-pixel mask that is 65.9 pixels in: pixel 64 lies outside, pixel 67 inside.
  const ContinuousCornerMask mask(1000);
  EXPECT_EQ(mask.coverage(64, 64), 0.0f);
  EXPECT_EQ(mask.coverage(67, 67), 1.0f);
}

}  // namespace
}  // namespace appsync::icon
