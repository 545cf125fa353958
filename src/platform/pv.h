// The home screen: the icon layout it adopts, the icon order it shows, and termination
// assertions taken before an application is replaced.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

namespace appsync {

using PVPort = std::uint32_t;

// Memory handed over by the home screen's process; releasing it is the receiver's job, done
// when this handle is destroyed.
using PVBuffer = std::unique_ptr<std::uint8_t[], std::function<void(std::uint8_t*)>>;

// Outcome codes of PVSApplicationTerminationAssertionCreateWithError.
inline constexpr std::int32_t kPVSAssertionGranted = 0;
inline constexpr std::int32_t kPVSAssertionDenied = 1;
inline constexpr std::int32_t kPVSAssertionApplicationNotFound = 2;

// Keeps an application from running while it is replaced; released when destroyed.
class PVSAssertion {
 public:
  virtual ~PVSAssertion() = default;
  virtual const std::string& bundleID() const = 0;
};

class PVHomeScreen {
 public:
  virtual ~PVHomeScreen() = default;
  virtual PVPort PVSPavilionBlockableServerPort() = 0;
  // Gives the home screen a new icon layout (opaque bytes). Returns a status.
  virtual int PVSetIconState(PVPort port, const std::uint8_t* bytes, std::size_t length) = 0;
  // The current icon order: a property list whose root is an array of identifiers. On success
  // *buffer owns the bytes and *length is their count; *buffer stays null when there is none.
  virtual int PVGetFlattenedIconState(PVPort port, int flags, PVBuffer* buffer,
                                      std::uint32_t* length) = 0;
  // Takes a termination assertion on the application. *outcome receives one of the outcome
  // codes above (or another error code); the result may be null even on success.
  virtual std::shared_ptr<PVSAssertion> PVSApplicationTerminationAssertionCreateWithError(
      const std::string& bundleID, int reason, std::int32_t* outcome) = 0;
};

}  // namespace appsync
