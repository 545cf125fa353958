// The PNG encoder of the icon service: one image into an in-memory PNG file.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <vector>

#include "platform/icon/image.h"
#include "platform/qi_icon_service.h"

namespace appsync::icon {

class PngImageDestination final : public QIImageDestination {
 public:
  // `capacity` is the number of images the caller announced; a PNG file holds one, so finalize
  // succeeds only when exactly one image was added and capacity allows it. `injectFailure`,
  // when set, is asked at finalize whether to fail as an encoder error would.
  explicit PngImageDestination(std::size_t capacity, std::function<bool()> injectFailure = nullptr);

  void addImage(const QIImage& image) override;
  bool finalize() override;
  const std::vector<std::uint8_t>& data() const override { return data_; }

 private:
  std::size_t capacity_;
  std::function<bool()> injectFailure_;
  std::vector<Image> images_;
  std::size_t added_ = 0;
  bool finalized_ = false;
  std::vector<std::uint8_t> data_;
};

}  // namespace appsync::icon
