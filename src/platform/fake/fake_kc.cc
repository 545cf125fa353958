// The fake install-coordination service: coordinator bookkeeping, the background installs of
// placeholders and packages, and event delivery on the service's own thread.
#include "platform/fake/fake_kc.h"

#include <map>
#include <mutex>
#include <string_view>
#include <utility>

#include "platform/ar.h"
#include "platform/bundle_keys.h"
#include "platform/fake/callback_thread.h"
#include "platform/fake/fake_ar.h"

namespace appsync {
namespace {

constexpr std::string_view kUninstallOp =
    "uninstallAppWithBundleID:requestUserConfirmation:completion:";
constexpr std::string_view kCoordinatorForAppOp =
    "coordinatorForAppWithBundleID:withClientID:createIfNotExisting:created:error:";
constexpr std::string_view kInitPlaceholderOp =
    "initAppPlaceholderWithBundleName:bundleID:installType:client:";
constexpr std::string_view kInitTransferWithPathOp =
    "KCPromisedTransferToPath initWithName:client:transferPath:diskSpaceNeeded:";
constexpr std::string_view kInitTransferOp =
    "KCPromisedTransferToPath initWithName:client:diskSpaceNeeded:";
constexpr std::string_view kInitOutOfBandOp =
    "KCPromisedOutOfBandTransfer initWithName:client:diskSpaceNeeded:";
constexpr std::string_view kInitObserverOp = "initWithMachServiceName:forClients:delegate:";
constexpr std::string_view kInstallPlaceholderOp = "installPlaceholder";
constexpr std::string_view kInstallPackageOp = "installPackage";

// The client number the service itself reports for cancellations it makes.
constexpr std::uint64_t kServiceClient = 0;

std::string pathFromTransferPath(const std::string& path) {
  constexpr std::string_view kScheme = "file://";
  if (path.compare(0, kScheme.size(), kScheme) == 0) return path.substr(kScheme.size());
  return path;
}

// A promise that gates an install: present means it must be complete and not cancelled.
bool settled(const std::shared_ptr<KCPromise>& promise) {
  return !promise || (promise->isComplete() && !promise->isCancelled());
}

}  // namespace

class FakeKCInstallCoordination::Core final : public FakeKCServiceHooks,
                                              public std::enable_shared_from_this<Core> {
 public:
  using Coordinator = FakeKCAppInstallCoordinator;
  using CoordinatorRef = std::shared_ptr<Coordinator>;

  Core(FakeKCInstallCoordination& owner, FakeARWorkspace& registry)
      : registry_(registry),
        owner_(&owner),
        events_(std::make_shared<CallbackThread>("fake-kc-events")) {}
  ~Core() { shutdown(); }

  // Stops counting calls and delivering anything; work still queued is dropped.
  void shutdown() {
    std::shared_ptr<CallbackThread> events;
    {
      std::lock_guard lock(mutex_);
      stopped_ = true;
      owner_ = nullptr;
      events = std::move(events_);
    }
    // Runs out the queue (each item returns at once, seeing stopped_) and joins the thread.
    events.reset();
  }

  std::weak_ptr<FakeKCServiceHooks> hooks() { return weak_from_this(); }

  // --- FakeKCServiceHooks ---

  ErrorRef scriptedFailure(std::string_view operation) override {
    std::lock_guard lock(mutex_);
    return owner_ ? owner_->beginCall(operation) : nullptr;
  }

  void coordinatorChanged(const CoordinatorRef& c) override {
    post([this, c] { evaluate(c); });
  }

  void coordinatorCancelled(const CoordinatorRef& c, const ErrorRef& reason,
                            std::uint64_t client) override {
    forget(c);
    post([this, c, reason, client] { reportCancellation(c, reason, client); });
  }

  void observerReplaced() override { waitForRunningDelivery(); }

  void registrationGone(const FakeKCAppInstallObserver* registration) override {
    {
      std::lock_guard lock(mutex_);
      std::erase(registrations_, registration);
    }
    waitForRunningDelivery();
  }

  // --- Service state ---

  bool enabled() const {
    std::lock_guard lock(mutex_);
    return enabled_;
  }
  void setEnabled(bool enabled) {
    std::lock_guard lock(mutex_);
    enabled_ = enabled;
  }

  // The existing coordinator (kind permitting) or a new one; see coordinatorForAppWithBundleID.
  CoordinatorRef findOrCreate(KCCoordinatorKind kind, const std::string& bundleID,
                              std::uint64_t clientID, bool create, bool* created, ErrorRef* error) {
    std::lock_guard lock(mutex_);
    setError(error, nullptr);
    if (auto it = coordinators_.find(bundleID); it != coordinators_.end()) {
      const CoordinatorRef& existing = it->second;
      if (kind == KCCoordinatorKind::Any || existing->kind() == kind) return existing;
      setError(error, makeKCError(kKCErrorCoordinatorKindMismatch,
                                  "a " + std::string(coordinatorClassName(existing->kind())) +
                                      " already exists for " + bundleID));
      return nullptr;
    }
    if (!create || kind == KCCoordinatorKind::Any) return nullptr;
    if (created) *created = true;
    return makeLocked(kind, bundleID, clientID);
  }

  CoordinatorRef put(KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t creator) {
    std::lock_guard lock(mutex_);
    return makeLocked(kind, bundleID, creator);
  }

  CoordinatorRef find(const std::string& bundleID) const {
    std::lock_guard lock(mutex_);
    auto it = coordinators_.find(bundleID);
    return it == coordinators_.end() ? nullptr : it->second;
  }

  std::vector<CoordinatorRef> all() const {
    std::lock_guard lock(mutex_);
    std::vector<CoordinatorRef> out;
    for (const auto& [id, c] : coordinators_) out.push_back(c);
    return out;
  }

  std::uint64_t nextPromiseIdentifier() {
    std::lock_guard lock(mutex_);
    return nextPromiseIdentifier_++;
  }

  void addRegistration(const FakeKCAppInstallObserver* registration) {
    std::lock_guard lock(mutex_);
    registrations_.push_back(registration);
  }

  void removeObserverEverywhere(const KCAppInstallObserverDelegate* observer) {
    std::vector<CoordinatorRef> made;
    {
      std::lock_guard lock(mutex_);
      for (const auto& weak : made_) {
        if (auto c = weak.lock()) made.push_back(std::move(c));
      }
    }
    for (const auto& c : made) c->forgetObserver(observer);
    waitForRunningDelivery();
  }

  // --- The event thread ---

  void post(std::function<void()> work) {
    std::lock_guard lock(mutex_);
    if (stopped_ || !events_) return;
    events_->post([this, work = std::move(work)] {
      if (stopped()) return;
      const Core* previous = current_;
      current_ = this;
      work();
      current_ = previous;
    });
  }

  void drain() {
    std::shared_ptr<CallbackThread> events = thread();
    if (!events) return;
    // Work done on the thread may queue more (an observer calling back into the service).
    do {
      if (events->isHeld()) {
        events->waitUntilIdle();
        return;
      }
      events->drain();
    } while (events->pendingCount() > 0);
  }

  void hold() {
    std::lock_guard lock(mutex_);
    if (events_) events_->hold();
  }

  void release() {
    std::lock_guard lock(mutex_);
    if (events_) events_->release();
  }

  using DelegateCall = std::function<void(KCAppInstallObserverDelegate&)>;

  // Calls `call` on the coordinator's observer, then on the delegates registered for its
  // creator. Runs on the event thread, with no lock held during the calls.
  void deliver(const Coordinator& c, const DelegateCall& call) {
    std::vector<KCAppInstallObserverDelegate*> targets;
    if (KCAppInstallObserverDelegate* observer = c.observer()) targets.push_back(observer);
    {
      std::lock_guard lock(mutex_);
      for (const FakeKCAppInstallObserver* r : registrations_) {
        if (r->delegate() && r->clients().count(c.creatorIdentifier())) {
          targets.push_back(r->delegate());
        }
      }
    }
    for (KCAppInstallObserverDelegate* target : targets) call(*target);
  }

  ErrorRef uninstall(const std::string& bundleID) {
    if (!registry_.application(bundleID)) {
      return makeKCError(kKCErrorUnknownApplication, "no application " + bundleID);
    }
    if (!registry_.uninstallApplication(bundleID, std::nullopt)) {
      return makeKCError(kKCErrorUninstallFailed, "the registry did not remove " + bundleID);
    }
    return nullptr;
  }

 private:
  CoordinatorRef makeLocked(KCCoordinatorKind kind, const std::string& bundleID,
                            std::uint64_t creator) {
    auto c = std::make_shared<Coordinator>(hooks(), kind, bundleID, creator);
    coordinators_[bundleID] = c;
    std::erase_if(made_, [](const std::weak_ptr<Coordinator>& w) { return w.expired(); });
    made_.push_back(c);
    return c;
  }

  void forget(const CoordinatorRef& c) {
    std::lock_guard lock(mutex_);
    auto it = coordinators_.find(c->bundleID());
    if (it != coordinators_.end() && it->second == c) coordinators_.erase(it);
  }

  bool stopped() const {
    std::lock_guard lock(mutex_);
    return stopped_;
  }

  std::shared_ptr<CallbackThread> thread() const {
    std::lock_guard lock(mutex_);
    return events_;
  }

  // Returns once no delivery that may have read an old observer is running. Inside a delivery
  // the running one is the caller's own.
  void waitForRunningDelivery() {
    if (current_ == this) return;
    if (std::shared_ptr<CallbackThread> events = thread()) events->waitUntilIdle();
  }

  // Moves the coordinator as far as its promises allow: placeholder, then package.
  void evaluate(const CoordinatorRef& c) {
    Coordinator::Snapshot s = c->snapshot();
    if (s.state != Coordinator::State::Active) return;
    auto* placeholder = dynamic_cast<FakeKCPlaceholder*>(s.placeholder.get());
    if (!placeholder) return;
    if (!s.placeholderInstalled) {
      if (!placeholder->isReadyToInstall()) return;
      if (ErrorRef failure = scriptedFailure(kInstallPlaceholderOp)) {
        if (c->markCancelled(failure)) {
          forget(c);
          reportCancellation(c, failure, kServiceClient);
        }
        return;
      }
      putPlaceholderRecord(*c, *placeholder);
      if (!c->markPlaceholderInstalled()) return;
      deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinatorDidInstallPlaceholder(c); });
      s = c->snapshot();
      if (s.state != Coordinator::State::Active) return;
    }

