// Separable resampling on premultiplied floats: per-axis tap lists, a horizontal pass over the
// source rows that matter, then a vertical pass.
#include "platform/icon/resample.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <vector>

namespace appsync::icon {
namespace {

// For every output index along one axis, the source indices it reads and their weights (which
// sum to 1).
struct AxisTaps {
  std::vector<std::size_t> begin;  // outSize + 1 offsets into index/weight
  std::vector<int> index;
  std::vector<float> weight;
  int lowest = 0;
  int highest = 0;
};

AxisTaps computeTaps(int srcSize, double start, double length, int outSize) {
  AxisTaps taps;
  taps.begin.reserve(static_cast<std::size_t>(outSize) + 1);
  const double scale = length / outSize;  // source pixels per output pixel
  auto add = [&taps](int index, double weight) {
    taps.index.push_back(index);
    taps.weight.push_back(static_cast<float>(weight));
  };
  for (int i = 0; i < outSize; ++i) {
    taps.begin.push_back(taps.index.size());
    if (scale > 1.0) {
      // Area average: the output pixel covers [lo, hi) of the source.
      const double lo = std::clamp(start + i * scale, 0.0, double(srcSize));
      const double hi = std::clamp(start + (i + 1) * scale, 0.0, double(srcSize));
      const std::size_t first = taps.index.size();
      double total = 0;
      for (int j = static_cast<int>(std::floor(lo)); j < srcSize && j < hi; ++j) {
        const double overlap = std::min(hi, j + 1.0) - std::max(lo, double(j));
        if (overlap <= 0) continue;
        add(j, overlap);
        total += overlap;
      }
      if (total > 0) {
        for (std::size_t k = first; k < taps.index.size(); ++k) {
          taps.weight[k] = static_cast<float>(taps.weight[k] / total);
        }
      } else {
        add(std::clamp(static_cast<int>(lo), 0, srcSize - 1), 1.0);
      }
    } else {
      // Interpolation between the two source pixel centres around the output pixel centre.
      const double centre = std::clamp(start + (i + 0.5) * scale - 0.5, 0.0, double(srcSize - 1));
      const int j = static_cast<int>(std::floor(centre));
      const double fraction = centre - j;
      if (fraction > 0 && j + 1 < srcSize) {
        add(j, 1.0 - fraction);
        add(j + 1, fraction);
      } else {
        add(j, 1.0);
      }
    }
  }
  taps.begin.push_back(taps.index.size());
  const auto [lo, hi] = std::minmax_element(taps.index.begin(), taps.index.end());
  taps.lowest = *lo;
  taps.highest = *hi;
  return taps;
}

}  // namespace

Image resample(const Image& source, const SourceRect& rect, int outWidth, int outHeight) {
  if (outWidth <= 0 || outHeight <= 0) return Image();
  Image out(outWidth, outHeight);
  if (source.empty() || !std::isfinite(rect.x) || !std::isfinite(rect.y) ||
      !std::isfinite(rect.width) || !std::isfinite(rect.height) || !(rect.width > 0) ||
      !(rect.height > 0)) {
    return out;
  }

  const AxisTaps horizontal = computeTaps(source.width, rect.x, rect.width, outWidth);
  const AxisTaps vertical = computeTaps(source.height, rect.y, rect.height, outHeight);

  // Horizontal pass over the source rows the vertical taps read, in premultiplied floats.
  const int firstRow = vertical.lowest;
  const int rowCount = vertical.highest - vertical.lowest + 1;
  const std::size_t outStride = static_cast<std::size_t>(outWidth) * 4;
  std::vector<float> rows(static_cast<std::size_t>(rowCount) * outStride);
  std::vector<float> premultiplied(static_cast<std::size_t>(source.width) * 4);
  for (int r = 0; r < rowCount; ++r) {
    const std::uint8_t* in = source.pixel(0, firstRow + r);
    for (int x = horizontal.lowest; x <= horizontal.highest; ++x) {
      const std::uint8_t* p = in + std::size_t(x) * 4;
      const float alpha = p[3] / 255.0f;
      float* q = premultiplied.data() + std::size_t(x) * 4;
      q[0] = p[0] * alpha;
      q[1] = p[1] * alpha;
      q[2] = p[2] * alpha;
      q[3] = p[3];
    }
    float* dst = rows.data() + std::size_t(r) * outStride;
    for (int x = 0; x < outWidth; ++x) {
      float acc[4] = {0, 0, 0, 0};
      for (std::size_t k = horizontal.begin[x]; k < horizontal.begin[x + 1]; ++k) {
        const float w = horizontal.weight[k];
        const float* q = premultiplied.data() + std::size_t(horizontal.index[k]) * 4;
        acc[0] += w * q[0];
        acc[1] += w * q[1];
        acc[2] += w * q[2];
        acc[3] += w * q[3];
      }
      std::copy(acc, acc + 4, dst + std::size_t(x) * 4);
    }
  }

  // Vertical pass, then back to straight alpha.
  std::vector<float> line(outStride);
  auto toByte = [](float v) {
    return static_cast<std::uint8_t>(std::clamp(std::lround(v), 0L, 255L));
  };
  for (int y = 0; y < outHeight; ++y) {
    std::fill(line.begin(), line.end(), 0.0f);
    for (std::size_t k = vertical.begin[y]; k < vertical.begin[y + 1]; ++k) {
      const float w = vertical.weight[k];
      const float* src = rows.data() + std::size_t(vertical.index[k] - firstRow) * outStride;
      for (std::size_t i = 0; i < outStride; ++i) line[i] += w * src[i];
    }
    std::uint8_t* dst = out.pixel(0, y);
    for (int x = 0; x < outWidth; ++x) {
      const float* p = line.data() + std::size_t(x) * 4;
      std::uint8_t* d = dst + std::size_t(x) * 4;
      const std::uint8_t alpha = toByte(p[3]);
      if (alpha == 0) continue;  // stays transparent black
      const float unpremultiply = 255.0f / p[3];
      d[0] = toByte(p[0] * unpremultiply);
      d[1] = toByte(p[1] * unpremultiply);
      d[2] = toByte(p[2] * unpremultiply);
      d[3] = alpha;
    }
  }
  return out;
}

Image scaleToSquare(const Image& source, int size) {
  const int side = std::min(source.width, source.height);
  const SourceRect rect{(source.width - side) / 2.0, (source.height - side) / 2.0, double(side),
                        double(side)};
  return resample(source, rect, size, size);
}

}  // namespace appsync::icon
