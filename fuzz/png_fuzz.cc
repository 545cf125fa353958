// Fuzz target for the icon renderer's PNG reader: hostile bytes are decoded, and whatever
// decodes is scaled to the home-screen size and masked, as a bundle's icon would be.
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "platform/icon/corner_mask.h"
#include "platform/icon/png_codec.h"
#include "platform/icon/resample.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace appsync::icon;
  static const ContinuousCornerMask mask(120);
  std::string why;
  std::optional<Image> image = decodePng(std::span<const std::uint8_t>(data, size), &why);
  if (!image) {
    if (why.empty()) __builtin_trap();  // every refusal says why
    return 0;
  }
  if (image->rgba.size() != std::size_t(image->width) * image->height * 4) __builtin_trap();
  Image icon = scaleToSquare(*image, 120);
  mask.apply(icon);
  if (icon.pixel(0, 0)[3] != 0) __builtin_trap();
  return 0;
}