    if (!s.appAssetPromise || !settled(s.appAssetPromise) || !settled(s.userDataPromise)) return;
    for (const auto& promise : s.sprPromises) {
      if (!settled(promise)) return;
    }
    std::optional<std::string> transferPath = s.appAssetPromise->transferPath();
    if (!transferPath || transferPath->empty()) return;

    std::uint64_t installType =
        s.installOptions ? s.installOptions->arInstallType() : placeholder->installType();
    plist::Dict options{{std::string(ARPackageTypeKey), std::string(ARPackageTypeCustomer)},
                        {std::string(kBNBundleIdentifierKey), c->bundleID()},
                        {std::string(ARInstallTypeKey), installType}};
    ErrorRef failure = scriptedFailure(kInstallPackageOp);
    if (!failure) {
      ErrorRef registryError;
      if (!registry_.installApplication(pathFromTransferPath(*transferPath), options,
                                        &registryError)) {
        auto error = std::make_shared<Error>(*makeKCError(
            kKCErrorInstallFailed, "the package of " + c->bundleID() + " could not be installed"));
        error->underlying = registryError;
        failure = error;
      }
    }
    if (!c->finish(failure)) return;
    forget(c);
    deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinatorDidCompleteSuccessfully(c); });
  }

  void putPlaceholderRecord(Coordinator& c, const FakeKCPlaceholder& placeholder) {
    std::optional<FakeARWorkspace::AppRecord> existing = registry_.application(c.bundleID());
    if (existing && !existing->isPlaceholder) return;  // an update: the app stays as it is

    FakeARWorkspace::AppRecord record;
    record.identifier = c.bundleID();
    record.name = placeholder.bundleName();
    record.installType = placeholder.installType();
    record.isPlaceholder = true;
    if (std::optional<KCPlaceholderAttributes> attributes = placeholder.attributes()) {
      record.version = attributes->bundleVersion();
      if (!record.version) {
        if (const std::string* v = plist::stringAt(attributes->infoPlist(), kBNBundleVersionKey)) {
          record.version = *v;
        }
      }
    }
    if (auto icon = placeholder.iconPromise()) {
      if (std::optional<std::string> path = icon->transferPath()) {
        record.iconPath = pathFromTransferPath(*path);
      }
    }
    registry_.putApplication(std::move(record));
    c.notePlaceholderRecord();
  }

  void reportCancellation(const CoordinatorRef& c, const ErrorRef& reason, std::uint64_t client) {
    if (c->placedPlaceholderRecord()) {
      std::optional<FakeARWorkspace::AppRecord> record = registry_.application(c->bundleID());
      if (record && record->isPlaceholder)
        registry_.uninstallApplication(c->bundleID(), std::nullopt);
    }
    deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinator(c, reason, client); });
  }

  FakeARWorkspace& registry_;
  static thread_local const Core* current_;  // the service whose item this thread runs

  mutable std::mutex mutex_;
  FakeKCInstallCoordination* owner_;  // null once shut down
  bool stopped_ = false;
  bool enabled_ = true;
  std::map<std::string, CoordinatorRef> coordinators_;
  std::vector<std::weak_ptr<Coordinator>> made_;  // every coordinator still alive
  std::vector<const FakeKCAppInstallObserver*> registrations_;
  std::uint64_t nextPromiseIdentifier_ = 1;
  std::shared_ptr<CallbackThread> events_;
};

