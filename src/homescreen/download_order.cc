// Ordering the packages the host is to transfer by the device's home-screen icon order, and
// keeping a copy of that order on disk.
#include <algorithm>
#include <set>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {

namespace {

// The value the client always passes when it asks for the flattened icon state.
constexpr int kFlattenedIconStateFlags = 1;

// Fetches the home screen's icon order, saves its bytes as the sort-order file and parses them.
// Absent when the home screen gave none or it is not a property list whose root is an array.
std::optional<plist::Array> fetchIconOrder(const Platform& platform, const LogCategory& log) {
  const PVPort port = platform.pv.PVSPavilionBlockableServerPort();
  PVBuffer buffer;  // released when it goes out of scope, on every path
  std::uint32_t length = 0;
  platform.pv.PVGetFlattenedIconState(port, kFlattenedIconStateFlags, &buffer, &length);
  if (!buffer) {
    pluginLog(log, LogLevel::Default, "%s|got no icon sort order from PV");
    return std::nullopt;
  }
  const plist::Bytes bytes(buffer.get(), buffer.get() + length);
  buffer.reset();
  pluginLog(log, LogLevel::Default, "%s|saved icon sort order");
  // Kept for diagnosis only; nothing reads it back, so a failed write changes nothing.
  writeFileAtomically(platform.paths.assetSortOrder(), bytes);
  std::optional<plist::Value> order = plist::parse(bytes);
  if (!order || !order->array()) return std::nullopt;
  return std::move(*order->array());
}

}  // namespace

plist::Array AppsClient::_orderTheItems(const Platform& platform, plist::Dict& items) {
  const LogCategory& log = platform.tr.TRGetLogCategory(kAppSyncLogCategory);
  plist::Array result;
  result.reserve(items.size());

  if (std::optional<plist::Array> order = fetchIconOrder(platform, log)) {
    std::set<std::string_view> placed;
    for (const plist::Value& entry : *order) {
      const std::string* identifier = entry.string();
      if (!identifier) continue;
      plist::Value* item = items.find(*identifier);
      // An identifier listed twice is placed by its first listing.
      if (!item || !placed.insert(*identifier).second) continue;
      pluginLog(log, LogLevel::Default, "%s|prioritize %{public}@", *identifier);
      result.push_back(std::move(*item));
    }
    // The placed items leave `items` at once: erasing them one by one would re-index it each time.
    if (!placed.empty()) {
      plist::Dict unplaced;
      for (plist::Dict::Entry& entry : items) {
        if (!placed.contains(entry.key)) unplaced.set(std::move(entry.key), std::move(entry.value));
      }
      items = std::move(unplaced);
    }
  }

  // Everything the home screen does not list follows, in identifier order so that the same
  // request always gives the same order. These stay with the caller.
  std::vector<const plist::Dict::Entry*> rest;
  rest.reserve(items.size());
  for (const plist::Dict::Entry& entry : items) rest.push_back(&entry);
  std::sort(rest.begin(), rest.end(), [](const auto* a, const auto* b) { return a->key < b->key; });
  for (const plist::Dict::Entry* entry : rest) {
    pluginLog(log, LogLevel::Default, "%s|lastly %{public}@", entry->key);
    result.push_back(entry->value);
  }
  return result;
}

}  // namespace appsync
