// The simulated device's saved state: every service into a directory, one property list each,
// and back.
#include "platform/fake/fake_platform.h"

#include <functional>
#include <stdexcept>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "platform/fake/state_fields.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

// The key under which a service file carries the service's FakeService scripts.
constexpr std::string_view kScriptedFailures = "scriptedFailures";

std::string describeFailure(const ErrorRef& error) {
  return error ? error->describe() : std::string("unknown error");
}

plist::Dict withScripts(plist::Dict state, const FakeService& service) {
  state.set(std::string(kScriptedFailures), service.saveScripts());
  return state;
}

// Writes `state` as XML, unless the file already holds exactly those bytes.
void writeStateFile(const fs::path& file, const plist::Dict& state) {
  std::string problem;
  const std::optional<plist::Bytes> bytes =
      plist::write(plist::Value(state), plist::Format::Xml, &problem);
  if (!bytes) throw std::runtime_error(file.string() + ": cannot be written: " + problem);
  if (fileExists(file.string()) && readFile(file.string()) == bytes) return;
  ErrorRef error;
  if (!writeFileAtomically(file.string(), *bytes, &error)) {
    throw std::runtime_error(file.string() + ": cannot be written: " + describeFailure(error));
  }
}

// The root dictionary of `file`; absent when there is no such file.
std::optional<plist::Dict> readStateFile(const fs::path& file) {
  if (!fileExists(file.string())) return std::nullopt;
  ErrorRef error;
  const std::optional<plist::Bytes> bytes = readFile(file.string(), &error);
  if (!bytes) {
    throw std::runtime_error(file.string() + ": cannot be read: " + describeFailure(error));
  }
  plist::ParseError parseError;
  std::optional<plist::Value> root = plist::parse(*bytes, &parseError);
  if (!root) {
    throw StateFormatError(file.string() + ": not a property list: " + parseError.message);
  }
  if (!root->dict()) throw StateFormatError(file.string() + ": expected a dictionary at the root");
  return std::move(*root->dict());
}

// Loads one file into `load`, and its scripted failures into `scripts` when given. A missing
// file loads nothing: the service stays as the platform was made, empty. A format error is
// prefixed with the file.
void loadStateFile(const fs::path& file, FakeService* scripts,
                   const std::function<void(const StateFields&)>& load) {
  std::optional<plist::Dict> saved = readStateFile(file);
  if (!saved) return;
  plist::Dict& state = *saved;
  try {
    plist::Dict failures;
    if (scripts) {
      failures = StateFields(state).dictionary(kScriptedFailures);
      state.erase(kScriptedFailures);
    }
    if (load) load(StateFields(state));
    if (scripts) scripts->loadScripts(StateFields(failures, std::string(kScriptedFailures)));
  } catch (const StateFormatError& e) {
    throw StateFormatError(file.string() + ": " + e.what());
  }
}

}  // namespace

void FakePlatform::saveState(const fs::path& directory) const {
  ErrorRef error;
  if (!createDirectories(directory.string(), &error)) {
    throw std::runtime_error(directory.string() + ": cannot be created: " + describeFailure(error));
  }
  writeStateFile(directory / "device.plist",
                 {{"coordination", options_.coordination},
                  {"mainBundleIdentifier", options_.mainBundleIdentifier}});
  if (manualClock_) {
    const std::int64_t nanoseconds = manualClock_->now().time_since_epoch().count();
    writeStateFile(directory / "clock.plist",
                   {{"nanoseconds", plist::Integer::fromSigned(nanoseconds)}});
  }
  writeStateFile(directory / "registry.plist", withScripts(ar_.saveState(), ar_));
  writeStateFile(directory / "coordination.plist", withScripts(kc_.saveState(), kc_));
  writeStateFile(directory / "installer.plist", withScripts(em_.saveState(), em_));
  writeStateFile(directory / "backup.plist", withScripts(sw_.saveState(), sw_));
  writeStateFile(directory / "restrictions.plist", rs_.saveState());
  writeStateFile(directory / "store.plist", withScripts(plist::Dict(), bz_));
  writeStateFile(directory / "homescreen.plist", withScripts(pv_.saveState(), pv_));
  writeStateFile(directory / "notifications.plist", withScripts(system_.saveState(), system_));
  const FakeTRDeviceService& host = tr_.deviceService();
  writeStateFile(directory / "host.plist", withScripts(host.saveState(), host));
  writeStateFile(directory / "transactions.plist", transactionLog_.saveState());
}

void FakePlatform::loadState(const fs::path& directory) {
  if (manualClock_) {
    loadStateFile(directory / "clock.plist", nullptr, [this](const StateFields& clock) {
      if (!clock.has("nanoseconds")) return;
      const Duration saved(clock.integer("nanoseconds"));
      const Duration now = manualClock_->now().time_since_epoch();
      if (saved < now) clock.fail("nanoseconds", "earlier than the clock's time");
      manualClock_->advance(saved - now);
    });
  }
  // The registry first: coordination refers to its applications.
  loadStateFile(directory / "registry.plist", &ar_,
                [this](const StateFields& state) { ar_.loadState(state); });
  loadStateFile(directory / "coordination.plist", &kc_,
                [this](const StateFields& state) { kc_.loadState(state); });
  loadStateFile(directory / "installer.plist", &em_,
                [this](const StateFields& state) { em_.loadState(state); });
  loadStateFile(directory / "backup.plist", &sw_,
                [this](const StateFields& state) { sw_.loadState(state); });
  loadStateFile(directory / "restrictions.plist", nullptr,
                [this](const StateFields& state) { rs_.loadState(state); });
  // The store has no state of its own, only its scripts.
  loadStateFile(directory / "store.plist", &bz_, nullptr);
  loadStateFile(directory / "homescreen.plist", &pv_,
                [this](const StateFields& state) { pv_.loadState(state); });
  loadStateFile(directory / "notifications.plist", &system_,
                [this](const StateFields& state) { system_.loadState(state); });
  FakeTRDeviceService& host = tr_.deviceService();
  loadStateFile(directory / "host.plist", &host,
                [&host](const StateFields& state) { host.loadState(state); });
  loadStateFile(directory / "transactions.plist", nullptr,
                [this](const StateFields& state) { transactionLog_.loadState(state); });
}

FakePlatform::Options FakePlatform::loadOptions(const fs::path& directory) {
  const fs::path file = directory / "device.plist";
  if (!fileExists(file.string())) {
    throw std::runtime_error(file.string() + ": cannot be read: no such file");
  }
  Options options;
  loadStateFile(file, nullptr, [&options](const StateFields& device) {
    options.coordination = device.boolean("coordination", options.coordination);
    options.mainBundleIdentifier =
        device.optionalString("mainBundleIdentifier").value_or(options.mainBundleIdentifier);
  });
  return options;
}

}  // namespace appsync
