// The real icon-rendering service: the bundle's icon file, decoded, scaled to the device's icon
// size and cut to the home-screen outline; PNG encoding; and switches that make any of its
// steps fail, for the tests of its callers.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/icon/corner_mask.h"
#include "platform/icon/icon_lookup.h"
#include "platform/qi_icon_service.h"

namespace appsync {

// The service operations that can be made to fail.
enum class QIStep { OpenBundle, RenderIcon, CreateImageDestination, Finalize };

class HomeScreenIconService final : public QIIconService {
 public:
  static constexpr int kDefaultIconSize = 120;
  static constexpr int kMaxIconSize = 4096;

  // Renders icons of iconSize x iconSize pixels (clamped to 1...kMaxIconSize) for a phone or a
  // tablet, which decides the Info.plist keys looked at first.
  explicit HomeScreenIconService(int iconSize = kDefaultIconSize,
                                 icon::DeviceIdiom idiom = icon::DeviceIdiom::Phone);

  std::shared_ptr<QIBundle> openBundle(const std::string& path) override;
  std::shared_ptr<QIImage> QICreateDeviceAppropriateHomeScreenIconImageFromBundle(
      const QIBundle& bundle) override;
  std::unique_ptr<QIImageDestination> createImageDestination(std::string_view typeIdentifier,
                                                             std::size_t capacity) override;

  // The icon rendering with the reason of a failure in *why (may be null).
  std::shared_ptr<QIImage> renderIcon(const QIBundle& bundle, std::string* why);

  int iconSize() const { return size_; }
  icon::DeviceIdiom idiom() const { return idiom_; }

  // Fault injection, safe from any thread. failNext makes the next `times` calls of `step` fail
  // (on top of any already pending); setFailing makes every call fail until switched off. A
  // failed step returns what that step returns on a real failure. Finalize failures apply to
  // destinations already handed out, too.
  void failNext(QIStep step, int times = 1);
  void setFailing(QIStep step, bool failing);

 private:
  struct Faults {
    std::array<std::atomic<int>, 4> pending{};
    std::array<std::atomic<bool>, 4> always{};
    bool consume(QIStep step);
  };

  int size_;
  icon::DeviceIdiom idiom_;
  icon::ContinuousCornerMask mask_;
  // Shared with the destinations, which may outlive the service.
  std::shared_ptr<Faults> faults_;
};

// Renders the home-screen icon of the bundle at `bundleDir` as a size x size phone icon and
// returns the PNG file's bytes. Absent, with the reason in *why (may be null), when the size is
// outside 1...HomeScreenIconService::kMaxIconSize, there is no directory, the bundle has no
// usable icon, or encoding fails.
std::optional<std::vector<std::uint8_t>> renderIconPng(const std::string& bundleDir, int size,
                                                       std::string* why);

}  // namespace appsync
