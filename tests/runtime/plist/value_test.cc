// Property-list values: dictionary order and indexing, truth values, descriptions.
#include "runtime/plist/codec.h"
#include "runtime/plist/value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <vector>

namespace appsync::plist {
namespace {

std::vector<std::string> keysOf(const Dict& dict) {
  std::vector<std::string> keys;
  for (const auto& entry : dict) keys.push_back(entry.key);
  return keys;
}

TEST(DictTest, KeepsOrderThroughReplaceEraseAndIndexing) {
  // 40 keys: past the point where lookups go through the hash index.
  Dict dict;
  std::vector<std::string> expected;
  for (int i = 39; i >= 0; --i) {
    std::string key = std::to_string(i * 7 % 40) + "k";
    dict.set(key, i);
    expected.push_back(key);
  }
  EXPECT_EQ(keysOf(dict), expected);

  // Replacing keeps the position; insertNew refuses an existing key.
  dict.set("7k", "replaced");
  EXPECT_EQ(keysOf(dict), expected);
  EXPECT_EQ(*stringAt(dict, "7k"), "replaced");
  EXPECT_FALSE(dict.insertNew("7k", 1));
  EXPECT_TRUE(dict.insertNew("new", 1));
  expected.push_back("new");

  // Erasing shifts later keys; every lookup still finds the right entry.
  EXPECT_TRUE(dict.erase(expected[3]));
  EXPECT_FALSE(dict.erase("absent"));
  expected.erase(expected.begin() + 3);
  EXPECT_EQ(keysOf(dict), expected);
  for (const std::string& key : expected) {
    ASSERT_NE(dict.find(key), nullptr) << key;
  }
  EXPECT_EQ(dict.find(expected.back())->int64(), 1);

  // Shrinking back below the index threshold and growing again stays consistent.
  while (dict.size() > 5) dict.erase(dict.begin()->key);
  for (int i = 0; i < 20; ++i) dict.set("again" + std::to_string(i), i);
  EXPECT_EQ(dict.size(), 25u);
  EXPECT_EQ(dict.find("again19")->int64(), 19);
  EXPECT_EQ(dict.find(expected[expected.size() - 5])->type(), Type::Integer);
}

TEST(ValueTest, TruthValue) {
  struct Case {
    Value value;
    std::optional<bool> expected;
  };
  const Case cases[] = {
      {true, true},
      {false, false},
      {0, false},
      {-3, true},
      {0.0, false},
      {0.5, true},
      {"YES", true},
      {"yes", true},
      {"true", true},
      {"T", true},
      {"no", false},
      {"false", false},
      {"", false},
      {"  \t 7", true},
      {"-0001", true},
      {"+0", false},
      {"000", false},
      {"0.5", false},
      {"x", false},
      {Bytes{1}, std::nullopt},
      {Date{1}, std::nullopt},
      {Uid{1}, std::nullopt},
      {Array{true}, std::nullopt},
      {Dict{}, std::nullopt},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(c.value.truthValue(), c.expected) << c.value.describe();
  }
}

TEST(ValueTest, Describe) {
  struct Case {
    Value value;
    const char* expected;
  };
  Bytes longData(30, 0xAB);
  const Case cases[] = {
      {true, "1"},
      {std::numeric_limits<std::int64_t>::min(), "-9223372036854775808"},
      {std::numeric_limits<std::uint64_t>::max(), "18446744073709551615"},
      {2.5, "2.5"},
      {std::nan(""), "nan"},
      {"com.example.app", "com.example.app"},
      {"two words \"q\"\n", "\"two words \\\"q\\\"\\n\""},
      {"", "\"\""},
      {Bytes{0x01, 0xFF}, "<2 bytes: 01ff>"},
      {longData, "<30 bytes: abababababababababababababababababababababababab...>"},
      {Date{0}, "2001-01-01 00:00:00 +0000"},
      {Date{-1.5}, "2000-12-31 23:59:58 +0000"},
      {Uid{7}, "<uid 7>"},
      {Array{1, "a b", Array{}}, "(1, \"a b\", ())"},
      {Dict{{"b", 1}, {"a", Dict{{"x", false}}}}, "{b = 1; a = {x = 0;};}"},
  };
  for (const Case& c : cases) EXPECT_EQ(c.value.describe(), c.expected);
}

TEST(ValueTest, IntegersKeepSignedness) {
  Value big(std::numeric_limits<std::uint64_t>::max());
  EXPECT_EQ(big.int64(), std::nullopt);
  EXPECT_EQ(big.uint64(), std::numeric_limits<std::uint64_t>::max());
  Value negative(-1);
  EXPECT_EQ(negative.uint64(), std::nullopt);
  EXPECT_EQ(negative.number(), -1.0);
  // The same bits, one signed and one unsigned, are different values.
  EXPECT_NE(Value(Integer{~0ull, false}), Value(Integer{~0ull, true}));
  EXPECT_EQ(Value(std::uint64_t{5}), Value(5));
}

}  // namespace
}  // namespace appsync::plist

namespace appsync::plist {
namespace {

TEST(NullValueTest, WritersRefuseNullWhereverItStands) {
  const std::vector<Value> values = {
      Value::null(),
      Value(Array{1, Value::null()}),
      Value(Dict{{"SINF", Value::null()}, {"name", "x"}}),
  };
  for (const Value& v : values) {
    SCOPED_TRACE(v.describe());
    std::string error;
    EXPECT_FALSE(writeBinary(v, &error));
    EXPECT_NE(error.find("cannot carry null"), std::string::npos) << error;
    error.clear();
    EXPECT_FALSE(writeXml(v, &error));
    EXPECT_NE(error.find("cannot carry null"), std::string::npos) << error;
  }
  EXPECT_EQ(Value::null().describe(), "<null>");
  EXPECT_TRUE(Value::null().isNull());
  EXPECT_EQ(Value::null().truthValue(), std::nullopt);
}

}  // namespace
}  // namespace appsync::plist
