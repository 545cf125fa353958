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
  // Uninstalling an application puts it on the installer's list of uninstalled applications.
  ar_.setUninstallHook([this](const std::string& identifier) { em_.addUninstalled(identifier); });
  kc_.setCoordinationEnabled(options.coordination);
  system_.setMainBundleIdentifier(options.mainBundleIdentifier);
}

}  // namespace appsync
