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

class SystemServices {
 public:
  virtual ~SystemServices() = default;

  // Named notifications with a 64-bit state. Statuses: 0 on success.
  virtual std::uint32_t notifyRegisterCheck(const std::string& name, int* token) = 0;
  virtual std::uint32_t notifySetState(int token, std::uint64_t state) = 0;
  virtual std::uint32_t notifyGetState(int token, std::uint64_t* state) = 0;
  virtual std::uint32_t notifyPost(const std::string& name) = 0;

  // The system-wide notification center. `observer` is not owned; after removal no callback
  // for it is running or will run.
  virtual void addNotificationObserver(void* observer, NotificationCallback callback,
                                       const std::string& name) = 0;
  virtual void removeNotificationObserver(void* observer, const std::string& name) = 0;

  // Sets access and modification time of `path` to now. 0, or the errno value of the failure.
  virtual int setFileTimesToNow(const std::string& path) = 0;
  // The process's temporary directory (exists).
  virtual std::string temporaryDirectory() = 0;
  // Gives `path` the owner account and group; true on success.
  virtual bool setOwnerAndGroup(const std::string& path, const std::string& owner,
                                const std::string& group, ErrorRef* error) = 0;
  // The identifier of the running process's main bundle.
  virtual std::string mainBundleIdentifier() = 0;
  virtual Clock& clock() = 0;
};

}  // namespace appsync
