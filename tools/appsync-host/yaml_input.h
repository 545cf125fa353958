// Reading the YAML that people write for appsync-host (device descriptions, replay scripts):
// a node that knows its file, line and field path, so that every mistake is reported where it
// is ("script.yaml:14: steps[3].times: expected an unsigned integer").
#pragma once

#include <yaml-cpp/yaml.h>

#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "input_error.h"
#include "runtime/dispatch/clock.h"
#include "runtime/plist/value.h"

namespace appsync::host {

class YamlField {
 public:
  // Parses a whole file or text. Malformed YAML, a missing or unreadable file, and documents
  // larger than kMaxYamlSize are InputErrors.
  static YamlField loadFile(const std::string& path);
  static YamlField loadText(std::string_view text, const std::string& name);
  static constexpr std::size_t kMaxYamlSize = 16 * 1024 * 1024;

  YamlField(YAML::Node node, std::shared_ptr<const std::string> file, std::string path);

  const std::string& file() const { return *file_; }
  // The field's path from the document root: "steps[3].asset.identifier" ("" for the root).
  const std::string& path() const { return path_; }
  // 1-based line of the node in its file.
  int line() const;
  [[noreturn]] void fail(const std::string& message) const;

  bool isMap() const { return node_.IsMap(); }
  bool isSequence() const { return node_.IsSequence(); }
  bool isScalar() const { return node_.IsScalar(); }
  bool isNull() const { return node_.IsNull(); }
  const YAML::Node& node() const { return node_; }

  // Mappings. operator[] fails when the key is missing or this is not a mapping.
  bool has(std::string_view key) const;
  YamlField operator[](std::string_view key) const;
  std::optional<YamlField> optional(std::string_view key) const;
  // Fails on a key outside `keys` (naming it and the allowed ones).
  void allowOnly(std::initializer_list<std::string_view> keys) const;
  void allowOnly(const std::vector<std::string>& keys) const;
  // Entries in document order; keys must be scalars.
  std::vector<std::pair<std::string, YamlField>> entries() const;

  // Sequences (a missing or null field is an empty one when read through optional()).
  std::vector<YamlField> items() const;

  // Scalars.
  std::string string() const;
  std::int64_t integer() const;
  std::uint64_t unsignedInteger() const;
  double real() const;
  bool boolean() const;
  std::vector<std::string> strings() const;
  // "30s", "1500ms", "2m", "1h", or a bare number of seconds.
  Duration duration() const;

  // The value as a property list: mappings are dictionaries (key order kept), sequences arrays.
  // A plain scalar is a boolean (true/false), an integer (decimal, or 0x hexadecimal), or else a
  // string (so 1.0 is the text "1.0"); a quoted scalar is always a string. Tags
  // force a type: !string, !int, !uint (up to 2^64-1), !real, !bool, !data (base64),
  // !date (YYYY-MM-DDTHH:MM:SSZ). A null is refused: property lists have none.
  plist::Value plist() const;

 private:
  // `key`: the mapping key the node is the value of, whose line an empty value reports.
  YamlField child(YAML::Node node, std::string path, const YAML::Node* key = nullptr) const;
  std::string scalar(std::string_view expected) const;

  YAML::Node node_;
  std::shared_ptr<const std::string> file_;
  std::string path_;
  int keyLine_ = 0;
};

}  // namespace appsync::host
