// Reading hand-written YAML: each reader takes what it promises, refuses the rest naming the
// file, the line and the field, and property lists come out with the types people mean.
#include "yaml_input.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <string>

#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync::host {
namespace {

// What a reader made of a value ("" when it failed) and the error it gave ("" when none).
struct Outcome {
  std::string value;
  std::string error;
};

Outcome readWith(const std::string& document,
                 const std::function<std::string(const YamlField&)>& reader) {
  try {
    return {reader(YamlField::loadText(document, "in.yaml")), ""};
  } catch (const InputError& e) {
    return {"", e.what()};
  }
}

TEST(YamlInputTest, ScalarReadersTakeWhatTheyPromiseAndNameTheFieldOtherwise) {
  const auto integer = [](const YamlField& f) { return std::to_string(f["v"].integer()); };
  const auto natural = [](const YamlField& f) { return std::to_string(f["v"].unsignedInteger()); };
  const auto real = [](const YamlField& f) { return std::to_string(f["v"].real()); };
  const auto boolean = [](const YamlField& f) { return f["v"].boolean() ? "yes" : "no"; };
  const auto duration = [](const YamlField& f) {
    return std::to_string(
        std::chrono::duration_cast<std::chrono::milliseconds>(f["v"].duration()).count());
  };
  const auto text = [](const YamlField& f) { return f["v"].string(); };
  const auto nested = [](const YamlField& f) {
    return std::to_string(f["a"].items().at(1)["b"].unsignedInteger());
  };
  struct Row {
    std::string document;
    std::function<std::string(const YamlField&)> reader;
    Outcome expected;
  };
  const Row rows[] = {
      {"v: 9223372036854775808", integer, {"", "in.yaml:1: v: expected an integer"}},
      {"v: 0x1F", integer, {"31", ""}},
      {"v: 18446744073709551616", natural, {"", "in.yaml:1: v: expected an unsigned integer"}},
      {"v: 1e400", real, {"", "in.yaml:1: v: expected a number"}},
      {"v: yes", boolean, {"", "in.yaml:1: v: expected true or false, found \"yes\""}},
      {"v: 1500ms", duration, {"1500", ""}},
      {"v: -1s", duration, {"", "in.yaml:1: v: the duration must be between"}},
      {"v: 3 days", duration, {"", "in.yaml:1: v: expected a duration such as 30s"}},
      {"v: a\xff", text, {"", "in.yaml:1: v: the text is not valid UTF-8"}},
      {"a:\n  - b: 1\n  - b: -4\n", nested, {"", "in.yaml:3: a[1].b: expected an unsigned"}},
      {"a:\n  - b: 1\n  - c: 4\n", nested, {"", "in.yaml:3: a[1]: the field \"b\" is missing"}},
  };
  for (const Row& row : rows) {
    const Outcome got = readWith(row.document, row.reader);
    EXPECT_EQ(got.value, row.expected.value) << row.document;
    EXPECT_EQ(got.error.substr(0, row.expected.error.size()), row.expected.error) << got.error;
    EXPECT_EQ(got.error.empty(), row.expected.error.empty()) << got.error;
  }
}

TEST(YamlInputTest, PropertyListsHaveTheTypesPeopleMean) {
  plist::Dict both;
  both.set("b", plist::Integer::fromSigned(1));
  both.set("a", "x");
  struct Row {
    std::string document;
    std::optional<plist::Value> expected;  // absent: refused with `error`
    std::string error = "";
  };
  const Row rows[] = {
      {"v: 1.0", plist::Value("1.0")},
      {"v: !data AAEC", plist::Value(plist::Bytes{0, 1, 2})},
      {"v: !data '%%'", std::nullopt, "in.yaml:1: v: expected base64 data"},
      {"v: {b: 1, a: x}", plist::Value(both)},
      {"v:\n  - a\n  - ~\n", std::nullopt, "in.yaml:3: v[1]: a property list has no null"},
      {"v: {a: 1, a: 2}", std::nullopt, "in.yaml:1: v.a: the key \"a\" appears twice"},
      {"v: {k\xff: 1}", std::nullopt, "in.yaml:1: v: the key is not valid UTF-8"},
      {"v: &x [*x]", std::nullopt, ""},
  };
  for (const Row& row : rows) {
    const Outcome got = readWith(row.document, [&](const YamlField& f) {
      const plist::Value value = f["v"].plist();
      return row.expected && value == *row.expected ? std::string("same") : value.describe();
    });
    EXPECT_EQ(got.value, row.expected ? "same" : "") << row.document << "\n  " << got.error;
    EXPECT_TRUE(got.error.starts_with(row.error)) << row.document << "\n  error: " << got.error;
  }
}

TEST(YamlInputTest, DocumentsThatCannotBeReadSayWhereAndWhy) {
  testing::TempDir dir;
  testing::writeText(dir.path() / "broken.yaml", "steps:\n  - call: [x\n");
  testing::writeText(dir.path() / "typo.yaml", "steps:\n  - call: x\n    tmes: 2\n");
  const auto typo = [](const YamlField& root) {
    root["steps"].items().at(0).allowOnly({"call", "times"});
  };
  struct Row {
    std::string file;
    std::function<void(const YamlField&)> use;
    std::string error;
  };
  const Row rows[] = {
      {"broken.yaml", nullptr, "broken.yaml:3: not valid YAML"},
      {"typo.yaml", typo,
       "typo.yaml:3: steps[0].tmes: unknown field \"tmes\" (expected one of: "
       "call, times)"},
      {"missing.yaml", nullptr, "missing.yaml: cannot read the file"},
      // A device file without end is refused before it fills the memory.
      {"/dev/zero", nullptr, "/dev/zero: larger than"},
  };
  for (const Row& row : rows) {
    const bool absolute = row.file.starts_with('/');
    EXPECT_THAT(
        [&] {
          const YamlField root = YamlField::loadFile(absolute ? row.file : dir / row.file);
          if (row.use) row.use(root);
        },
        ::testing::ThrowsMessage<InputError>(
            ::testing::StartsWith(absolute ? row.error : dir / row.error)));
  }
}

}  // namespace
}  // namespace appsync::host
