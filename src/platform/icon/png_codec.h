// PNG reading and writing for the icon renderer. The reader takes hostile bytes: every PNG kind
// is normalised to RGBA8, and anything malformed, corrupted, truncated or too large is refused
// with a message that says what is wrong.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/icon/image.h"

namespace appsync::icon {

// Bounds on what the reader accepts. They are checked on the header, before any pixel memory
// is allocated.
inline constexpr std::uint32_t kMaxPngSide = 8192;
inline constexpr std::uint64_t kMaxPngPixels = 32u * 1024u * 1024u;

// What the header says, read without decoding the pixels.
struct PngHeader {
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  int bitDepth = 0;
  int colorType = 0;
  bool interlaced = false;
};

// Reads the signature and the IHDR chunk only. Absent (and *why filled) when the bytes do not
// start like a PNG or the header is invalid or over the limits.
std::optional<PngHeader> readPngHeader(std::span<const std::uint8_t> bytes,
                                       std::string* why = nullptr);

// Decodes a whole PNG: palette (with or without transparency), gray, gray+alpha, RGB, RGBA, at
// any bit depth, interlaced or not, to straight-alpha RGBA8. Sixteen-bit samples are rounded to
// eight. Gamma and colour-profile chunks are ignored. Absent (and *why filled) for anything that
// is not a complete, intact PNG within the limits: bad signature, bad CRC on any chunk, a bad
// compressed stream, missing or surplus image data, truncation, oversized dimensions.
std::optional<Image> decodePng(std::span<const std::uint8_t> bytes, std::string* why = nullptr);

// Encodes an RGBA8 image as a non-interlaced 8-bit RGBA PNG. Absent (and *why filled) when the
// image is empty or its buffer does not match its size.
std::optional<std::vector<std::uint8_t>> encodePng(const Image& image, std::string* why = nullptr);

}  // namespace appsync::icon