thread_local const FakeKCInstallCoordination::Core* FakeKCInstallCoordination::Core::current_ =
    nullptr;

// --- FakeKCInstallCoordination -----------------------------------------------------------------

FakeKCInstallCoordination::FakeKCInstallCoordination(FakeARWorkspace& registry)
    : FakeService("FakeKCInstallCoordination", std::string(kKCErrorDomain),
                  {
                      {"coordinationIsEnabled", false},
                      {kUninstallOp, true},
                      {kCoordinatorForAppOp, true},
                      {kInitPlaceholderOp, true},
                      {kInitTransferWithPathOp, true},
                      {kInitTransferOp, true},
                      {kInitOutOfBandOp, true},
                      {kInitObserverOp, true},
                      {"KCCreateUserPresentableError", false},
                      {"setObserver:", false},
                      {"setPlaceholderPromise:error:", true},
                      {"setAppAssetPromise:error:", true},
                      {"appAssetPromiseWithError:", true},
                      {"setUserDataPromise:error:", true},
                      {"setInstallOptions:error:", true},
                      {"setInitialSPRAssetPromises:error:", true},
                      {"setAppAssetPromiseResponsibleClient:error:", true},
                      {"appAssetPromiseResponsibleClientWithError:", true},
                      {"setIconPromise:error:", true},
                      {"setPlaceholderAttributes:error:", true},
                      {"setMetadata:error:", true},
                      {"setSinfData:error:", true},
                      {"setConfigurationCompleteWithError:", true},
                      {"KCAppInstallCoordinator cancelForReason:client:error:", true},
                      {"KCPlaceholder cancelForReason:client:error:", true},
                      {"KCPromise cancelForReason:client:error:", true},
                      {kInstallPlaceholderOp, true},
                      {kInstallPackageOp, true},
                  }),
      core_(std::make_shared<Core>(*this, registry)) {}

