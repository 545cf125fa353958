// PNG reading and writing over libpng, from and to memory, with hostile input refused early.
#include "platform/icon/png_codec.h"

#include <png.h>
#include <zlib.h>

#include <csetjmp>
#include <cstdio>
#include <cstring>
#include <new>
#include <string_view>

namespace appsync::icon {
namespace {

constexpr std::uint8_t kSignature[8] = {137, 80, 78, 71, 13, 10, 26, 10};
// Chunk framing: length, type, (data), CRC.
constexpr std::size_t kChunkOverhead = 12;
// Deflate cannot expand one compressed byte into more than 1032 bytes; a little margin on top.
constexpr std::uint64_t kMaxInflateRatio = 1040;
constexpr std::uint64_t kInflateSlack = 1024;
// Bound on any one ancillary chunk. The decoder keeps only PLTE and tRNS (under 1 KB) and skips
// the rest, so this only refuses absurd files.
constexpr png_alloc_size_t kMaxChunkAllocation = 8u << 20;

bool fail(std::string* why, std::string message) {
  if (why) *why = std::move(message);
  return false;
}

std::uint32_t bigEndian32(const std::uint8_t* p) {
  return (std::uint32_t{p[0]} << 24) | (std::uint32_t{p[1]} << 16) | (std::uint32_t{p[2]} << 8) |
         std::uint32_t{p[3]};
}

std::string chunkName(const std::uint8_t* type) {
  std::string name;
  for (int i = 0; i < 4; ++i) {
    const std::uint8_t c = type[i];
    name += (c >= 0x20 && c < 0x7f) ? static_cast<char>(c) : '?';
  }
  return name;
}

bool isChunkTypeByte(std::uint8_t c) { return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z'); }

int channelsOf(int colorType) {
  switch (colorType) {
    case PNG_COLOR_TYPE_GRAY:
      return 1;
    case PNG_COLOR_TYPE_GRAY_ALPHA:
      return 2;
    case PNG_COLOR_TYPE_RGB:
      return 3;
    case PNG_COLOR_TYPE_RGB_ALPHA:
      return 4;
    case PNG_COLOR_TYPE_PALETTE:
      return 1;
    default:
      return 0;
  }
}

bool validDepthForType(int colorType, int depth) {
  switch (colorType) {
    case PNG_COLOR_TYPE_GRAY:
      return depth == 1 || depth == 2 || depth == 4 || depth == 8 || depth == 16;
    case PNG_COLOR_TYPE_PALETTE:
      return depth == 1 || depth == 2 || depth == 4 || depth == 8;
    case PNG_COLOR_TYPE_GRAY_ALPHA:
    case PNG_COLOR_TYPE_RGB:
    case PNG_COLOR_TYPE_RGB_ALPHA:
      return depth == 8 || depth == 16;
    default:
      return false;
  }
}

// Walks the chunk framing of the whole file before libpng sees it, so that a file cut short or
// one whose image data cannot possibly fill the declared dimensions is refused before the pixel
// buffer is allocated.
bool checkChunkFraming(std::span<const std::uint8_t> bytes, const PngHeader& header,
                       std::string* why) {
  std::size_t offset = sizeof(kSignature);
  std::uint64_t compressedBytes = 0;
  for (;;) {
    const std::size_t remaining = bytes.size() - offset;
    if (remaining < kChunkOverhead) {
      return fail(why, "truncated PNG: the file ends at offset " + std::to_string(bytes.size()) +
                           " without an IEND chunk");
    }
    const std::uint8_t* chunk = bytes.data() + offset;
    const std::uint32_t length = bigEndian32(chunk);
    const std::uint8_t* type = chunk + 4;
    for (int i = 0; i < 4; ++i) {
      if (!isChunkTypeByte(type[i])) {
        return fail(
            why, "invalid PNG: chunk at offset " + std::to_string(offset) + " has an invalid type");
      }
    }
    if (length > 0x7fffffffu) {
      return fail(why, "invalid PNG: chunk " + chunkName(type) + " at offset " +
                           std::to_string(offset) + " declares an invalid length");
    }
    if (length > remaining - kChunkOverhead) {
      return fail(why, "truncated PNG: chunk " + chunkName(type) + " at offset " +
                           std::to_string(offset) + " declares " + std::to_string(length) +
                           " bytes but only " + std::to_string(remaining - kChunkOverhead) +
                           " remain");
    }
    if (std::memcmp(type, "IDAT", 4) == 0) compressedBytes += length;
    offset += kChunkOverhead + length;
    if (std::memcmp(type, "IEND", 4) == 0) break;
  }
  if (compressedBytes == 0) return fail(why, "invalid PNG: no image data (no IDAT chunk)");
  const std::uint64_t bitsPerPixel =
      static_cast<std::uint64_t>(channelsOf(header.colorType)) * header.bitDepth;
  const std::uint64_t minimumRaw =
      static_cast<std::uint64_t>(header.width) * header.height * bitsPerPixel / 8;
  if (minimumRaw > compressedBytes * kMaxInflateRatio + kInflateSlack) {
    return fail(why, "truncated PNG: " + std::to_string(compressedBytes) +
                         " bytes of image data cannot hold " + std::to_string(header.width) +
                         " x " + std::to_string(header.height) + " pixels");
  }
  return true;
}

// libpng reports errors through these callbacks; the message is kept in plain storage because
// the error callback leaves by longjmp.
struct ReadContext {
  const std::uint8_t* data;
  std::size_t size;
  std::size_t position;
  char message[256];
};

void keepMessage(char (&storage)[256], const char* message) {
  std::snprintf(storage, sizeof storage, "%s", message ? message : "unknown error");
}

[[noreturn]] void onReadError(png_structp png, png_const_charp message) {
  keepMessage(static_cast<ReadContext*>(png_get_error_ptr(png))->message, message);
  png_longjmp(png, 1);
}

void onWarning(png_structp, png_const_charp) {}

void onRead(png_structp png, png_bytep out, std::size_t count) {
  auto* ctx = static_cast<ReadContext*>(png_get_io_ptr(png));
  if (count > ctx->size - ctx->position) png_error(png, "unexpected end of data (truncated)");
  std::memcpy(out, ctx->data + ctx->position, count);
  ctx->position += count;
}

struct DecodedLayout {
  std::uint32_t width;
  std::uint32_t height;
  std::size_t rowBytes;
  int channels;
  int bitDepth;
};

// The two functions below are entered by setjmp and left by longjmp on any libpng error, so
// they hold no objects with destructors and change no locals after the setjmp.
bool readInfoAndSetTransforms(png_structp png, png_infop info, DecodedLayout* layout) {
  if (setjmp(png_jmpbuf(png))) return false;
  png_set_user_limits(png, kMaxPngSide, kMaxPngSide);
  png_set_chunk_malloc_max(png, kMaxChunkAllocation);
  // A bad CRC on any chunk, and any "benign" inconsistency, is an error: a damaged file is
  // refused rather than shown half-right.
  png_set_crc_action(png, PNG_CRC_ERROR_QUIT, PNG_CRC_ERROR_QUIT);
  png_set_benign_errors(png, 0);
  png_set_option(png, PNG_IGNORE_ADLER32, PNG_OPTION_OFF);
  // Only IHDR, PLTE, tRNS, IDAT and IEND are interpreted; everything else is skipped (its CRC
  // is still checked).
  png_set_keep_unknown_chunks(png, PNG_HANDLE_CHUNK_NEVER, nullptr, -1);

  png_read_info(png, info);
  const int colorType = png_get_color_type(png, info);
  const int bitDepth = png_get_bit_depth(png, info);
  const bool hasTransparencyChunk = png_get_valid(png, info, PNG_INFO_tRNS) != 0;
  if (colorType == PNG_COLOR_TYPE_PALETTE) png_set_palette_to_rgb(png);
  if (colorType == PNG_COLOR_TYPE_GRAY && bitDepth < 8) png_set_expand_gray_1_2_4_to_8(png);
  if (hasTransparencyChunk) png_set_tRNS_to_alpha(png);
  if (bitDepth == 16) png_set_scale_16(png);
  if (colorType == PNG_COLOR_TYPE_GRAY || colorType == PNG_COLOR_TYPE_GRAY_ALPHA) {
    png_set_gray_to_rgb(png);
  }
  if ((colorType & PNG_COLOR_MASK_ALPHA) == 0 && !hasTransparencyChunk) {
    png_set_add_alpha(png, 0xff, PNG_FILLER_AFTER);
  }
  png_set_interlace_handling(png);
  png_read_update_info(png, info);

  layout->width = png_get_image_width(png, info);
  layout->height = png_get_image_height(png, info);
  layout->rowBytes = png_get_rowbytes(png, info);
  layout->channels = png_get_channels(png, info);
  layout->bitDepth = png_get_bit_depth(png, info);
  return true;
}

bool readPixelsAndEnd(png_structp png, png_infop info, png_bytepp rows) {
  if (setjmp(png_jmpbuf(png))) return false;
  png_read_image(png, rows);
  png_read_end(png, info);
  return true;
}

class ReadStructs {
 public:
  ReadStructs(ReadContext* ctx)
      : png_(png_create_read_struct(PNG_LIBPNG_VER_STRING, ctx, onReadError, onWarning)),
        info_(png_ ? png_create_info_struct(png_) : nullptr) {}
  ~ReadStructs() {
    if (png_) png_destroy_read_struct(&png_, info_ ? &info_ : nullptr, nullptr);
  }
  ReadStructs(const ReadStructs&) = delete;
  ReadStructs& operator=(const ReadStructs&) = delete;
  png_structp png() const { return png_; }
  png_infop info() const { return info_; }

 private:
  png_structp png_;
  png_infop info_;
};

struct WriteContext {
  std::vector<std::uint8_t>* out;
  char message[256];
};

[[noreturn]] void onWriteError(png_structp png, png_const_charp message) {
  keepMessage(static_cast<WriteContext*>(png_get_error_ptr(png))->message, message);
  png_longjmp(png, 1);
}

void onWrite(png_structp png, png_bytep data, std::size_t count) {
  auto* ctx = static_cast<WriteContext*>(png_get_io_ptr(png));
  bool appended = true;
  try {
    ctx->out->insert(ctx->out->end(), data, data + count);
  } catch (const std::bad_alloc&) {
    appended = false;
  }
  if (!appended) png_error(png, "out of memory");
}

void onFlush(png_structp) {}

// Entered by setjmp, left by longjmp on error: no objects with destructors here.
bool writeRgba(png_structp png, png_infop info, const Image* image, png_bytepp rows) {
  if (setjmp(png_jmpbuf(png))) return false;
  png_set_IHDR(png, info, static_cast<png_uint_32>(image->width),
               static_cast<png_uint_32>(image->height), 8, PNG_COLOR_TYPE_RGB_ALPHA,
               PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
  // Icons are small: a quicker deflate level halves the encoding time for files about a tenth
  // larger than the default level makes.
  png_set_compression_level(png, 3);
  png_write_info(png, info);
  png_write_image(png, rows);
  png_write_end(png, nullptr);
  return true;
}

class WriteStructs {
 public:
  WriteStructs(WriteContext* ctx)
      : png_(png_create_write_struct(PNG_LIBPNG_VER_STRING, ctx, onWriteError, onWarning)),
        info_(png_ ? png_create_info_struct(png_) : nullptr) {}
  ~WriteStructs() {
    if (png_) png_destroy_write_struct(&png_, info_ ? &info_ : nullptr);
  }
  WriteStructs(const WriteStructs&) = delete;
  WriteStructs& operator=(const WriteStructs&) = delete;
  png_structp png() const { return png_; }
  png_infop info() const { return info_; }

 private:
  png_structp png_;
  png_infop info_;
};

}  // namespace

std::optional<PngHeader> readPngHeader(std::span<const std::uint8_t> bytes, std::string* why) {
  if (bytes.size() < sizeof(kSignature) ||
      std::memcmp(bytes.data(), kSignature, sizeof(kSignature)) != 0) {
    fail(why, "not a PNG file (bad signature)");
    return std::nullopt;
  }
  constexpr std::size_t kHeaderEnd = sizeof(kSignature) + kChunkOverhead + 13;
  if (bytes.size() < kHeaderEnd) {
    fail(why, "truncated PNG: the file ends inside the IHDR chunk");
    return std::nullopt;
  }
  const std::uint8_t* chunk = bytes.data() + sizeof(kSignature);
  if (bigEndian32(chunk) != 13 || std::memcmp(chunk + 4, "IHDR", 4) != 0) {
    fail(why, "invalid PNG: the first chunk is not a 13-byte IHDR");
    return std::nullopt;
  }
  const std::uint8_t* data = chunk + 8;
  const auto crc = static_cast<std::uint32_t>(crc32(crc32(0, nullptr, 0), chunk + 4, 4 + 13));
  if (crc != bigEndian32(data + 13)) {
    fail(why, "corrupt PNG: IHDR CRC error");
    return std::nullopt;
  }
  PngHeader header;
  header.width = bigEndian32(data);
  header.height = bigEndian32(data + 4);
  header.bitDepth = data[8];
  header.colorType = data[9];
  header.interlaced = data[12] == 1;
  const std::string size = std::to_string(header.width) + " x " + std::to_string(header.height);
  if (header.width == 0 || header.height == 0 || header.width > 0x7fffffffu ||
      header.height > 0x7fffffffu) {
    fail(why, "invalid PNG: invalid dimensions " + size);
    return std::nullopt;
  }
  if (!validDepthForType(header.colorType, header.bitDepth) || data[10] != 0 || data[11] != 0 ||
      data[12] > 1) {
    fail(why, "invalid PNG: unsupported IHDR (color type " + std::to_string(header.colorType) +
                  ", bit depth " + std::to_string(header.bitDepth) + ", compression " +
                  std::to_string(data[10]) + ", filter " + std::to_string(data[11]) +
                  ", interlace " + std::to_string(data[12]) + ")");
    return std::nullopt;
  }
  if (header.width > kMaxPngSide || header.height > kMaxPngSide) {
    fail(why, "PNG too large: " + size + " pixels, the limit is " + std::to_string(kMaxPngSide) +
                  " x " + std::to_string(kMaxPngSide));
    return std::nullopt;
  }
  if (std::uint64_t{header.width} * header.height > kMaxPngPixels) {
    fail(why, "PNG too large: " + size + " pixels, the limit is " +
                  std::to_string(kMaxPngPixels / (1024 * 1024)) + " Mpixel");
    return std::nullopt;
  }
  return header;
}

std::optional<Image> decodePng(std::span<const std::uint8_t> bytes, std::string* why) {
  const std::optional<PngHeader> header = readPngHeader(bytes, why);
  if (!header || !checkChunkFraming(bytes, *header, why)) return std::nullopt;

  ReadContext ctx{bytes.data(), bytes.size(), 0, {}};
  ReadStructs structs(&ctx);
  if (!structs.png() || !structs.info()) {
    fail(why, "PNG decoder: out of memory");
    return std::nullopt;
  }
  png_set_read_fn(structs.png(), &ctx, onRead);

  DecodedLayout layout{};
  if (!readInfoAndSetTransforms(structs.png(), structs.info(), &layout)) {
    fail(why, std::string("PNG decode failed: ") + ctx.message);
    return std::nullopt;
  }
  if (layout.width != header->width || layout.height != header->height || layout.channels != 4 ||
      layout.bitDepth != 8 || layout.rowBytes != std::size_t{layout.width} * 4) {
    fail(why, "PNG decode failed: unexpected pixel layout after conversion");
    return std::nullopt;
  }
  try {
    Image image(static_cast<int>(layout.width), static_cast<int>(layout.height));
    std::vector<png_bytep> rows(layout.height);
    for (std::uint32_t y = 0; y < layout.height; ++y) rows[y] = image.pixel(0, static_cast<int>(y));
    if (!readPixelsAndEnd(structs.png(), structs.info(), rows.data())) {
      fail(why, std::string("PNG decode failed: ") + ctx.message);
      return std::nullopt;
    }
    return image;
  } catch (const std::bad_alloc&) {
    fail(why, "PNG decoder: out of memory for " + std::to_string(layout.width) + " x " +
                  std::to_string(layout.height) + " pixels");
    return std::nullopt;
  }
}

std::optional<std::vector<std::uint8_t>> encodePng(const Image& image, std::string* why) {
  if (image.empty() || image.rgba.size() != std::size_t(image.width) * image.height * 4) {
    fail(why, "PNG encode failed: the image is empty or its pixel buffer has the wrong size");
    return std::nullopt;
  }
  std::vector<std::uint8_t> out;
  WriteContext ctx{&out, {}};
  WriteStructs structs(&ctx);
  if (!structs.png() || !structs.info()) {
    fail(why, "PNG encoder: out of memory");
    return std::nullopt;
  }
  png_set_write_fn(structs.png(), &ctx, onWrite, onFlush);
  std::vector<png_bytep> rows(static_cast<std::size_t>(image.height));
  for (int y = 0; y < image.height; ++y) {
    // libpng takes non-const rows but does not write to them without transformations.
    rows[y] = const_cast<png_bytep>(image.pixel(0, y));
  }
  if (!writeRgba(structs.png(), structs.info(), &image, rows.data())) {
    fail(why, std::string("PNG encode failed: ") + ctx.message);
    return std::nullopt;
  }
  return out;
}

}  // namespace appsync::icon
