// The in-memory picture the icon renderer works on: 8-bit RGBA, straight alpha, row-major.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace appsync::icon {

struct Image {
  int width = 0;
  int height = 0;
  // width * height * 4 bytes: R, G, B, A per pixel, rows top to bottom, alpha not premultiplied.
  std::vector<std::uint8_t> rgba;

  Image() = default;
  // A fully transparent image of the given size.
  Image(int w, int h) : width(w), height(h), rgba(static_cast<std::size_t>(w) * h * 4, 0) {}

  bool empty() const { return width <= 0 || height <= 0; }
  std::uint8_t* pixel(int x, int y) {
    return rgba.data() + (static_cast<std::size_t>(y) * width + x) * 4;
  }
  const std::uint8_t* pixel(int x, int y) const {
    return rgba.data() + (static_cast<std::size_t>(y) * width + x) * 4;
  }
};

}  // namespace appsync::icon