FakeKCInstallCoordination::~FakeKCInstallCoordination() { core_->shutdown(); }

bool FakeKCInstallCoordination::coordinationIsEnabled() {
  beginCall("coordinationIsEnabled");
  return core_->enabled();
}

void FakeKCInstallCoordination::uninstallAppWithBundleID(const std::string& bundleID,
                                                         bool requestUserConfirmation,
                                                         std::function<void(ErrorRef)> completion) {
  (void)requestUserConfirmation;  // no user to ask
  ErrorRef failure = beginCall(kUninstallOp);
  Core* core = core_.get();
  core_->post([core, bundleID, failure, completion = std::move(completion)] {
    ErrorRef result = failure ? failure : core->uninstall(bundleID);
    if (completion) completion(result);
  });
}

std::shared_ptr<KCAppInstallCoordinator> FakeKCInstallCoordination::coordinatorForAppWithBundleID(
    KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t clientID,
    bool createIfNotExisting, bool* created, ErrorRef* error) {
  if (created) *created = false;
  if (ErrorRef failure = beginCall(kCoordinatorForAppOp)) {
    setError(error, failure);
    return nullptr;
  }
  return core_->findOrCreate(kind, bundleID, clientID, createIfNotExisting, created, error);
}

std::shared_ptr<KCPlaceholder> FakeKCInstallCoordination::initAppPlaceholder(
    const std::string& bundleName, const std::string& bundleID, std::uint64_t installType,
    std::uint64_t client) {
  if (beginCall(kInitPlaceholderOp)) return nullptr;
  return std::make_shared<FakeKCPlaceholder>(core_->hooks(), bundleName, bundleID, installType,
                                             client);
}

