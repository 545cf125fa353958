// The fake system facilities.
#include "platform/fake/fake_system.h"

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <map>
#include <mutex>
#include <utility>
#include <vector>

#include "runtime/fs/files.h"

namespace appsync {

namespace {

constexpr std::string_view kRegisterCheck = "notifyRegisterCheck";
constexpr std::string_view kSetState = "notifySetState";
constexpr std::string_view kGetState = "notifyGetState";
constexpr std::string_view kPost = "notifyPost";
constexpr std::string_view kAddObserver = "addNotificationObserver";
constexpr std::string_view kRemoveObserver = "removeNotificationObserver";
constexpr std::string_view kFileTimes = "setFileTimesToNow";
constexpr std::string_view kTemporaryDirectory = "temporaryDirectory";
constexpr std::string_view kOwnerAndGroup = "setOwnerAndGroup";
constexpr std::string_view kMainBundle = "mainBundleIdentifier";
constexpr std::string_view kClock = "clock";

std::optional<uid_t> userID(const std::string& name) {
  std::vector<char> buffer(16384);
  passwd entry{};
  passwd* found = nullptr;
  if (getpwnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found) != 0 || !found) {
    return std::nullopt;
  }
  return found->pw_uid;
}

std::optional<gid_t> groupID(const std::string& name) {
  std::vector<char> buffer(16384);
  group entry{};
  group* found = nullptr;
  if (getgrnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found) != 0 || !found) {
    return std::nullopt;
  }
  return found->gr_gid;
}

// The user and group IDs of the accounts, looked up once per process: each lookup goes through
// the host's account services (a few dozen file opens), and the accounts do not change while
// the process runs.
std::optional<std::pair<uid_t, gid_t>> accountIDs(const std::string& owner,
                                                  const std::string& group) {
  static std::mutex mutex;
  static std::map<std::pair<std::string, std::string>, std::optional<std::pair<uid_t, gid_t>>>
      known;
  std::lock_guard lock(mutex);
  auto [it, inserted] = known.try_emplace({owner, group});
  if (inserted) {
    std::optional<uid_t> uid = userID(owner);
    std::optional<gid_t> gid = groupID(group);
    if (uid && gid) it->second = std::make_pair(*uid, *gid);
  }
  return it->second;
}

}  // namespace

FakeSystemServices::FakeSystemServices(std::filesystem::path root, Clock& clock)
    : FakeService("FakeSystemServices", std::string(kPOSIXErrorDomain),
                  {{kRegisterCheck, true},
                   {kSetState, true},
                   {kGetState, true},
                   {kPost, true},
                   {kAddObserver, false},
                   {kRemoveObserver, false},
                   {kFileTimes, true},
                   {kTemporaryDirectory, false},
                   {kOwnerAndGroup, true},
                   {kMainBundle, false},
                   {kClock, false}}),
      root_(std::move(root)),
      clock_(clock) {
  createDirectories((root_ / "tmp").string());
}

// ---- Named notifications ----------------------------------------------------------------------

FakeSystemServices::Notification* FakeSystemServices::notificationForTokenLocked(int token) {
  auto name = tokenNames_.find(token);
  if (name == tokenNames_.end()) return nullptr;
  auto it = notifications_.find(name->second);
  return it == notifications_.end() ? nullptr : &it->second;
}

std::uint32_t FakeSystemServices::notifyRegisterCheck(const std::string& name, int* token) {
  if (ErrorRef failure = beginCall(kRegisterCheck)) {
    return static_cast<std::uint32_t>(statusFor(failure));
  }
  std::lock_guard lock(mutex_);
  Notification& notification = notifications_[name];
  if (notification.token == 0) {
    notification.token = nextToken_++;
    tokenNames_[notification.token] = name;
  }
  if (token) *token = notification.token;
  return 0;
}

std::uint32_t FakeSystemServices::notifySetState(int token, std::uint64_t state) {
  if (ErrorRef failure = beginCall(kSetState)) {
    return static_cast<std::uint32_t>(statusFor(failure));
  }
  std::lock_guard lock(mutex_);
  Notification* notification = notificationForTokenLocked(token);
  if (!notification) return kNotifyStatusInvalidToken;
  notification->state = state;
  return 0;
}

std::uint32_t FakeSystemServices::notifyGetState(int token, std::uint64_t* state) {
  if (ErrorRef failure = beginCall(kGetState)) {
    return static_cast<std::uint32_t>(statusFor(failure));
  }
  std::lock_guard lock(mutex_);
  Notification* notification = notificationForTokenLocked(token);
  if (!notification) return kNotifyStatusInvalidToken;
  if (state) *state = notification->state.value_or(0);
  return 0;
}

std::uint32_t FakeSystemServices::notifyPost(const std::string& name) {
  if (ErrorRef failure = beginCall(kPost)) return static_cast<std::uint32_t>(statusFor(failure));
  {
    std::lock_guard lock(mutex_);
    Notification& notification = notifications_[name];
    ++notification.posts;
    notification.statesAtPosts.push_back(notification.state);
  }
  postToCenter(name, std::nullopt);
  return 0;
}

