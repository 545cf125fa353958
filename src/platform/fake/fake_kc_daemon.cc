// The fake install-coordination daemon's bookkeeping and event thread: coordinators and
// registrations, what the objects report, and delivering events in order.
#include "platform/fake/fake_kc_daemon.h"

#include <utility>

#include "platform/fake/fake_kc.h"
#include "platform/fake/fake_kc_errors.h"

namespace appsync {

thread_local const FakeKCDaemon* FakeKCDaemon::current_ = nullptr;

FakeKCDaemon::FakeKCDaemon(FakeKCInstallCoordination& owner, FakeARWorkspace& registry)
    : registry_(registry),
      owner_(&owner),
      events_(std::make_shared<CallbackThread>("fake-kc-events")) {}

FakeKCDaemon::~FakeKCDaemon() { shutdown(); }

void FakeKCDaemon::shutdown() {
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

// --- What the objects report -------------------------------------------------------------------

ErrorRef FakeKCDaemon::scriptedFailure(std::string_view operation) {
  std::lock_guard lock(mutex_);
  return owner_ ? owner_->beginCall(operation) : nullptr;
}

void FakeKCDaemon::coordinatorChanged(const CoordinatorRef& c) {
  post([this, c] { evaluate(c); });
}

void FakeKCDaemon::coordinatorCancelled(const CoordinatorRef& c, const ErrorRef& reason,
                                        std::uint64_t client) {
  retire(c, client);
  post([this, c, reason, client] { reportCancellation(c, reason, client); });
}

void FakeKCDaemon::observerReplaced() { waitForRunningDelivery(); }

void FakeKCDaemon::registrationGone(const FakeKCAppInstallObserver* registration) {
  {
    std::lock_guard lock(mutex_);
    std::erase(registrations_, registration);
  }
  waitForRunningDelivery();
}

// --- Bookkeeping -------------------------------------------------------------------------------

FakeKCDaemon::CoordinatorRef FakeKCDaemon::findOrCreate(KCCoordinatorKind kind,
                                                        const std::string& bundleID,
                                                        std::uint64_t clientID, bool create,
                                                        bool* created, ErrorRef* error) {
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

FakeKCDaemon::CoordinatorRef FakeKCDaemon::put(KCCoordinatorKind kind, const std::string& bundleID,
                                               std::uint64_t creator) {
  std::lock_guard lock(mutex_);
  return makeLocked(kind, bundleID, creator);
}

FakeKCDaemon::CoordinatorRef FakeKCDaemon::find(const std::string& bundleID) const {
  std::lock_guard lock(mutex_);
  auto it = coordinators_.find(bundleID);
  return it == coordinators_.end() ? nullptr : it->second;
}

std::vector<FakeKCDaemon::CoordinatorRef> FakeKCDaemon::all() const {
  std::lock_guard lock(mutex_);
  std::vector<CoordinatorRef> out;
  for (const auto& [id, c] : coordinators_) out.push_back(c);
  return out;
}

std::optional<FinishedCoordinator> FakeKCDaemon::finished(const std::string& bundleID) const {
  std::lock_guard lock(mutex_);
  return history_.find(bundleID);
}

std::vector<FinishedCoordinator> FakeKCDaemon::allFinished() const {
  std::lock_guard lock(mutex_);
  return history_.all();
}

std::uint64_t FakeKCDaemon::nextPromiseIdentifier() {
  std::lock_guard lock(mutex_);
  return nextPromiseIdentifier_++;
}

void FakeKCDaemon::addRegistration(const FakeKCAppInstallObserver* registration) {
  std::lock_guard lock(mutex_);
  registrations_.push_back(registration);
}

void FakeKCDaemon::removeObserverEverywhere(const KCAppInstallObserverDelegate* observer) {
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

std::uint64_t FakeKCDaemon::upcomingPromiseIdentifier() const {
  std::lock_guard lock(mutex_);
  return nextPromiseIdentifier_;
}

void FakeKCDaemon::replaceState(std::vector<CoordinatorRef> coordinators,
                                std::uint64_t nextPromiseIdentifier,
                                std::vector<FinishedCoordinator> finished) {
  {
    std::lock_guard lock(mutex_);
    history_.replace(std::move(finished));
    coordinators_.clear();
    std::erase_if(made_, [](const std::weak_ptr<Coordinator>& w) { return w.expired(); });
    for (const CoordinatorRef& c : coordinators) {
      coordinators_[c->bundleID()] = c;
      made_.push_back(c);
    }
    nextPromiseIdentifier_ = nextPromiseIdentifier;
  }
  for (const CoordinatorRef& c : coordinators) c->reportChange();
}

FakeKCDaemon::CoordinatorRef FakeKCDaemon::makeLocked(KCCoordinatorKind kind,
                                                      const std::string& bundleID,
                                                      std::uint64_t creator) {
  auto c = std::make_shared<Coordinator>(hooks(), kind, bundleID, creator);
  coordinators_[bundleID] = c;
  std::erase_if(made_, [](const std::weak_ptr<Coordinator>& w) { return w.expired(); });
  made_.push_back(c);
  return c;
}

void FakeKCDaemon::retire(const CoordinatorRef& c, std::optional<std::uint64_t> cancellingClient) {
  FinishedCoordinator outcome = FinishedCoordinator::of(*c, cancellingClient);
  std::lock_guard lock(mutex_);
  auto it = coordinators_.find(c->bundleID());
  if (it != coordinators_.end() && it->second == c) coordinators_.erase(it);
  history_.record(std::move(outcome));
}

// --- The event thread --------------------------------------------------------------------------

void FakeKCDaemon::post(std::function<void()> work) {
  std::lock_guard lock(mutex_);
  if (stopped_ || !events_) return;
  events_->post([this, work = std::move(work)] {
    if (stopped()) return;
    const FakeKCDaemon* previous = current_;
    current_ = this;
    work();
    current_ = previous;
  });
}

void FakeKCDaemon::drain() {
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

void FakeKCDaemon::hold() {
  std::lock_guard lock(mutex_);
  if (events_) events_->hold();
}

void FakeKCDaemon::release() {
  std::lock_guard lock(mutex_);
  if (events_) events_->release();
}

bool FakeKCDaemon::isHeld() const {
  std::lock_guard lock(mutex_);
  return events_ && events_->isHeld();
}

void FakeKCDaemon::deliver(const Coordinator& c, const DelegateCall& call) {
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

bool FakeKCDaemon::stopped() const {
  std::lock_guard lock(mutex_);
  return stopped_;
}

std::shared_ptr<CallbackThread> FakeKCDaemon::thread() const {
  std::lock_guard lock(mutex_);
  return events_;
}

void FakeKCDaemon::waitForRunningDelivery() {
  if (current_ == this) return;
  if (std::shared_ptr<CallbackThread> events = thread()) events->waitUntilIdle();
}

}  // namespace appsync