std::shared_ptr<KCPromisedTransferToPath> FakeKCInstallCoordination::initPromisedTransferToPath(
    const std::string& name, std::uint64_t client, const std::optional<std::string>& transferPath,
    std::uint64_t diskSpaceNeeded) {
  if (beginCall(transferPath ? kInitTransferWithPathOp : kInitTransferOp)) return nullptr;
  return std::make_shared<FakeKCPromisedTransferToPath>(
      core_->hooks(), name, client, transferPath, diskSpaceNeeded, core_->nextPromiseIdentifier());
}

std::shared_ptr<KCPromisedOutOfBandTransfer>
FakeKCInstallCoordination::initPromisedOutOfBandTransfer(const std::string& name,
                                                         std::uint64_t client,
                                                         std::uint64_t diskSpaceNeeded) {
  if (beginCall(kInitOutOfBandOp)) return nullptr;
  return std::make_shared<FakeKCPromisedOutOfBandTransfer>(
      core_->hooks(), name, client, diskSpaceNeeded, core_->nextPromiseIdentifier());
}

std::shared_ptr<KCAppInstallObserver> FakeKCInstallCoordination::initAppInstallObserver(
    const std::string& machServiceName, const std::set<std::uint64_t>& clients,
    KCAppInstallObserverDelegate* delegate) {
  if (beginCall(kInitObserverOp)) return nullptr;
  auto registration = std::make_shared<FakeKCAppInstallObserver>(core_->hooks(), machServiceName,
                                                                 clients, delegate);
  core_->addRegistration(registration.get());
  return registration;
}

ErrorRef FakeKCInstallCoordination::KCCreateUserPresentableError(std::int64_t code,
                                                                 std::int64_t detail,
                                                                 const ErrorRef& underlying) {
  beginCall("KCCreateUserPresentableError");
  std::string description = "The app could not be installed";
  if (underlying) {
    if (const std::string* text = plist::stringAt(underlying->userInfo, kErrorDescriptionKey)) {
      description += ": " + *text;
    }
  }
  auto error = std::make_shared<Error>();
  error->domain = std::string(kKCErrorDomain);
  error->code = code;
  error->userInfo.set(std::string(kErrorDescriptionKey), description);
  error->userInfo.set(std::string(kKCErrorDetailKey), detail);
  error->underlying = underlying;
  return error;
}