std::optional<std::uint64_t> FakeSystemServices::notificationState(const std::string& name) const {
  std::lock_guard lock(mutex_);
  auto it = notifications_.find(name);
  return it == notifications_.end() ? std::nullopt : it->second.state;
}

std::size_t FakeSystemServices::postCount(const std::string& name) const {
  std::lock_guard lock(mutex_);
  auto it = notifications_.find(name);
  return it == notifications_.end() ? 0 : it->second.posts;
}

std::vector<std::optional<std::uint64_t>> FakeSystemServices::statesAtPosts(
    const std::string& name) const {
  std::lock_guard lock(mutex_);
  auto it = notifications_.find(name);
  return it == notifications_.end() ? std::vector<std::optional<std::uint64_t>>()
                                    : it->second.statesAtPosts;
}

// ---- Notification center ----------------------------------------------------------------------

void FakeSystemServices::addNotificationObserver(void* observer, NotificationCallback callback,
                                                 const std::string& name) {
  beginCall(kAddObserver);
  if (!callback) return;
  std::lock_guard lock(mutex_);
  registrations_.push_back({nextRegistration_++, observer, callback, name});
}

void FakeSystemServices::removeNotificationObserver(void* observer, const std::string& name) {
  beginCall(kRemoveObserver);
  {
    std::lock_guard lock(mutex_);
    std::erase_if(registrations_, [&](const Registration& r) {
      return r.observer == observer && (name.empty() || r.name == name);
    });
  }
  // Each delivery looks its registration up right before calling; once the running one is
  // done, no callback for the removed observer can follow.
  callbacks_.waitUntilIdle();
}

std::size_t FakeSystemServices::notificationObserverCount() const {
  std::lock_guard lock(mutex_);
  return registrations_.size();
}

bool FakeSystemServices::postToCenter(const std::string& name,
                                      std::optional<plist::Dict> userInfo) {
  std::vector<std::uint64_t> ids;
  {
    std::lock_guard lock(mutex_);
    for (const Registration& r : registrations_) {
      if (r.name == name) ids.push_back(r.id);
    }
  }
  if (ids.empty()) return false;
  callbacks_.post([this, ids = std::move(ids), name, userInfo = std::move(userInfo)] {
    for (std::uint64_t id : ids) {
      std::optional<Registration> registration;
      {
        std::lock_guard lock(mutex_);
        auto it = std::find_if(registrations_.begin(), registrations_.end(),
                               [&](const Registration& r) { return r.id == id; });
        if (it != registrations_.end()) registration = *it;
      }
      if (registration) {
        registration->callback(this, registration->observer, name, nullptr,
                               userInfo ? &*userInfo : nullptr);
      }
    }
  });
  return true;
}

void FakeSystemServices::postNotification(const std::string& name, const plist::Dict* userInfo) {
  const bool posted =
      postToCenter(name, userInfo ? std::optional<plist::Dict>(*userInfo) : std::nullopt);
  if (posted && !callbacks_.isCurrent()) callbacks_.drain();
}

// ---- Files, accounts, identity, time ----------------------------------------------------------

int FakeSystemServices::setFileTimesToNow(const std::string& path) {
  if (ErrorRef failure = beginCall(kFileTimes)) return static_cast<int>(statusFor(failure));
  if (::utimensat(AT_FDCWD, path.c_str(), nullptr, 0) != 0) return errno;
  return 0;
}

std::string FakeSystemServices::temporaryDirectory() {
  beginCall(kTemporaryDirectory);
  const std::string dir = (root_ / "tmp").string();
  createDirectories(dir);
  return dir;
}

bool FakeSystemServices::setOwnerAndGroup(const std::string& path, const std::string& owner,
                                          const std::string& group, ErrorRef* error) {
  ErrorRef failure = beginCall(kOwnerAndGroup);
  Ownership record{owner, group, false};
  bool ok = true;
  if (failure) {
    setError(error, failure);
    ok = false;
  } else {
    if (std::optional<std::pair<uid_t, gid_t>> ids = accountIDs(owner, group)) {
      if (::chown(path.c_str(), ids->first, ids->second) == 0) {
        record.applied = true;
      } else {
        setError(error, makePOSIXError(errno, path));
        ok = false;
      }
    }
  }
  std::lock_guard lock(mutex_);
  ownerships_[path] = std::move(record);
  return ok;
}

std::optional<FakeSystemServices::Ownership> FakeSystemServices::ownership(
    const std::string& path) const {
  std::lock_guard lock(mutex_);
  auto it = ownerships_.find(path);
  return it == ownerships_.end() ? std::nullopt : std::optional<Ownership>(it->second);
}

std::map<std::string, FakeSystemServices::Ownership> FakeSystemServices::ownerships() const {
  std::lock_guard lock(mutex_);
  return ownerships_;
}

void FakeSystemServices::setMainBundleIdentifier(std::string identifier) {
  std::lock_guard lock(mutex_);
  mainBundleIdentifier_ = std::move(identifier);
}

std::string FakeSystemServices::mainBundleIdentifier() {
  beginCall(kMainBundle);
  std::lock_guard lock(mutex_);
  return mainBundleIdentifier_;
}

Clock& FakeSystemServices::clock() {
  beginCall(kClock);
  return clock_;
}

}  // namespace appsync
