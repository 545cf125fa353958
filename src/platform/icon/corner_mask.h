// The home-screen icon outline: a rounded square with continuous-curvature corners, as per-pixel
// antialiased coverage that is multiplied into an icon's alpha.
//
// Each corner is a quarter superellipse |u|^n + |v|^n = 1 spanning kCornerExtent x radius along
// both edges from the corner, where radius is kCornerRadius x side. A superellipse with n > 2 has
// zero curvature where it meets its axes, so each corner leaves the straight edge with the
// edge's own (zero) curvature and bends smoothly up to its tightest point on the diagonal:
// curvature is continuous all around the outline, unlike a circular arc, which jumps from 0 to
// 1/r where it starts. The exponent is chosen so that the curve crosses the diagonal exactly
// where a circular corner of the same radius would, which keeps the visual size of the rounding
// and makes n about 3.26.
#pragma once

#include <cstddef>
#include <vector>

#include "platform/icon/image.h"

namespace appsync::icon {

inline constexpr double kCornerRadius = 0.225;  // of the side
inline constexpr double kCornerExtent = 1.528;  // where the curve leaves the edge, in radii

class ContinuousCornerMask {
 public:
  // Precomputes the coverage of a size x size icon; size must be positive.
  explicit ContinuousCornerMask(int size);

  int size() const { return size_; }
  // Fraction of pixel (x, y) inside the outline, in [0, 1]; exactly 1 away from the corners and
  // exactly 0 in the pixels cut off entirely.
  float coverage(int x, int y) const { return coverage_[std::size_t(y) * size_ + x]; }

  // Multiplies the coverage into the alpha of a size x size image; other sizes are left alone
  // (returns false).
  bool apply(Image& image) const;

  // The superellipse exponent in use.
  static double exponent();

 private:
  int size_;
  std::vector<float> coverage_;
};

}  // namespace appsync::icon
