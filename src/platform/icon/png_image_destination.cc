// The PNG encoder of the icon service.
#include "platform/icon/png_image_destination.h"

#include <utility>

#include "platform/icon/png_codec.h"

namespace appsync::icon {

PngImageDestination::PngImageDestination(std::size_t capacity, std::function<bool()> injectFailure)
    : capacity_(capacity), injectFailure_(std::move(injectFailure)) {}

void PngImageDestination::addImage(const QIImage& image) {
  if (finalized_) return;
  ++added_;
  // Only the first image can be written; the count alone decides about the others.
  if (images_.empty()) images_.push_back(image.image());
}

bool PngImageDestination::finalize() {
  if (finalized_) return false;
  finalized_ = true;
  if (injectFailure_ && injectFailure_()) return false;
  if (added_ != 1 || added_ > capacity_) return false;
  std::optional<std::vector<std::uint8_t>> encoded = encodePng(images_.front());
  images_.clear();
  if (!encoded) return false;
  data_ = std::move(*encoded);
  return true;
}

}  // namespace appsync::icon
