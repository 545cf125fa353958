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

// Keeps an application from running while it is replaced; released when the last reference goes. It
// may outlive the home screen. Safe from any thread.
class PVSAssertion {
 public:
  PVSAssertion() = default;
  virtual ~PVSAssertion() = default;
  PVSAssertion(const PVSAssertion&) = delete;
  PVSAssertion& operator=(const PVSAssertion&) = delete;

  // Cannot fail; valid for the assertion's lifetime.
  virtual const std::string& bundleID() const = 0;
};

// The home screen. Safe from any thread. Statuses are 0 on success; a call with another port than
// PVSPavilionBlockableServerPort's fails.
class PVHomeScreen {
 public:
  PVHomeScreen() = default;
  virtual ~PVHomeScreen() = default;
  PVHomeScreen(const PVHomeScreen&) = delete;
  PVHomeScreen& operator=(const PVHomeScreen&) = delete;

  // Cannot fail.
  virtual PVPort PVSPavilionBlockableServerPort() = 0;
  // Gives the home screen a new icon layout (opaque bytes, copied). Returns a status; on
  // failure the layout is not taken.
  virtual int PVSetIconState(PVPort port, const std::uint8_t* bytes, std::size_t length) = 0;
  // The current icon order: a property list whose root is an array of identifiers. On success
  // *buffer owns the bytes (the caller releases them) and *length is their count; *buffer
  // stays null when there is none. Returns a status; on failure *buffer is untouched.
  virtual int PVGetFlattenedIconState(PVPort port, int flags, PVBuffer* buffer,
                                      std::uint32_t* length) = 0;
  // Takes a termination assertion on the application, owned by the caller. *outcome (when
  // given) receives one of the outcome codes above or another error code; the result is null
  // unless the assertion was granted, and may be null even then.
  virtual std::shared_ptr<PVSAssertion> PVSApplicationTerminationAssertionCreateWithError(
      const std::string& bundleID, int reason, std::int32_t* outcome) = 0;
};

}  // namespace appsync
