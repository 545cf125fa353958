// Property-list values: dictionary order and indexing, truth values, descriptions.
#include "runtime/plist/value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "runtime/plist/codec.h"

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
  const std::pair<std::optional<bool>, std::vector<Value>> cases[] = {
      {true, {true, -3, 0.5, "YES", "yes", "true", "T", "  \t 7", "-0001"}},
      {false, {false, 0, 0.0, "no", "false", "", "+0", "000", "0.5", "x"}},
      {std::nullopt, {Bytes{1}, Date{1}, Uid{1}, Array{true}, Dict{}, Value::null()}},
  };
  for (const auto& [expected, values] : cases) {
    for (const Value& v : values) EXPECT_EQ(v.truthValue(), expected) << v.describe();
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
      {Value::null(), "<null>"},
  };
  for (const Case& c : cases) EXPECT_EQ(c.value.describe(), c.expected);
}

TEST(ValueTest, IntegersKeepSignedness) {
  EXPECT_EQ(Value(std::numeric_limits<std::uint64_t>::max()).int64(), std::nullopt);
  EXPECT_EQ(Value(-1).uint64(), std::nullopt);
  // The same bits, one signed and one unsigned, are different values.
  EXPECT_NE(Value(Integer{~0ull, false}), Value(Integer{~0ull, true}));
  EXPECT_EQ(Value(std::uint64_t{5}), Value(5));
}

TEST(ValueTest, WritersRefuseNullWhereverItStands) {
  for (const Value& v : {Value::null(), Value(Array{1, Value::null()}),
                         Value(Dict{{"SINF", Value::null()}, {"name", "x"}})}) {
    for (Format format : {Format::Binary, Format::Xml}) {
      std::string error;
      EXPECT_FALSE(write(v, format, &error)) << v.describe();
      EXPECT_NE(error.find("cannot carry null"), std::string::npos) << error;
    }
  }
}

}  // namespace
}  // namespace appsync::plist
