// Ordering downloads by the home screen's icon order: placement, what stays with the caller,
// the saved copy of the order, released buffers and the exact messages.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

using Ids = std::vector<std::string>;

plist::Bytes binaryArray(plist::Array array) {
  return plist::writeBinary(plist::Value(std::move(array))).value();
}

plist::Bytes text(std::string_view s) { return plist::Bytes(s.begin(), s.end()); }

Ids identifiersOf(const plist::Array& records) {
  Ids ids;
  for (const plist::Value& record : records) {
    const plist::Dict* dict = record.dict();
    const std::string* id = dict ? plist::stringAt(*dict, "identifier") : nullptr;
    ids.push_back(id ? *id : "?");
  }
  return ids;
}

Ids keysOf(const plist::Dict& items) {
  Ids keys;
  for (const auto& entry : items) keys.push_back(entry.key);
  return keys;
}

// The parts of `text` between `separator`s.
Ids split(std::string_view text, char separator) {
  Ids parts;
  while (!text.empty()) {
    const std::size_t end = std::min(text.find(separator), text.size());
    parts.emplace_back(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
  }
  return parts;
}

TEST(DownloadOrderTest, PlacesItemsByIconOrderThenTheRestByIdentifier) {
  const std::string saved = "saved icon sort order|", none = "got no icon sort order from PV|";
  struct Case {
    const char* name;
    std::optional<plist::Bytes> iconState;  // absent: the home screen hands out no buffer
    const char* items;                      // insertion order of the caller's dictionary
    const char* order;
    const char* left;
    std::string messages;  // separated by '|'
    bool homeScreenFails = false, workAreaExists = true;
  };
  const Case cases[] = {
      {"listed twice, unknown ids and non-strings are passed over",
       binaryArray({"com.c", 5, "com.x", "com.a", "com.c"}), "com.d com.c com.b com.a",
       "com.c com.a com.b com.d", "com.d com.b",
       saved + "prioritize com.c|prioritize com.a|lastly com.b|lastly com.d"},
      {"every item listed", binaryArray({"com.b", "com.a"}), "com.a com.b", "com.b com.a", "",
       saved + "prioritize com.b|prioritize com.a"},
      {"no icon order", std::nullopt, "com.b com.a", "com.a com.b", "com.b com.a",
       none + "lastly com.a|lastly com.b"},
      {"home screen fails", binaryArray({"com.a"}), "com.b com.a", "com.a com.b", "com.b com.a",
       none + "lastly com.a|lastly com.b", true},
      {"order that does not parse", text("<plist><array><string>com.a</array>"), "com.b com.a",
       "com.a com.b", "com.b com.a", saved + "lastly com.a|lastly com.b"},
      {"order that is not an array", plist::writeBinary(plist::Dict{{"com.a", 1}}), "com.a",
       "com.a", "com.a", saved + "lastly com.a"},
      {"empty order", plist::Bytes{}, "com.a", "com.a", "com.a", saved + "lastly com.a"},
      {"no items", binaryArray({"com.a"}), "", "", "", saved},
      {"sort-order file cannot be written", binaryArray({"com.b"}), "com.a com.b", "com.b com.a",
       "com.a", saved + "prioritize com.b|lastly com.a", false, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir root;
    FakePlatform device(root.path());
    if (c.workAreaExists) {
      ASSERT_TRUE(createDirectories(device.paths().workArea()));
    }
    device.pv().setFlattenedIconState(c.iconState);
    if (c.homeScreenFails) device.pv().failOperation("PVGetFlattenedIconState");
    plist::Dict items;
    for (const std::string& id : split(c.items, ' ')) {
      items.set(id, plist::Dict{{"identifier", id}, {"url", "https://host/" + id}});
    }

    const plist::Array ordered = AppsClient::_orderTheItems(device.platform(), items);

    EXPECT_EQ(identifiersOf(ordered), split(c.order, ' '));
    EXPECT_EQ(keysOf(items), split(c.left, ' '));
    // Records come back whole, not just their identifiers.
    for (const plist::Value& record : ordered) {
      const std::string* id = plist::stringAt(*record.dict(), "identifier");
      EXPECT_EQ(*plist::stringAt(*record.dict(), "url"), "https://host/" + *id);
    }
    Ids expected;
    for (const std::string& m : split(c.messages, '|')) {
      expected.push_back("com.vantor.trc.AppSync|" + m);
    }
    EXPECT_EQ(device.log().messages(), expected);
    for (const auto& line : device.log().lines()) EXPECT_EQ(line.level, LogLevel::Default);
    EXPECT_EQ(device.pv().outstandingBuffers(), 0u);
    EXPECT_EQ(device.pv().lastFlattenedIconStateFlags(), 1);  // the client always asks with 1
    const bool isSaved = c.iconState && !c.homeScreenFails && c.workAreaExists;
    EXPECT_EQ(readFile(device.paths().assetSortOrder()),
              isSaved ? c.iconState : std::optional<plist::Bytes>());
    // Ordering never creates the work area.
    EXPECT_EQ(directoryExists(device.paths().workArea()), c.workAreaExists);
  }
}

}  // namespace
}  // namespace appsync
