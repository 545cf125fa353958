// System facilities: named notifications with state, the notification center, file time
// stamps, the temporary directory, owner and group, the main bundle identifier, the clock.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "runtime/dispatch/clock.h"
#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync {

// Owner and group given to files and directories the plugin creates ("mobile" on a device).
struct FileAttributes {
  std::optional<std::string> ownerAccountName;
  std::optional<std::string> groupOwnerAccountName;
};

// Callback of the system-wide notification center (center, observer, name, object, info).
using NotificationCallback = void (*)(void* center, void* observer, const std::string& name,
                                      const void* object, const plist::Dict* userInfo);

// The system facilities. Safe from any thread.
class SystemServices {
 public:
  SystemServices() = default;
  virtual ~SystemServices() = default;
  SystemServices(const SystemServices&) = delete;
  SystemServices& operator=(const SystemServices&) = delete;

  // Named notifications with a 64-bit state. Each returns a status: 0 on success; on failure
  // nothing is done and out-parameters are untouched. A token that was never handed out
  // fails. The same name always gives the same token.
  virtual std::uint32_t notifyRegisterCheck(const std::string& name, int* token) = 0;
  virtual std::uint32_t notifySetState(int token, std::uint64_t state) = 0;
  // A state never set reads 0.
  virtual std::uint32_t notifyGetState(int token, std::uint64_t* state) = 0;
  // Also reaches the notification center's observers of `name`.
  virtual std::uint32_t notifyPost(const std::string& name) = 0;

  // The system-wide notification center. Cannot fail. `observer` is not owned; callbacks come
  // on a system thread, never from within the call that posted, with no lock held.
  virtual void addNotificationObserver(void* observer, NotificationCallback callback,
                                       const std::string& name) = 0;
  // An empty `name` removes every name. Once this returns no callback for the removed
  // registrations is running or will run (inside one of them it does not wait for that one).
  virtual void removeNotificationObserver(void* observer, const std::string& name) = 0;

  // Sets access and modification time of `path` to now. 0, or the errno value of the failure.
  virtual int setFileTimesToNow(const std::string& path) = 0;
  // The process's temporary directory (exists). Cannot fail.
  virtual std::string temporaryDirectory() = 0;
  // Gives `path` the owner account and group. False on failure, with *error (when given) set.
  virtual bool setOwnerAndGroup(const std::string& path, const std::string& owner,
                                const std::string& group, ErrorRef* error) = 0;
  // The identifier of the running process's main bundle. Cannot fail.
  virtual std::string mainBundleIdentifier() = 0;
  // Valid for the services' lifetime. Cannot fail.
  virtual Clock& clock() = 0;
};

}  // namespace appsync
