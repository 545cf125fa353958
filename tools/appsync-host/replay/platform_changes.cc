// `platform: KIND`: a change of the device's platform between the client's calls: scripted
// failures of a service's operation (and their end), the home screen refusing termination
// assertions, restrictions, the user installing or removing an app on the device, an install the
// registry runs, the data the backup holds for an app, a placeholder install the coordination
// service keeps back, and the operations the host's device service offers.
#include <cstdint>
#include <string>
#include <vector>

#include "bundle_maker.h"
#include "platform/ar.h"
#include "platform/pv.h"
#include "platform/rs.h"
#include "platform/tr.h"
#include "replay/action_table.h"
#include "replay/actions.h"
#include "replay/install_progress_names.h"
#include "replay/scratch_directory.h"
#include "runtime/plist/codec.h"

namespace appsync::host::replay {

namespace {

// The service a script names, as the fakes can script failures of it.
FakeService& serviceNamed(StepContext& s) {
  const YamlField field = s.step["service"];
  const std::string name = field.string();
  FakePlatform& device = s.session.device();
  if (name == "registry") return device.ar();
  if (name == "coordination") return device.kc();
  if (name == "installer") return device.em();
  if (name == "backup") return device.sw();
  if (name == "store") return device.bz();
  if (name == "homescreen") return device.pv();
  if (name == "system") return device.system();
  if (name == "host-device") return device.tr().deviceService();
  field.fail("unknown service \"" + name +
             "\" (expected one of: registry, coordination, installer, backup, store, homescreen, "
             "system, host-device)");
}

// The operation named in the step, one that `service` can fail.
std::string operationOf(StepContext& s, const FakeService& service) {
  const YamlField field = s.step["operation"];
  const std::string operation = field.string();
  if (!service.knowsOperation(operation)) {
    field.fail("the " + s.step["service"].string() + " service has no operation \"" + operation +
               "\" that can fail (expected one of: " + joinNames(service.operationNames()) + ")");
  }
  return operation;
}

ActionResult scriptFailure(StepContext& s) {
  FakeService& service = serviceNamed(s);
  const std::string operation = operationOf(s, service);
  int times = FakeService::kEveryCall;
  if (auto field = s.step.optional("times")) {
    const std::uint64_t value = field->unsignedInteger();
    if (value == 0 || value > 1000000) field->fail("expected a number of calls from 1 to 1000000");
    times = static_cast<int>(value);
  }
  auto errorField = s.step.optional("error");
  service.failOperation(operation, errorField ? readError(*errorField) : nullptr, times);
  return std::nullopt;
}

ActionResult scriptSuccess(StepContext& s) {
  FakeService& service = serviceNamed(s);
  service.succeedOperation(operationOf(s, service));
  return std::nullopt;
}

// The next `times` termination assertions the home screen is asked for `app` get `outcome`
// (denied, not-found, granted, or a number).
ActionResult denyAssertions(StepContext& s) {
  const std::string app = s.step["app"].string();
  std::uint64_t times = 1;
  if (auto field = s.step.optional("times")) {
    times = field->unsignedInteger();
    if (times == 0 || times > 10000) field->fail("expected a number of requests from 1 to 10000");
  }
  std::int32_t outcome = kPVSAssertionDenied;
  if (auto field = s.step.optional("outcome")) {
    const std::string text = field->string();
    if (text == "denied") {
      outcome = kPVSAssertionDenied;
    } else if (text == "not-found") {
      outcome = kPVSAssertionApplicationNotFound;
    } else if (text == "granted") {
      outcome = kPVSAssertionGranted;
    } else {
      outcome = readInt32(*field);
    }
  }
  s.session.device().pv().scriptAssertionOutcomes(app, std::vector<std::int32_t>(times, outcome));
  return std::nullopt;
}

// A restriction setting: true (explicitly allowed), false (explicitly restricted) or none.
ActionResult setRestriction(StepContext& s) {
  const YamlField settingField = s.step["setting"];
  const std::string setting = settingField.string();
  if (setting != RSFeatureAppInstallationAllowed && setting != RSFeatureAppRemovalAllowed) {
    settingField.fail("unknown setting \"" + setting +
                      "\" (expected one of: " + std::string(RSFeatureAppInstallationAllowed) +
                      ", " + std::string(RSFeatureAppRemovalAllowed) + ")");
  }
  const YamlField valueField = s.step["value"];
  int value = RSRestrictedBoolNoData;
  const std::string text = valueField.string();
  if (text == "true" || text == "false") {
    value = text == "true" ? RSRestrictedBoolExplicitYes : RSRestrictedBoolExplicitNo;
  } else if (text != "none") {
    valueField.fail("expected true, false or none, found \"" + text + "\"");
  }
  s.session.device().rs().setValue(setting, value);
  return std::nullopt;
}

// The user installs an app on the device: a bundle made from the fields goes through the
// registry's own package install, which records it, copies it into its container and tells the
// registry's observers.
ActionResult installApp(StepContext& s) {
  BundleFacts facts;
  facts.identifier = s.step["identifier"].string();
  facts.name = s.step["name"].string();
  auto version = s.step.optional("version");
  facts.version = version ? version->string() : "1.0";
  plist::Dict options{{std::string(ARPackageTypeKey), std::string(ARPackageTypeCustomer)},
                      {"BNBundleIdentifier", facts.identifier}};
  if (auto metadata = s.step.optional("storeMetadata")) {
    options.set(std::string(ARCaravelMetadataKey), readDataOrPlist(*metadata));
  }
  ScratchDirectory scratch(s.session.root());
  const auto bundle = makeBundle(s.session.root(), scratch.path(), facts);
  ErrorRef error;
  if (!s.session.device().ar().installApplication(bundle.string(), options, &error)) {
    throw StepFailed("the registry did not install " + facts.identifier + ": " +
                     (error ? error->describe() : std::string("no reason given")));
  }
  return std::nullopt;
}

// The user removes an app: the registry uninstalls it and the installer lists it as
// uninstalled, as the device does.
ActionResult removeApp(StepContext& s) {
  const std::string app = s.step["app"].string();
  FakePlatform& device = s.session.device();
  if (!device.ar().uninstallApplication(app, std::nullopt)) {
    throw StepFailed("the registry did not remove " + app);
  }
  device.em().addUninstalled(app);
  return std::nullopt;
}

// The registry runs an install of an app it holds: the app's current install progress gets the
// phase and the state named, so the registry reports it among its prioritized or paused installs.
ActionResult installProgress(StepContext& s) {
  const std::string app = s.step["app"].string();
  const std::uint64_t state = installCodeOf(s.step["state"], installStateNames());
  const std::uint64_t phase = installCodeOf(s.step["phase"], installPhaseNames());
  std::shared_ptr<ARInstallProgress> progress = s.session.device().ar().installProgress(app, phase);
  if (!progress) throw StepFailed("the registry holds no application " + app);
  progress->setInstallState(state);
  return std::nullopt;
}

// The data the backup holds for an app: a size in bytes, or none.
ActionResult backupData(StepContext& s) {
  const std::string app = s.step["app"].string();
  const YamlField size = s.step["size"];
  if (size.string() == "none") {
    s.session.device().sw().removeRestoreData(app);
  } else {
    s.session.device().sw().setRestoreData(app, size.unsignedInteger());
  }
  return std::nullopt;
}

// The coordination service keeps an app's placeholder uninstalled until released.
ActionResult holdPlaceholder(StepContext& s) {
  s.session.device().kc().holdPlaceholderInstall(s.step["app"].string());
  return std::nullopt;
}

ActionResult releasePlaceholder(StepContext& s) {
  const std::string app = s.step["app"].string();
  if (!s.session.device().kc().releasePlaceholderInstall(app)) {
    throw StepFailed("the placeholder install of " + app + " is not held");
  }
  return std::nullopt;
}

// Whether the host's device service offers an operation, as an older host may not.
ActionResult hostOffers(StepContext& s) {
  const YamlField field = s.step["operation"];
  const std::string operation = field.string();
  TRDeviceService::Operation which = TRDeviceService::Operation::prioritizeAsset;
  if (operation == "cancelAssetTransferForFailedAsset:") {
    which = TRDeviceService::Operation::cancelAssetTransferForFailedAsset;
  } else if (operation != "prioritizeAsset:withCompletion:") {
    field.fail("unknown operation \"" + operation +
               "\" (expected one of: prioritizeAsset:withCompletion:, "
               "cancelAssetTransferForFailedAsset:)");
  }
  s.session.device().tr().deviceService().setRespondsTo(which, s.step["offered"].boolean());
  return std::nullopt;
}

const std::vector<ActionEntry>& platformTable() {
  static const std::vector<ActionEntry> table = {
      {"fail", {"service", "operation", "times", "error"}, scriptFailure},
      {"succeed", {"service", "operation"}, scriptSuccess},
      {"deny-assertions", {"app", "times", "outcome"}, denyAssertions},
      {"restrict", {"setting", "value"}, setRestriction},
      {"install-app", {"identifier", "name", "version", "storeMetadata"}, installApp},
      {"remove-app", {"app"}, removeApp},
      {"backup-data", {"app", "size"}, backupData},
      {"install-progress", {"app", "state", "phase"}, installProgress},
      {"hold-placeholder", {"app"}, holdPlaceholder},
      {"release-placeholder", {"app"}, releasePlaceholder},
      {"host-offers", {"operation", "offered"}, hostOffers},
  };
  return table;
}

}  // namespace

ActionResult runPlatformChange(StepContext& context) {
  return runFromTable(context, platformTable());
}

}  // namespace appsync::host::replay
