// PNG decoding of every kind, and refusal of damaged or hostile files.
#include "platform/icon/png_codec.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <functional>
#include <span>
#include <vector>

#include "platform/icon/png_fixtures.h"

namespace appsync::icon {
namespace {

using testing::Bytes;
using testing::chunk;
using testing::ihdr;
using testing::pngFromChunks;
using testing::zlibCompress;

struct KindCase {
  const char* name;
  int colorType;
  int bitDepth;
  bool interlaced;
  bool transparency;  // tRNS: palette alpha table, or one transparent gray/RGB colour
};

// A sample for pixel (x, y), channel c, spread over the depth's whole range.
unsigned sampleAt(int x, int y, int c, int depth) {
  const unsigned mixed = unsigned(x) * 7919u + unsigned(y) * 104729u + unsigned(c) * 1301u + 17u;
  return mixed % (1u << depth);
}

std::uint8_t toEight(unsigned sample, int depth) {
  const unsigned max = (1u << depth) - 1;
  return static_cast<std::uint8_t>((sample * 255u + max / 2) / max);
}

png_color paletteColor(unsigned i) {
  return {static_cast<png_byte>(i * 40 % 256), static_cast<png_byte>(i * 90 % 256 + 1),
          static_cast<png_byte>(i * 150 % 256)};
}

// The uncompressed image data: each row after filter byte 0, its samples packed most significant
// bit first (so 16-bit samples are big-endian) and its last byte padded with zero bits; in the
// seven passes of Adam7 when interlaced (a pass without pixels has no rows).
Bytes imageData(int width, int height, int depth, bool interlaced,
                const std::function<std::vector<unsigned>(int x, int y)>& samplesAt) {
  static const int kAdam7[7][4] = {{0, 8, 0, 8}, {4, 8, 0, 8}, {0, 4, 4, 8}, {2, 4, 0, 4},
                                   {0, 2, 2, 4}, {1, 2, 0, 2}, {0, 1, 1, 2}};
  static const int kWhole[1][4] = {{0, 1, 0, 1}};
  Bytes data;
  for (const auto& [x0, dx, y0, dy] :
       interlaced ? std::span<const int[4]>(kAdam7) : std::span<const int[4]>(kWhole)) {
    for (int y = y0; y < height && x0 < width; y += dy) {
      data.push_back(0);
      int bit = 0;
      for (int x = x0; x < width; x += dx) {
        for (unsigned s : samplesAt(x, y)) {
          for (int b = depth - 1; b >= 0; --b, ++bit) {
            if (bit % 8 == 0) data.push_back(0);
            if ((s >> b) & 1) data.back() |= static_cast<std::uint8_t>(0x80 >> (bit % 8));
          }
        }
      }
    }
  }
  return data;
}

// Builds the file, chunk by chunk, and the RGBA8 it must decode to.
std::pair<Bytes, Image> makeKind(const KindCase& k, int width, int height) {
  const bool palette = k.colorType == PNG_COLOR_TYPE_PALETTE;
  const bool gray = (k.colorType & PNG_COLOR_MASK_COLOR) == 0;
  const bool alpha = (k.colorType & PNG_COLOR_MASK_ALPHA) != 0;
  const int n = (palette || gray ? 1 : 3) + (alpha ? 1 : 0);
  const unsigned paletteSize = palette ? std::min(1u << k.bitDepth, 200u) : 0;
  const auto samplesAt = [&](int x, int y) {
    std::vector<unsigned> s;
    for (int c = 0; c < n; ++c) s.push_back(sampleAt(x, y, c, k.bitDepth));
    if (palette) s[0] %= paletteSize;
    return s;
  };
  std::vector<Bytes> chunks = {ihdr(width, height, k.bitDepth, k.colorType, k.interlaced)};
  Bytes plte, trns;
  for (unsigned i = 0; i < paletteSize; ++i) {
    const png_color c = paletteColor(i);
    plte.insert(plte.end(), {c.red, c.green, c.blue});
  }
  if (palette) chunks.push_back(chunk("PLTE", plte));
  // A palette's alpha table is shorter than the palette: the entries after it are opaque. Gray
  // and RGB have one transparent colour: that of pixel (1, 1).
  const std::vector<unsigned> key = samplesAt(1, 1);
  for (unsigned i = 0; k.transparency && i < (paletteSize + 1) / 2; ++i) trns.push_back(i * 60);
  for (int c = 0; k.transparency && !palette && c < n; ++c) {
    trns.insert(trns.end(), {static_cast<std::uint8_t>(key[c] >> 8), std::uint8_t(key[c])});
  }
  if (!trns.empty()) chunks.push_back(chunk("tRNS", trns));

  Image expected(width, height);
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      std::uint8_t* e = expected.pixel(x, y);
      const std::vector<unsigned> s = samplesAt(x, y);
      if (palette) {
        const png_color p = paletteColor(s[0]);
        e[0] = p.red, e[1] = p.green, e[2] = p.blue;
        e[3] = s[0] < trns.size() ? trns[s[0]] : 255;
        continue;
      }
      for (int c = 0; c < 3; ++c) e[c] = toEight(s[gray ? 0 : c], k.bitDepth);
      e[3] = alpha ? toEight(s[n - 1], k.bitDepth) : 255;
      if (k.transparency && s == key) e[3] = 0;
    }
  }
  chunks.push_back(
      chunk("IDAT", zlibCompress(imageData(width, height, k.bitDepth, k.interlaced, samplesAt))));
  chunks.push_back(chunk("IEND", {}));
  return {pngFromChunks(chunks), expected};
}

