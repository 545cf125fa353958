// Coverage of the continuous-corner outline, computed once per icon size: exact along each
// pixel row, 16 sub-rows per pixel, averaged with the same by columns.
#include "platform/icon/corner_mask.h"

#include <algorithm>
#include <cmath>

namespace appsync::icon {
namespace {

constexpr int kSubRows = 16;

}  // namespace

double ContinuousCornerMask::exponent() {
  // A circle of radius r crosses the diagonal (1 - 1/sqrt 2) r from each edge; the superellipse
  // spanning kCornerExtent r crosses it kCornerExtent r (1 - 2^(-1/n)) from each edge.
  static const double n =
      std::log(2.0) / -std::log(1.0 - (1.0 - 1.0 / std::sqrt(2.0)) / kCornerExtent);
  return n;
}

ContinuousCornerMask::ContinuousCornerMask(int size)
    : size_(std::max(size, 0)), coverage_(std::size_t(size_) * size_, 1.0f) {
  const double n = exponent();
  const double side = size_;
  const double extent = std::min(kCornerExtent * kCornerRadius * side, side / 2);
  std::vector<double> inset(kSubRows);
  for (int y = 0; y < size_; ++y) {
    double deepest = 0;
    for (int s = 0; s < kSubRows; ++s) {
      const double centre = y + (s + 0.5) / kSubRows;
      const double fromEdge = std::min(centre, side - centre);
      if (fromEdge >= extent) {
        inset[s] = 0;
        continue;
      }
      // The outline at this height: how far in from the left (and right) edge it lies.
      const double v = (extent - fromEdge) / extent;
      inset[s] = extent - extent * std::pow(1.0 - std::pow(v, n), 1.0 / n);
      deepest = std::max(deepest, inset[s]);
    }
    // Only the pixels at the two ends of the row can be cut.
    const int cut = static_cast<int>(std::ceil(deepest));
    if (cut == 0) continue;
    float* row = coverage_.data() + std::size_t(y) * size_;
    for (int x = 0; x < size_; ++x) {
      if (x == cut && size_ - cut > x) x = size_ - cut;
      double covered = 0;
      for (int s = 0; s < kSubRows; ++s) {
        const double lo = std::max(double(x), inset[s]);
        const double hi = std::min(x + 1.0, side - inset[s]);
        covered += std::clamp(hi - lo, 0.0, 1.0);
      }
      row[x] = static_cast<float>(covered / kSubRows);
    }
  }
  // The outline is symmetric about the diagonal but sampling by rows is not; averaging the two
  // directions halves the sampling error and makes the corners exact mirror images.
  for (int y = 0; y < size_; ++y) {
    for (int x = 0; x < y; ++x) {
      float& a = coverage_[std::size_t(y) * size_ + x];
      float& b = coverage_[std::size_t(x) * size_ + y];
      a = b = (a + b) / 2;
    }
  }
}

bool ContinuousCornerMask::apply(Image& image) const {
  if (image.width != size_ || image.height != size_) return false;
  for (int y = 0; y < size_; ++y) {
    for (int x = 0; x < size_; ++x) {
      const float c = coverage(x, y);
      if (c >= 1.0f) continue;
      std::uint8_t* p = image.pixel(x, y);
      p[3] = static_cast<std::uint8_t>(std::lround(p[3] * c));
      if (p[3] == 0) p[0] = p[1] = p[2] = 0;
    }
  }
  return true;
}

}  // namespace appsync::icon
