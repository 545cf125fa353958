// The fake system facilities: named notifications with state, a notification center that
// delivers on its own thread, file times, a temporary directory under the device root, owner
// and group, the main bundle identifier and an injected clock.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/callback_thread.h"
#include "platform/fake/fake_service.h"
#include "platform/system.h"

namespace appsync {

// Operations, and how a scripted failure shows:
//   "notifyRegisterCheck", "notifySetState", "notifyGetState", "notifyPost": the error's code
//       as status, nothing done
//   "setFileTimesToNow": the error's code as the errno value
//   "setOwnerAndGroup": false and the error (the call is still recorded)
//   "addNotificationObserver", "removeNotificationObserver", "temporaryDirectory",
//   "mainBundleIdentifier", "clock": cannot fail
//
// A named notification posted with notifyPost also reaches the notification center's observers
// of that name, asynchronously, as on the device where both are one system.
class FakeSystemServices final : public SystemServices, public FakeService {
 public:
  // Status of notifySetState/notifyGetState with a token that was never handed out.
  static constexpr std::uint32_t kNotifyStatusInvalidToken = 2;
  static constexpr const char* kDefaultMainBundleIdentifier = "com.vantor.appsync.tests";

  struct Ownership {
    std::string owner;
    std::string group;
    bool applied = false;  // chown ran (both accounts exist on this machine) and succeeded
  };

  // `root`: the device root (the temporary directory is ROOT/tmp). `clock` must outlive this.
  FakeSystemServices(std::filesystem::path root, Clock& clock);

  // ---- Test API ----

  // The state of a named notification; absent while no token of that name has a state.
  std::optional<std::uint64_t> notificationState(const std::string& name) const;
  std::size_t postCount(const std::string& name) const;
  // The state at the moment of each post of `name`, in order (absent: no state then).
  std::vector<std::optional<std::uint64_t>> statesAtPosts(const std::string& name) const;

  // Delivers `name` to the center's matching observers on the callback thread and returns after
  // delivery (at once when called from the callback thread itself; never while it is held).
  void postNotification(const std::string& name, const plist::Dict* userInfo = nullptr);
  std::size_t notificationObserverCount() const;
  void drain() { callbacks_.drain(); }
  CallbackThread& callbackThread() { return callbacks_; }

  // What setOwnerAndGroup was last asked for `path`.
  std::optional<Ownership> ownership(const std::string& path) const;
  std::map<std::string, Ownership> ownerships() const;

  void setMainBundleIdentifier(std::string identifier);

  // The named notifications (states, tokens, posts), ownerships and the main bundle identifier
  // as a property list, and back, replacing them with no events. Observer registrations are not
  // state: they live in this process and are kept. A missing field is empty, but a missing main
  // bundle identifier leaves the current one. loadState throws StateFormatError naming the bad
  // field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);

  // ---- SystemServices ----

  std::uint32_t notifyRegisterCheck(const std::string& name, int* token) override;
  std::uint32_t notifySetState(int token, std::uint64_t state) override;
  std::uint32_t notifyGetState(int token, std::uint64_t* state) override;
  std::uint32_t notifyPost(const std::string& name) override;
  void addNotificationObserver(void* observer, NotificationCallback callback,
                               const std::string& name) override;
  // An empty name removes the observer's registrations of every name.
  void removeNotificationObserver(void* observer, const std::string& name) override;
  int setFileTimesToNow(const std::string& path) override;
  std::string temporaryDirectory() override;
  bool setOwnerAndGroup(const std::string& path, const std::string& owner, const std::string& group,
                        ErrorRef* error) override;
  std::string mainBundleIdentifier() override;
  Clock& clock() override;

 private:
  struct Registration {
    std::uint64_t id;
    void* observer;
    NotificationCallback callback;
    std::string name;
  };
  struct Notification {
    int token = 0;
    std::optional<std::uint64_t> state;
    std::size_t posts = 0;
    std::vector<std::optional<std::uint64_t>> statesAtPosts;
  };

  // Queues delivery of `name` to the observers registered for it now; false when there are none.
  bool postToCenter(const std::string& name, std::optional<plist::Dict> userInfo);
  Notification* notificationForTokenLocked(int token);

  const std::filesystem::path root_;
  Clock& clock_;
  mutable std::mutex mutex_;
  std::map<std::string, Notification> notifications_;
  std::map<int, std::string> tokenNames_;
  int nextToken_ = 1;
  std::vector<Registration> registrations_;
  std::uint64_t nextRegistration_ = 1;
  std::map<std::string, Ownership> ownerships_;
  std::string mainBundleIdentifier_ = kDefaultMainBundleIdentifier;
  CallbackThread callbacks_{"fake-notify"};  // last: stops first
};

}  // namespace appsync