TEST(PngDecodeTest, EveryKindDecodesToItsColours) {
  const KindCase kinds[] = {
      {"gray 1-bit", PNG_COLOR_TYPE_GRAY, 1, false, false},
      {"gray 16-bit", PNG_COLOR_TYPE_GRAY, 16, false, false},
      {"gray 16-bit with transparent colour", PNG_COLOR_TYPE_GRAY, 16, false, true},
      {"gray+alpha 8-bit", PNG_COLOR_TYPE_GRAY_ALPHA, 8, false, false},
      {"RGB 8-bit with transparent colour", PNG_COLOR_TYPE_RGB, 8, false, true},
      {"RGBA 8-bit", PNG_COLOR_TYPE_RGB_ALPHA, 8, false, false},
      {"RGBA 16-bit", PNG_COLOR_TYPE_RGB_ALPHA, 16, false, false},
      {"palette 4-bit with alpha", PNG_COLOR_TYPE_PALETTE, 4, false, true},
      {"palette 8-bit with alpha", PNG_COLOR_TYPE_PALETTE, 8, false, true},
      {"interlaced RGBA 8-bit", PNG_COLOR_TYPE_RGB_ALPHA, 8, true, false},
      {"interlaced gray 16-bit", PNG_COLOR_TYPE_GRAY, 16, true, false},
      {"interlaced palette 2-bit with alpha", PNG_COLOR_TYPE_PALETTE, 2, true, true},
  };
  for (const KindCase& k : kinds) {
    SCOPED_TRACE(k.name);
    // Odd sizes leave partial Adam7 passes and partial bytes at low depths.
    const auto [file, expected] = makeKind(k, 13, 11);
    std::string why;
    const std::optional<Image> image = decodePng(file, &why);
    ASSERT_TRUE(image) << why;
    ASSERT_EQ(image->width, 13);
    ASSERT_EQ(image->height, 11);
    int transparent = 0;
    for (int y = 0; y < 11; ++y) {
      for (int x = 0; x < 13; ++x) {
        const std::uint8_t* got = image->pixel(x, y);
        const std::uint8_t* want = expected.pixel(x, y);
        transparent += want[3] == 0;
        // Colour does not matter where alpha is zero.
        const int checked = want[3] == 0 ? 3 : 0;
        for (int c = checked; c < 4; ++c) {
          // Sixteen-bit samples may round either way.
          ASSERT_LE(std::abs(int(got[c]) - int(want[c])), k.bitDepth == 16 ? 1 : 0)
              << "pixel " << x << "," << y << " channel " << c;
        }
      }
    }
    if (k.transparency) {
      EXPECT_GT(transparent, 0);
    }
  }
}

