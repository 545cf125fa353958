// The fake home screen: the icon layout it was given, the icon order it reports, and
// termination assertions with scripted outcomes.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "runtime/plist/value.h"
#include "platform/fake/fake_service.h"
#include "platform/pv.h"

namespace appsync {

// A layout given with PVSetIconState that is a property list whose root is an array (pages of
// identifiers, folders as nested arrays) becomes the icon order PVGetFlattenedIconState reports:
// its identifiers in order. Another layout is kept but changes no order.
// Operations: "PVSPavilionBlockableServerPort", "PVSetIconState" (can fail: the error's code as
// status, the layout not taken), "PVGetFlattenedIconState" (can fail: the error's code as
// status, no buffer), "PVSApplicationTerminationAssertionCreateWithError" (outcomes are scripted
// per application with scriptAssertionOutcomes, not with failOperation).
class FakePVHomeScreen final : public PVHomeScreen, public FakeService {
 public:
  // Status of a call made with another port than the home screen's.
  static constexpr int kStatusInvalidPort = 0x10000003;

  explicit FakePVHomeScreen(PVPort port = 0x1707);

  // The icon state PVGetFlattenedIconState hands out; absent: it hands out no buffer.
  void setFlattenedIconState(std::optional<plist::Bytes> bytes);
  // Sets the icon state to a binary property list: an array of these identifiers.
  void setIconOrder(const std::vector<std::string>& identifiers);
  // The flags of the last PVGetFlattenedIconState call (failed calls included); absent before
  // the first.
  std::optional<int> lastFlattenedIconStateFlags() const;
  // The last layout given with PVSetIconState.
  std::optional<plist::Bytes> lastIconState() const;
  std::size_t setIconStateCount() const { return callCount("PVSetIconState"); }
  // Buffers handed out and not yet released by their receiver.
  std::size_t outstandingBuffers() const { return outstanding_->load(); }

  // Outcomes of the next assertion requests for `bundleID`, consumed one per request; once
  // they are used up requests are granted (kPVSAssertionGranted).
  void scriptAssertionOutcomes(const std::string& bundleID, std::vector<std::int32_t> outcomes);
  // Assertions granted and not yet released.
  std::size_t liveAssertions() const { return liveAssertions_->load(); }
  // Assertion requests made for `bundleID`.
  std::size_t assertionRequests(const std::string& bundleID) const;

  // The whole state as a property list, and back (replacing everything, with no events; a
  // missing field is empty). Buffers and assertions handed out are not state: they live in
  // this process. loadState throws StateFormatError naming the bad field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);

  PVPort PVSPavilionBlockableServerPort() override;
  int PVSetIconState(PVPort port, const std::uint8_t* bytes, std::size_t length) override;
  int PVGetFlattenedIconState(PVPort port, int flags, PVBuffer* buffer,
                              std::uint32_t* length) override;
  // Granted: a live assertion. Not found, denied or another code: null.
  std::shared_ptr<PVSAssertion> PVSApplicationTerminationAssertionCreateWithError(
      const std::string& bundleID, int reason, std::int32_t* outcome) override;

 private:
  const PVPort port_;
  mutable std::mutex mutex_;
  std::optional<plist::Bytes> flattened_;
  std::optional<plist::Bytes> lastIconState_;
  std::optional<int> lastFlags_;
  std::map<std::string, std::deque<std::int32_t>> outcomes_;
  std::map<std::string, std::size_t> assertionRequests_;
  // Shared with the buffers and assertions, which may outlive the home screen.
  std::shared_ptr<std::atomic<std::size_t>> outstanding_;
  std::shared_ptr<std::atomic<std::size_t>> liveAssertions_;
};

}  // namespace appsync
