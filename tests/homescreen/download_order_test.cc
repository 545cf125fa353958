// Ordering downloads by the home screen's icon order: placement, what stays with the caller,
// the saved copy of the order, released buffers and the exact messages.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "client/apps_client.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "platform/fake/fake_platform.h"
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

Ids prefixed(const Ids& messages) {
  Ids out;
  for (const std::string& m : messages) out.push_back("com.vantor.trc.AppSync|" + m);
  return out;
}

TEST(DownloadOrderTest, PlacesItemsByIconOrderThenTheRestByIdentifier) {
  struct Case {
    const char* name;
    std::optional<plist::Bytes> iconState;  // absent: the home screen hands out no buffer
    Ids items;                              // insertion order of the caller's dictionary
    Ids expectedOrder;
    Ids expectedLeft;
    Ids expectedMessages;
    bool homeScreenFails = false;
    bool workAreaExists = true;
  };
  const Case cases[] = {
      {.name = "listed twice, unknown ids and non-strings are passed over",
       .iconState = binaryArray({"com.c", 5, "com.x", "com.a", "com.c"}),
       .items = {"com.d", "com.c", "com.b", "com.a"},
       .expectedOrder = {"com.c", "com.a", "com.b", "com.d"},
       .expectedLeft = {"com.d", "com.b"},
       .expectedMessages = {"saved icon sort order", "prioritize com.c", "prioritize com.a",
                            "lastly com.b", "lastly com.d"}},
      {.name = "every item listed",
       .iconState = binaryArray({"com.b", "com.a"}),
       .items = {"com.a", "com.b"},
       .expectedOrder = {"com.b", "com.a"},
       .expectedLeft = {},
       .expectedMessages = {"saved icon sort order", "prioritize com.b", "prioritize com.a"}},
      {.name = "no icon order",
       .iconState = std::nullopt,
       .items = {"com.b", "com.a"},
       .expectedOrder = {"com.a", "com.b"},
       .expectedLeft = {"com.b", "com.a"},
       .expectedMessages = {"got no icon sort order from PV", "lastly com.a", "lastly com.b"}},
      {.name = "home screen fails",
       .iconState = binaryArray({"com.a"}),
       .items = {"com.b", "com.a"},
       .expectedOrder = {"com.a", "com.b"},
       .expectedLeft = {"com.b", "com.a"},
       .expectedMessages = {"got no icon sort order from PV", "lastly com.a", "lastly com.b"},
       .homeScreenFails = true},
      {.name = "order that does not parse",
       .iconState = text("<plist><array><string>com.a</array>"),
       .items = {"com.b", "com.a"},
       .expectedOrder = {"com.a", "com.b"},
       .expectedLeft = {"com.b", "com.a"},
       .expectedMessages = {"saved icon sort order", "lastly com.a", "lastly com.b"}},
      {.name = "order that is not an array",
       .iconState = plist::writeBinary(plist::Value(plist::Dict{{"com.a", 1}})).value(),
       .items = {"com.a"},
       .expectedOrder = {"com.a"},
       .expectedLeft = {"com.a"},
       .expectedMessages = {"saved icon sort order", "lastly com.a"}},
      {.name = "empty order",
       .iconState = plist::Bytes{},
       .items = {"com.a"},
       .expectedOrder = {"com.a"},
       .expectedLeft = {"com.a"},
       .expectedMessages = {"saved icon sort order", "lastly com.a"}},
      {.name = "no items",
       .iconState = binaryArray({"com.a"}),
       .items = {},
       .expectedOrder = {},
       .expectedLeft = {},
       .expectedMessages = {"saved icon sort order"}},
      {.name = "sort-order file cannot be written",
       .iconState = binaryArray({"com.b"}),
       .items = {"com.a", "com.b"},
       .expectedOrder = {"com.b", "com.a"},
       .expectedLeft = {"com.a"},
       .expectedMessages = {"saved icon sort order", "prioritize com.b", "lastly com.a"},
       .workAreaExists = false},
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
    for (const std::string& id : c.items) {
      items.set(id, plist::Dict{{"identifier", id}, {"url", "https://host/" + id}});
    }

    const plist::Array ordered = AppsClient::_orderTheItems(device.platform(), items);

    EXPECT_EQ(identifiersOf(ordered), c.expectedOrder);
    EXPECT_EQ(keysOf(items), c.expectedLeft);
    // Records come back whole, not just their identifiers.
    for (const plist::Value& record : ordered) {
      const std::string* id = plist::stringAt(*record.dict(), "identifier");
      EXPECT_EQ(*plist::stringAt(*record.dict(), "url"), "https://host/" + *id);
    }
    EXPECT_EQ(device.log().messages(), prefixed(c.expectedMessages));
    for (const auto& line : device.log().lines()) EXPECT_EQ(line.level, LogLevel::Default);
    EXPECT_EQ(device.pv().outstandingBuffers(), 0u);
    const bool saved = c.iconState && !c.homeScreenFails && c.workAreaExists;
    EXPECT_EQ(readFile(device.paths().assetSortOrder()),
              saved ? c.iconState : std::optional<plist::Bytes>());
    // Ordering never creates the work area.
    if (!c.workAreaExists) {
      EXPECT_FALSE(directoryExists(device.paths().workArea()));
    }
  }
}

}  // namespace
}  // namespace appsync
