// The fake home screen.
#include "platform/fake/fake_pv.h"

#include <cstring>
#include <optional>
#include <string>
#include <vector>

#include "runtime/plist/codec.h"

namespace appsync {

namespace {

constexpr std::string_view kPort = "PVSPavilionBlockableServerPort";
constexpr std::string_view kSetIconState = "PVSetIconState";
constexpr std::string_view kGetIconState = "PVGetFlattenedIconState";
constexpr std::string_view kAssertion = "PVSApplicationTerminationAssertionCreateWithError";

class FakeAssertion final : public PVSAssertion {
 public:
  FakeAssertion(std::string bundleID, std::shared_ptr<std::atomic<std::size_t>> live)
      : bundleID_(std::move(bundleID)), live_(std::move(live)) {
    ++*live_;
  }
  ~FakeAssertion() override { --*live_; }
  const std::string& bundleID() const override { return bundleID_; }

 private:
  std::string bundleID_;
  std::shared_ptr<std::atomic<std::size_t>> live_;
};

// The identifiers of a layout, page by page, in order: the strings of an array of pages (each an
// array of identifiers, or of folders that are arrays themselves). Absent when the bytes are
// not such a property list.
std::optional<std::vector<std::string>> flattenLayout(const plist::Bytes& bytes) {
  std::optional<plist::Value> layout = plist::parse(bytes);
  if (!layout || !layout->array()) return std::nullopt;
  std::vector<std::string> identifiers;
  std::vector<const plist::Array*> pending{layout->array()};
  std::vector<std::size_t> positions{0};
  while (!pending.empty()) {
    const plist::Array& current = *pending.back();
    std::size_t& position = positions.back();
    if (position == current.size()) {
      pending.pop_back();
      positions.pop_back();
      continue;
    }
    const plist::Value& item = current[position++];
    if (const std::string* identifier = item.string()) {
      identifiers.push_back(*identifier);
    } else if (const plist::Array* nested = item.array()) {
      pending.push_back(nested);
      positions.push_back(0);
    }
  }
  return identifiers;
}

}  // namespace

FakePVHomeScreen::FakePVHomeScreen(PVPort port)
    : FakeService(
          "FakePVHomeScreen", "PVErrorDomain",
          {{kPort, false}, {kSetIconState, true}, {kGetIconState, true}, {kAssertion, false}}),
      port_(port),
      outstanding_(std::make_shared<std::atomic<std::size_t>>(0)),
      liveAssertions_(std::make_shared<std::atomic<std::size_t>>(0)) {}

void FakePVHomeScreen::setFlattenedIconState(std::optional<plist::Bytes> bytes) {
  std::lock_guard lock(mutex_);
  flattened_ = std::move(bytes);
}

void FakePVHomeScreen::setIconOrder(const std::vector<std::string>& identifiers) {
  plist::Array array;
  for (const std::string& id : identifiers) array.emplace_back(id);
  setFlattenedIconState(plist::writeBinary(plist::Value(std::move(array))));
}

std::optional<plist::Bytes> FakePVHomeScreen::lastIconState() const {
  std::lock_guard lock(mutex_);
  return lastIconState_;
}

void FakePVHomeScreen::scriptAssertionOutcomes(const std::string& bundleID,
                                               std::vector<std::int32_t> outcomes) {
  std::lock_guard lock(mutex_);
  auto& queue = outcomes_[bundleID];
  queue.insert(queue.end(), outcomes.begin(), outcomes.end());
}

std::size_t FakePVHomeScreen::assertionRequests(const std::string& bundleID) const {
  std::lock_guard lock(mutex_);
  auto it = assertionRequests_.find(bundleID);
  return it == assertionRequests_.end() ? 0 : it->second;
}

PVPort FakePVHomeScreen::PVSPavilionBlockableServerPort() {
  beginCall(kPort);
  return port_;
}

int FakePVHomeScreen::PVSetIconState(PVPort port, const std::uint8_t* bytes, std::size_t length) {
  if (ErrorRef failure = beginCall(kSetIconState)) return static_cast<int>(statusFor(failure));
  if (port != port_) return kStatusInvalidPort;
  plist::Bytes layout = length ? plist::Bytes(bytes, bytes + length) : plist::Bytes();
  // The home screen arranges its icons as the layout says, so its icon order follows it.
  if (std::optional<std::vector<std::string>> order = flattenLayout(layout)) setIconOrder(*order);
  std::lock_guard lock(mutex_);
  lastIconState_ = std::move(layout);
  return 0;
}

std::optional<int> FakePVHomeScreen::lastFlattenedIconStateFlags() const {
  std::lock_guard lock(mutex_);
  return lastFlags_;
}

int FakePVHomeScreen::PVGetFlattenedIconState(PVPort port, int flags, PVBuffer* buffer,
                                              std::uint32_t* length) {
  {
    std::lock_guard lock(mutex_);
    lastFlags_ = flags;
  }
  if (ErrorRef failure = beginCall(kGetIconState)) return static_cast<int>(statusFor(failure));
  if (port != port_) return kStatusInvalidPort;
  std::optional<plist::Bytes> bytes;
  {
    std::lock_guard lock(mutex_);
    bytes = flattened_;
  }
  if (!bytes) return 0;
  // Memory of "another process": the receiver must release it, which the counter proves.
  auto* memory = new std::uint8_t[bytes->size()];
  if (!bytes->empty()) std::memcpy(memory, bytes->data(), bytes->size());
  ++*outstanding_;
  *buffer = PVBuffer(memory, [outstanding = outstanding_](std::uint8_t* p) {
    delete[] p;
    --*outstanding;
  });
  *length = static_cast<std::uint32_t>(bytes->size());
  return 0;
}

std::shared_ptr<PVSAssertion> FakePVHomeScreen::PVSApplicationTerminationAssertionCreateWithError(
    const std::string& bundleID, int /*reason*/, std::int32_t* outcome) {
  beginCall(kAssertion);
  std::int32_t code = kPVSAssertionGranted;
  {
    std::lock_guard lock(mutex_);
    ++assertionRequests_[bundleID];
    auto it = outcomes_.find(bundleID);
    if (it != outcomes_.end() && !it->second.empty()) {
      code = it->second.front();
      it->second.pop_front();
    }
  }
  if (outcome) *outcome = code;
  if (code != kPVSAssertionGranted) return nullptr;
  return std::make_shared<FakeAssertion>(bundleID, liveAssertions_);
}

}  // namespace appsync
