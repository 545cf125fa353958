// Rendering an installed bundle's home-screen icon to a PNG file, through the icon service.
#include "client/apps_client.h"
#include "runtime/fs/files.h"

namespace appsync {

bool AppsClient::_makeIconFromBundlePath(const Platform& platform,
                                         const std::optional<std::string>& bundlePath,
                                         const std::string& saveTo) {
  const LogCategory& log = platform.tr.TRGetLogCategory(kAppSyncLogCategory);
  auto fail = [&log](std::string_view message) {
    pluginLog(log, LogLevel::Error, message);
    return false;
  };

  if (!bundlePath) return fail("%s|missing bundlePath");
  // A file location needs a path; an empty one names nothing.
  if (bundlePath->empty()) return fail("%s|couldn't create URL");
  std::shared_ptr<QIBundle> bundle = platform.qi.openBundle(*bundlePath);
  if (!bundle) return fail("%s|couldn't create bundle from URL");
  std::shared_ptr<QIImage> image =
      platform.qi.QICreateDeviceAppropriateHomeScreenIconImageFromBundle(*bundle);
  if (!image) return fail("%s|couldn't create PV icon from bundle");
  std::unique_ptr<QIImageDestination> png =
      platform.qi.createImageDestination(kPNGTypeIdentifier, 1);
  if (!png) return fail("%s|couldn't create image");
  png->addImage(*image);
  if (!png->finalize()) return fail("%s|Couldn't finalize image");

  // Atomic: a failed write leaves whatever file was at the destination as it was.
  if (!writeFileAtomically(saveTo, png->data())) {
    pluginLog(log, LogLevel::Error, "%s|Couldn't save image file to %{public}@", saveTo);
    return false;
  }
  return true;
}

}  // namespace appsync