// Raw rows (filter byte 0, then RGBA8) for a width x rows image.
Bytes rawRows(int width, int rows) {
  Bytes raw;
  for (int y = 0; y < rows; ++y) {
    raw.push_back(0);
    for (int x = 0; x < width * 4; ++x) raw.push_back(static_cast<std::uint8_t>(x + y));
  }
  return raw;
}

Bytes withByte(Bytes bytes, std::size_t offset, std::uint8_t xorMask) {
  bytes.at(offset) ^= xorMask;
  return bytes;
}

TEST(PngDecodeTest, RefusesDamagedAndHostileFiles) {
  const Bytes good = *encodePng(testing::solidImage(16, 16, 10, 20, 30));
  const std::size_t idat = testing::findChunk(good, "IDAT");
  const std::size_t idatLength = (good[idat + 2] << 8) | good[idat + 3];
  ASSERT_GT(idat, 0u);
  const Bytes ihdr16 = ihdr(16, 16, 8, PNG_COLOR_TYPE_RGB_ALPHA);
  const Bytes iend = chunk("IEND", {});
  auto withIdat = [&](const Bytes& compressed) {
    return pngFromChunks({ihdr16, chunk("IDAT", compressed), iend});
  };
  // The same compressed stream with a byte in the middle of the deflate data changed.
  Bytes corruptStream = zlibCompress(rawRows(16, 16));
  corruptStream[corruptStream.size() / 2] ^= 0x5a;
  Bytes badTextChunk = chunk("tEXt", Bytes{'a', 0, 'b'});
  badTextChunk.back() ^= 1;

  struct Case {
    const char* name;
    Bytes file;
    const char* message;  // part of the reason
  };
  const Case cases[] = {
      {"empty", {}, "bad signature"},
      {"cut inside IHDR", Bytes(good.begin(), good.begin() + 20), "truncated"},
      {"cut inside IDAT", Bytes(good.begin(), good.begin() + idat + 20), "truncated"},
      {"IEND missing", Bytes(good.begin(), good.end() - 12), "truncated"},
      {"IDAT CRC", withByte(good, idat + 8 + idatLength, 0x80), "CRC"},
      {"ancillary chunk CRC",
       pngFromChunks({ihdr16, badTextChunk, chunk("IDAT", zlibCompress(rawRows(16, 16))), iend}),
       "CRC"},
      {"bad deflate data", withIdat(corruptStream), "PNG decode failed"},
      {"not enough image data", withIdat(zlibCompress(rawRows(16, 15))), "PNG decode failed"},
      {"too much image data", withIdat(zlibCompress(rawRows(16, 17))), "PNG decode failed"},
      {"unknown critical chunk",
       pngFromChunks(
           {ihdr16, chunk("QUUX", {1, 2}), chunk("IDAT", zlibCompress(rawRows(16, 16))), iend}),
       "PNG decode failed"},
      {"no image data", pngFromChunks({ihdr16, iend}), "no IDAT"},
      {"zero width", pngFromChunks({ihdr(0, 16, 8, 6), iend}), "invalid dimensions"},
      {"RGB at 4 bits", pngFromChunks({ihdr(16, 16, 4, 2), iend}), "unsupported IHDR"},
      {"100000 x 100000",
       pngFromChunks(
           {ihdr(100000, 100000, 8, 6), chunk("IDAT", zlibCompress(rawRows(16, 1))), iend}),
       "limit is 8192 x 8192"},
      {"8000 x 8000", pngFromChunks({ihdr(8000, 8000, 8, 6), iend}), "32 Mpixel"},
      {"4000 x 4000 with a few bytes of data",
       pngFromChunks({ihdr(4000, 4000, 8, 6), chunk("IDAT", zlibCompress(rawRows(16, 1))), iend}),
       "cannot hold"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::string why;
    EXPECT_FALSE(decodePng(c.file, &why));
    EXPECT_NE(why.find(c.message), std::string::npos) << why;
  }
}

}  // namespace
}  // namespace appsync::icon
