// The fake install-coordination service's saved state: its coordinators with their promises and
// placeholders, as a property list, and the objects made again from it.
#include <algorithm>
#include <map>
#include <string>
#include <utility>

#include "platform/fake/fake_kc.h"
#include "platform/fake/fake_kc_daemon.h"
#include "platform/fake/state_null_marker.h"

namespace appsync {
namespace {

using Coordinator = FakeKCAppInstallCoordinator;

template <class E>
using Names = std::pair<E, std::string_view>;

constexpr Names<KCCoordinatorKind> kKindNames[] = {
    {KCCoordinatorKind::Any, "any"},
    {KCCoordinatorKind::Initiating, "initiating"},
    {KCCoordinatorKind::Updating, "updating"},
    {KCCoordinatorKind::Restoring, "restoring"},
    {KCCoordinatorKind::RestoringDemoted, "restoringDemoted"}};
constexpr Names<Coordinator::State> kStateNames[] = {{Coordinator::State::Active, "active"},
                                                     {Coordinator::State::Completed, "completed"},
                                                     {Coordinator::State::Cancelled, "cancelled"}};
constexpr std::string_view kTransferToPath = "transferToPath";
constexpr std::string_view kOutOfBandTransfer = "outOfBandTransfer";

template <class E, std::size_t N>
std::string_view nameOf(const Names<E> (&names)[N], E value) {
  for (const auto& [v, name] : names) {
    if (v == value) return name;
  }
  return names[0].second;
}

template <class E, std::size_t N>
E valueOf(const Names<E> (&names)[N], const StateFields& fields, std::string_view key) {
  const std::string name = fields.string(key);
  std::string expected;
  for (const auto& [v, known] : names) {
    if (known == name) return v;
    expected += (expected.empty() ? "" : ", ") + std::string(known);
  }
  fields.fail(key, "expected one of " + expected);
}

// --- Saving ------------------------------------------------------------------------------------

plist::Dict promiseState(const KCPromise& promise) {
  const auto* toPath = dynamic_cast<const KCPromisedTransferToPath*>(&promise);
  plist::Dict state{{"kind", toPath ? kTransferToPath : kOutOfBandTransfer}};
  // A promise made outside this service has none; it gets one when loaded.
  if (auto identifier = FakeKCInstallCoordination::promiseIdentifier(promise)) {
    state.set("identifier", *identifier);
  }
  state.set("name", promise.name());
  state.set("client", promise.client());
  state.set("diskSpaceNeeded", promise.diskSpaceNeeded());
  if (toPath) {
    if (std::optional<std::string> path = toPath->transferPath()) state.set("transferPath", *path);
  }
  state.set("percentComplete", promise.percentComplete());
  state.set("complete", promise.isComplete());
  state.set("cancelled", promise.isCancelled());
  if (const auto* fake = dynamic_cast<const FakeKCPromiseBase*>(&promise)) {
    if (ErrorRef reason = fake->cancelReason()) state.set("cancelReason", errorState(*reason));
  }
  return state;
}

plist::Dict placeholderState(const FakeKCPlaceholder& placeholder) {
  plist::Dict state{{"bundleName", placeholder.bundleName()},
                    {"bundleID", placeholder.bundleID()},
                    {"installType", placeholder.installType()},
                    {"client", placeholder.client()}};
  if (std::optional<KCPlaceholderAttributes> attributes = placeholder.attributes()) {
    plist::Dict saved{{"infoPlist", nullsMarked(attributes->infoPlist())}};
    if (attributes->bundleVersion()) saved.set("bundleVersion", *attributes->bundleVersion());
    saved.set("launchProhibited", attributes->launchProhibited());
    state.set("attributes", std::move(saved));
  }
  if (auto metadata = placeholder.metadata()) {
    state.set("metadata", nullsMarked(metadata->dictionary()));
  }
  if (std::optional<plist::Bytes> sinf = placeholder.sinfData()) state.set("sinfData", *sinf);
  if (auto icon = placeholder.iconPromise()) state.set("iconPromise", promiseState(*icon));
  state.set("configurationComplete", placeholder.isConfigurationComplete());
  state.set("cancelled", placeholder.isCancelled());
  if (ErrorRef reason = placeholder.cancelReason()) {
    state.set("cancelReason", errorState(*reason));
  }
  return state;
}

plist::Dict coordinatorState(const Coordinator& c) {
  const Coordinator::Snapshot s = c.snapshot();
  plist::Dict state{{"kind", nameOf(kKindNames, c.kind())},
                    {"creatorClient", c.creatorIdentifier()},
                    {"state", nameOf(kStateNames, s.state)}};
  if (s.error) state.set("error", errorState(*s.error));
  if (s.installOptions) {
    plist::Dict options{{"arInstallType", s.installOptions->arInstallType()},
                        {"installTargetType", s.installOptions->installTargetType()}};
    if (const auto& metadata = s.installOptions->caravelMetadata()) {
      options.set("caravelMetadata", nullsMarked(metadata->dictionary()));
    }
    state.set("installOptions", std::move(options));
  }
  if (s.hasSPRPromises) {
    plist::Array promises;
    for (const auto& promise : s.sprPromises) promises.push_back(promiseState(*promise));
    state.set("initialSPRPromises", std::move(promises));
  }
  if (s.appAssetPromise) state.set("appAssetPromise", promiseState(*s.appAssetPromise));
  if (s.userDataPromise) state.set("userDataPromise", promiseState(*s.userDataPromise));
  // Only the service's own placeholders are taken by a coordinator.
  if (auto* placeholder = dynamic_cast<const FakeKCPlaceholder*>(s.placeholder.get())) {
    state.set("placeholder", placeholderState(*placeholder));
  }
  state.set("placeholderInstalled", s.placeholderInstalled);
  state.set("placedPlaceholderRecord", c.placedPlaceholderRecord());
  state.set("responsibleClient", s.responsibleClient);
  return state;
}

plist::Dict finishedState(const FinishedCoordinator& f) {
  plist::Dict state{{"bundleID", f.bundleID},
                    {"kind", nameOf(kKindNames, f.kind)},
                    {"state", nameOf(kStateNames, f.state)}};
  if (f.errorDomain) state.set("errorDomain", *f.errorDomain);
  if (f.errorCode) state.set("errorCode", *f.errorCode);
  if (f.cancellingClient) state.set("cancellingClient", *f.cancellingClient);
  return state;
}

// --- Loading -----------------------------------------------------------------------------------

// Makes the objects of one saved state. A promise held in several places (its identifier saved
// more than once) is made once and shared again.
class Loader {
 public:
  Loader(std::weak_ptr<FakeKCServiceHooks> service, std::uint64_t nextPromiseIdentifier)
      : service_(std::move(service)), nextIdentifier_(nextPromiseIdentifier) {}