void FakeKCInstallCoordination::setCoordinationEnabled(bool enabled) { core_->setEnabled(enabled); }

std::shared_ptr<FakeKCAppInstallCoordinator> FakeKCInstallCoordination::putCoordinator(
    KCCoordinatorKind kind, const std::string& bundleID, std::uint64_t creatorClient) {
  return core_->put(kind, bundleID, creatorClient);
}

std::shared_ptr<FakeKCAppInstallCoordinator> FakeKCInstallCoordination::coordinator(
    const std::string& bundleID) const {
  return core_->find(bundleID);
}

std::vector<std::shared_ptr<FakeKCAppInstallCoordinator>> FakeKCInstallCoordination::coordinators()
    const {
  return core_->all();
}

bool FakeKCInstallCoordination::completeStoreDownload(const std::string& bundleID,
                                                      const std::string& packagePath) {
  std::shared_ptr<FakeKCAppInstallCoordinator> c = core_->find(bundleID);
  if (!c) return false;
  FakeKCAppInstallCoordinator::Snapshot s = c->snapshot();
  if (s.state != FakeKCAppInstallCoordinator::State::Active) return false;
  if (s.responsibleClient != KCClientBazaar && c->kind() != KCCoordinatorKind::RestoringDemoted) {
    return false;
  }
  std::shared_ptr<KCPromisedTransferToPath> promise = s.appAssetPromise;
  if (!promise) {
    promise = std::make_shared<FakeKCPromisedTransferToPath>(core_->hooks(), bundleID + "-Asset",
                                                             KCClientBazaar, std::nullopt, 0,
                                                             core_->nextPromiseIdentifier());
    if (!c->adoptAppAssetPromise(promise)) return false;
  }
  promise->setTransferPath(packagePath);
  promise->setPercentComplete(1.0);
  promise->setComplete(true);
  c->reportChange();  // a promise of another maker reports nothing itself
  return true;
}

bool FakeKCInstallCoordination::requestPrioritize(const std::string& bundleID) {
  std::shared_ptr<FakeKCAppInstallCoordinator> c = core_->find(bundleID);
  if (!c) return false;
  Core* core = core_.get();
  core_->post([core, c] {
    core->deliver(*c, [&](KCAppInstallObserverDelegate& d) { d.coordinatorShouldPrioritize(c); });
  });
  return true;
}

bool FakeKCInstallCoordination::notifyPromiseDidBeginFulfillment(std::uint64_t identifier) {
  auto holds = [identifier](const std::shared_ptr<KCPromise>& promise) {
    return promise && promiseIdentifier(*promise) == identifier;
  };
  for (const auto& c : core_->all()) {
    FakeKCAppInstallCoordinator::Snapshot s = c->snapshot();
    bool found = holds(s.appAssetPromise) || holds(s.userDataPromise);
    for (const auto& promise : s.sprPromises) found = found || holds(promise);
    if (auto* placeholder = dynamic_cast<FakeKCPlaceholder*>(s.placeholder.get())) {
      found = found || holds(placeholder->iconPromise());
    }
    if (!found) continue;
    Core* core = core_.get();
    core_->post([core, c, identifier] {
      core->deliver(*c, [&](KCAppInstallObserverDelegate& d) {
        d.promiseDidBeginFulfillmentWithIdentifier(identifier);
      });
    });
    return true;
  }
  return false;
}

std::optional<std::uint64_t> FakeKCInstallCoordination::promiseIdentifier(
    const KCPromise& promise) {
  if (auto* fake = dynamic_cast<const FakeKCPromiseBase*>(&promise)) {
    return fake->uniqueIdentifier();
  }
  return std::nullopt;
}

void FakeKCInstallCoordination::removeObserver(const KCAppInstallObserverDelegate* observer) {
  core_->removeObserverEverywhere(observer);
}

void FakeKCInstallCoordination::drain() { core_->drain(); }
void FakeKCInstallCoordination::hold() { core_->hold(); }
void FakeKCInstallCoordination::release() { core_->release(); }

}  // namespace appsync
