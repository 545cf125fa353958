// Test fixtures for the icon renderer: PNG files assembled chunk by chunk (of every kind, and
// damaged ones), and application bundles on disk.
#pragma once

#include <gtest/gtest.h>
#include <png.h>
#include <zlib.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/icon/image.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"

namespace appsync::testing {

using Bytes = std::vector<std::uint8_t>;

// Chunk-level assembly.
inline void appendBigEndian32(Bytes& out, std::uint32_t v) {
  for (int shift = 24; shift >= 0; shift -= 8) out.push_back(static_cast<std::uint8_t>(v >> shift));
}

inline Bytes chunk(const std::string& type, const Bytes& data) {
  Bytes out;
  appendBigEndian32(out, static_cast<std::uint32_t>(data.size()));
  out.insert(out.end(), type.begin(), type.end());
  out.insert(out.end(), data.begin(), data.end());
  uLong crc = crc32(0, nullptr, 0);
  crc = crc32(crc, out.data() + 4, static_cast<uInt>(out.size() - 4));
  appendBigEndian32(out, static_cast<std::uint32_t>(crc));
  return out;
}

inline Bytes ihdr(std::uint32_t width, std::uint32_t height, int depth, int colorType,
                  bool interlaced = false) {
  Bytes data;
  appendBigEndian32(data, width);
  appendBigEndian32(data, height);
  data.insert(data.end(), {static_cast<std::uint8_t>(depth), static_cast<std::uint8_t>(colorType),
                           0, 0, static_cast<std::uint8_t>(interlaced)});
  return chunk("IHDR", data);
}

inline Bytes zlibCompress(const Bytes& raw) {
  uLongf size = compressBound(static_cast<uLong>(raw.size()));
  Bytes out(size);
  compress(out.data(), &size, raw.data(), static_cast<uLong>(raw.size()));
  out.resize(size);
  return out;
}

inline Bytes pngFromChunks(const std::vector<Bytes>& chunks) {
  Bytes out = {137, 80, 78, 71, 13, 10, 26, 10};
  for (const Bytes& c : chunks) out.insert(out.end(), c.begin(), c.end());
  return out;
}

// Offset of the first chunk of `type`, or 0 when there is none.
inline std::size_t findChunk(const Bytes& png, const std::string& type) {
  std::size_t offset = 8;
  while (offset + 12 <= png.size()) {
    const std::uint32_t length = (std::uint32_t{png[offset]} << 24) |
                                 (std::uint32_t{png[offset + 1]} << 16) |
                                 (std::uint32_t{png[offset + 2]} << 8) | png[offset + 3];
    if (std::memcmp(png.data() + offset + 4, type.data(), 4) == 0) return offset;
    offset += 12 + length;
  }
  return 0;
}

// An opaque image of one colour.
inline icon::Image solidImage(int width, int height, std::uint8_t r, std::uint8_t g,
                              std::uint8_t b) {
  icon::Image image(width, height);
  for (std::size_t i = 0; i < image.rgba.size(); i += 4) {
    const std::uint8_t pixel[] = {r, g, b, 255};
    std::copy_n(pixel, 4, &image.rgba[i]);
  }
  return image;
}

inline Bytes solidPng(int width, int height) {
  return *icon::encodePng(solidImage(width, height, 200, 40, 90));
}

inline void writeBytes(const std::filesystem::path& path, const Bytes& bytes) {
  ASSERT_TRUE(writeFileAtomically(path.string(), bytes)) << path;
}

// Writes `dict` (the inside of a <dict> element) as the bundle's Info.plist, in XML.
inline void writeInfoPlist(const std::filesystem::path& bundle, const std::string& dict) {
  const std::string text = "<plist version=\"1.0\"><dict>" + dict + "</dict></plist>";
  writeBytes(bundle / "Info.plist", Bytes(text.begin(), text.end()));
}

}  // namespace appsync::testing
