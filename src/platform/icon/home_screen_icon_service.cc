// The real icon-rendering service and the command-line rendering built on it.
#include "platform/icon/home_screen_icon_service.h"

#include <algorithm>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/icon/png_image_destination.h"
#include "platform/icon/resample.h"

namespace appsync {

bool HomeScreenIconService::Faults::consume(QIStep step) {
  const auto i = static_cast<std::size_t>(step);
  if (always[i].load()) return true;
  int n = pending[i].load();
  while (n > 0) {
    if (pending[i].compare_exchange_weak(n, n - 1)) return true;
  }
  return false;
}

HomeScreenIconService::HomeScreenIconService(int iconSize, icon::DeviceIdiom idiom)
    : size_(std::clamp(iconSize, 1, kMaxIconSize)),
      idiom_(idiom),
      mask_(size_),
      faults_(std::make_shared<Faults>()) {}

void HomeScreenIconService::failNext(QIStep step, int times) {
  faults_->pending[static_cast<std::size_t>(step)].fetch_add(times);
}

void HomeScreenIconService::setFailing(QIStep step, bool failing) {
  faults_->always[static_cast<std::size_t>(step)].store(failing);
}

std::shared_ptr<QIBundle> HomeScreenIconService::openBundle(const std::string& path) {
  if (faults_->consume(QIStep::OpenBundle)) return nullptr;
  std::error_code ec;
  if (path.empty() || !std::filesystem::is_directory(path, ec)) return nullptr;
  return std::make_shared<QIBundle>(path);
}

std::shared_ptr<QIImage> HomeScreenIconService::renderIcon(const QIBundle& bundle,
                                                           std::string* why) {
  if (faults_->consume(QIStep::RenderIcon)) {
    if (why) *why = "icon rendering failed (injected)";
    return nullptr;
  }
  std::optional<icon::BundleIcon> found = icon::findBundleIcon(bundle.path(), size_, idiom_, why);
  if (!found) return nullptr;
  icon::Image icon = icon::scaleToSquare(found->image, size_);
  mask_.apply(icon);
  return std::make_shared<QIImage>(std::move(icon));
}

std::shared_ptr<QIImage>
HomeScreenIconService::QICreateDeviceAppropriateHomeScreenIconImageFromBundle(
    const QIBundle& bundle) {
  return renderIcon(bundle, nullptr);
}

std::unique_ptr<QIImageDestination> HomeScreenIconService::createImageDestination(
    std::string_view typeIdentifier, std::size_t capacity) {
  if (faults_->consume(QIStep::CreateImageDestination)) return nullptr;
  if (typeIdentifier != kPNGTypeIdentifier || capacity != 1) return nullptr;
  std::shared_ptr<Faults> faults = faults_;
  return std::make_unique<icon::PngImageDestination>(
      capacity, [faults] { return faults->consume(QIStep::Finalize); });
}

std::optional<std::vector<std::uint8_t>> renderIconPng(const std::string& bundleDir, int size,
                                                       std::string* why) {
  auto failWith = [why](std::string message) -> std::optional<std::vector<std::uint8_t>> {
    if (why) *why = std::move(message);
    return std::nullopt;
  };
  if (size < 1 || size > HomeScreenIconService::kMaxIconSize) {
    return failWith("icon size " + std::to_string(size) + " is outside 1..." +
                    std::to_string(HomeScreenIconService::kMaxIconSize));
  }
  HomeScreenIconService service(size);
  std::shared_ptr<QIBundle> bundle = service.openBundle(bundleDir);
  if (!bundle) return failWith("no bundle directory at " + bundleDir);
  std::shared_ptr<QIImage> image = service.renderIcon(*bundle, why);
  if (!image) return std::nullopt;
  std::unique_ptr<QIImageDestination> png = service.createImageDestination(kPNGTypeIdentifier, 1);
  if (!png) return failWith("no PNG encoder");
  png->addImage(*image);
  if (!png->finalize()) return failWith("the icon could not be encoded as PNG");
  return png->data();
}

}  // namespace appsync
