// Finding a bundle's home-screen icon: the file names its Info.plist lists, the scale and device
// variants of each name present in the bundle, and the one whose size suits the target best.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "runtime/plist/value.h"
#include "platform/icon/image.h"

namespace appsync::icon {

enum class DeviceIdiom { Phone, Tablet };

// Bound on the size of one icon file read from a bundle.
inline constexpr std::size_t kMaxIconFileBytes = 64u * 1024u * 1024u;

// The icon names of an Info.plist, in tiers of preference for the device. The phone tier pools
// BNBundleIcons -> BNBundlePrimaryIcon -> BNBundleIconFiles, the top-level BNBundleIconFiles
// and BNBundleIconFile; the tablet tier is BNBundleIcons~tablet -> BNBundlePrimaryIcon ->
// BNBundleIconFiles. A phone looks at its tier first and at the tablet tier only when its own
// gives no usable image; a tablet the other way round. Names appear once, in the order listed;
// tiers without names are left out. Values of the wrong type are ignored.
std::vector<std::vector<std::string>> iconNameTiers(const plist::Dict& info, DeviceIdiom idiom);

// The files in `bundleDir` that may hold the icon `name`: NAME.png, NAME@2x.png, NAME@3x.png,
// NAME~tablet.png, NAME@2x~tablet.png and NAME@3x~tablet.png that exist as regular files inside
// the bundle (symbolic links leading out of it do not count), in that order. A trailing ".png"
// on the name is dropped first. Names that could reach outside the bundle (a "/", ".", "..",
// empty) have no files.
std::vector<std::string> iconFileCandidates(const std::string& bundleDir, const std::string& name);

struct BundleIcon {
  std::string path;  // the file chosen
  Image image;       // decoded, at its own size
};

// The bundle's icon image for a target of `targetSize` pixels: among the candidates of the
// first tier that has a decodable one, the smallest whose shorter side is at least targetSize,
// else the largest. Absent (and *why filled) when the bundle has no readable Info.plist, names
// no icons, or none of the named files exists and decodes.
std::optional<BundleIcon> findBundleIcon(const std::string& bundleDir, int targetSize,
                                         DeviceIdiom idiom, std::string* why = nullptr);

}  // namespace appsync::icon
