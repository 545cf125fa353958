// Wiring of the simulated device's services.
#include "platform/fake/fake_platform.h"

namespace appsync {

namespace {

std::unique_ptr<Clock> makeClock(bool manual) {
  if (manual) return std::make_unique<ManualClock>();
  return std::make_unique<SystemClock>();
}

}  // namespace

FakePlatform::FakePlatform(std::filesystem::path root) : FakePlatform(std::move(root), Options{}) {}

FakePlatform::FakePlatform(std::filesystem::path root, Options options)
    : options_(options),
      paths_(root),
      ownedClock_(makeClock(options.manualClock)),
      clock_(ownedClock_.get()),
      manualClock_(options.manualClock ? static_cast<ManualClock*>(ownedClock_.get()) : nullptr),
      ar_(root),
      kc_(ar_),
      system_(root, *clock_),
      platform_{tr_, ar_, kc_, em_, sw_, rs_, bz_, pv_, qi_, transactionLog_, system_, paths_} {
  // The installer lists the applications that left the device: an installed application's
  // removal counts, whoever asked for it (the host's removals on either road included). A
  // placeholder's does not: placeholders are what the client and the coordination service clean
  // up (clearing sync data, a failed restore install, a cancelled install), and none of them is
  // an application the host saw on the device. The user's own removal is listed by the user
  // action itself, placeholder or not (see the simulator's remove-app).
  ar_.setUninstallHook([this](const FakeARWorkspace::AppRecord& removed) {
    if (!removed.isPlaceholder) em_.addUninstalled(removed.identifier);
  });
  kc_.setCoordinationEnabled(options.coordination);
  system_.setMainBundleIdentifier(options.mainBundleIdentifier);
}

}  // namespace appsync