  std::uint64_t nextPromiseIdentifier() const { return nextIdentifier_; }

  std::shared_ptr<Coordinator> coordinator(const std::string& bundleID, const StateFields& f) {
    auto c = std::make_shared<Coordinator>(service_, valueOf(kKindNames, f, "kind"), bundleID,
                                           f.unsignedInteger("creatorClient"));
    Coordinator::Snapshot s;
    s.state = valueOf(kStateNames, f, "state");
    s.error = f.optionalError("error");
    if (std::optional<StateFields> options = f.optionalChild("installOptions")) {
      auto loaded = std::make_shared<EMInstallOptions>();
      loaded->setArInstallType(options->unsignedInteger("arInstallType"));
      loaded->setInstallTargetType(options->unsignedInteger("installTargetType"));
      if (options->has("caravelMetadata")) {
        loaded->setCaravelMetadata(metadata(*options, "caravelMetadata"));
      }
      s.installOptions = std::move(loaded);
    }
    s.hasSPRPromises = f.has("initialSPRPromises");
    for (const StateFields& promise : f.records("initialSPRPromises")) {
      s.sprPromises.push_back(this->promise(promise));
    }
    s.appAssetPromise = transferPromise(f, "appAssetPromise");
    if (std::optional<StateFields> promise = f.optionalChild("userDataPromise")) {
      s.userDataPromise = this->promise(*promise);
    }
    if (std::optional<StateFields> placeholder = f.optionalChild("placeholder")) {
      s.placeholder = this->placeholder(*placeholder);
    }
    s.placeholderInstalled = f.boolean("placeholderInstalled", false);
    s.responsibleClient = f.unsignedInteger("responsibleClient");
    c->restore(std::move(s), f.boolean("placedPlaceholderRecord", false));
    return c;
  }

 private:
  std::shared_ptr<KCPromise> promise(const StateFields& f) {
    std::optional<std::uint64_t> identifier = f.optionalUnsigned("identifier");
    if (identifier) {
      if (auto it = promises_.find(*identifier); it != promises_.end()) return it->second;
      nextIdentifier_ = std::max(nextIdentifier_, *identifier + 1);
    } else {
      identifier = nextIdentifier_++;
    }
    const std::string kind = f.string("kind");
    std::shared_ptr<KCPromise> promise;
    if (kind == kTransferToPath) {
      promise = std::make_shared<FakeKCPromisedTransferToPath>(
          service_, f.string("name"), f.unsignedInteger("client"), f.optionalString("transferPath"),
          f.unsignedInteger("diskSpaceNeeded"), *identifier);
    } else if (kind == kOutOfBandTransfer) {
      promise = std::make_shared<FakeKCPromisedOutOfBandTransfer>(
          service_, f.string("name"), f.unsignedInteger("client"),
          f.unsignedInteger("diskSpaceNeeded"), *identifier);
    } else {
      f.fail("kind",
             "expected " + std::string(kTransferToPath) + " or " + std::string(kOutOfBandTransfer));
    }
    promise->setPercentComplete(f.real("percentComplete"));
    promise->setComplete(f.boolean("complete", false));
    if (f.boolean("cancelled", false)) {
      dynamic_cast<FakeKCPromiseBase&>(*promise).cancelByService(f.optionalError("cancelReason"));
    }
    promises_[*identifier] = promise;
    return promise;
  }

  std::shared_ptr<KCPromisedTransferToPath> transferPromise(const StateFields& f,
                                                            std::string_view key) {
    std::optional<StateFields> saved = f.optionalChild(key);
    if (!saved) return nullptr;
    auto promise = std::dynamic_pointer_cast<KCPromisedTransferToPath>(this->promise(*saved));
    if (!promise) saved->fail("kind", "expected " + std::string(kTransferToPath));
    return promise;
  }

  std::shared_ptr<const EMStoreMetadata> metadata(const StateFields& f, std::string_view key) {
    return std::make_shared<const EMStoreMetadata>(nullsRestored(f.dictionary(key)));
  }

  std::shared_ptr<FakeKCPlaceholder> placeholder(const StateFields& f) {
    auto placeholder = std::make_shared<FakeKCPlaceholder>(
        service_, f.string("bundleName"), f.string("bundleID"), f.unsignedInteger("installType"),
        f.unsignedInteger("client"));
    std::optional<KCPlaceholderAttributes> attributes;
    if (std::optional<StateFields> saved = f.optionalChild("attributes")) {
      attributes.emplace(nullsRestored(saved->dictionary("infoPlist")));
      attributes->setBundleVersion(saved->optionalString("bundleVersion"));
      attributes->setLaunchProhibited(saved->boolean("launchProhibited", false));
    }
    placeholder->restoreConfiguration(transferPromise(f, "iconPromise"), std::move(attributes),
                                      f.has("metadata") ? metadata(f, "metadata") : nullptr,
                                      f.optionalData("sinfData"),
                                      f.boolean("configurationComplete", false));
    if (f.boolean("cancelled", false))
      placeholder->cancelByService(f.optionalError("cancelReason"));
    return placeholder;
  }

  const std::weak_ptr<FakeKCServiceHooks> service_;
  std::uint64_t nextIdentifier_;
  std::map<std::uint64_t, std::shared_ptr<KCPromise>> promises_;
};

FinishedCoordinator finishedFrom(const StateFields& f) {
  FinishedCoordinator finished{.bundleID = f.string("bundleID"),
                               .kind = valueOf(kKindNames, f, "kind"),
                               .state = valueOf(kStateNames, f, "state"),
                               .errorDomain = f.optionalString("errorDomain"),
                               .errorCode = f.optionalInteger("errorCode"),
                               .cancellingClient = f.optionalUnsigned("cancellingClient")};
  if (finished.state == Coordinator::State::Active)
    f.fail("state", "expected completed or cancelled");
  if (finished.errorDomain.has_value() != finished.errorCode.has_value()) {
    f.fail(finished.errorDomain ? "errorCode" : "errorDomain",
           "missing (an error has both a domain and a code)");
  }
  return finished;
}

}  // namespace

plist::Dict FakeKCInstallCoordination::saveState() const {
  plist::Dict coordinators;
  for (const auto& c : daemon_->all()) coordinators.set(c->bundleID(), coordinatorState(*c));
  plist::Array finished;
  for (const FinishedCoordinator& f : daemon_->allFinished()) finished.push_back(finishedState(f));
  return {{"coordinationEnabled", daemon_->enabled()},
          {"nextPromiseIdentifier", daemon_->upcomingPromiseIdentifier()},
          {"coordinators", std::move(coordinators)},
          {"finishedCoordinators", std::move(finished)}};
}

void FakeKCInstallCoordination::loadState(const StateFields& state) {
  const bool enabled = state.boolean("coordinationEnabled", true);
  Loader loader(daemon_->hooks(), state.unsignedInteger("nextPromiseIdentifier"));
  std::vector<std::shared_ptr<Coordinator>> coordinators;
  const StateFields saved = state.child("coordinators");
  for (const auto& [bundleID, value] : saved.dict()) {
    coordinators.push_back(loader.coordinator(bundleID, saved.child(bundleID)));
  }
  // Missing in a device saved before finished coordinators were kept: none.
  std::vector<FinishedCoordinator> finished;
  for (const StateFields& f : state.records("finishedCoordinators")) {
    finished.push_back(finishedFrom(f));
  }
  daemon_->setEnabled(enabled);
  daemon_->replaceState(std::move(coordinators), loader.nextPromiseIdentifier(),
                        std::move(finished));
}

}  // namespace appsync
