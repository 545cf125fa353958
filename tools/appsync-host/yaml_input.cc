// YAML as people write it for appsync-host, read with errors that say where.
#include "yaml_input.h"

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <limits>
#include <sstream>

#include "runtime/plist/text_encoding.h"

namespace appsync::host {

namespace {

// Aliases let a small document describe a huge tree; conversion to a property list stops here.
constexpr std::size_t kMaxPlistNodes = 1'000'000;
constexpr int kMaxDepth = 512;

std::string joinKeys(const std::vector<std::string>& keys) {
  std::string out;
  for (const auto& key : keys) out += (out.empty() ? "" : ", ") + key;
  return out;
}

std::optional<std::uint64_t> parseUnsigned(const std::string& text) {
  if (text.empty() || text[0] == '-' || text[0] == '+' || text.find(' ') != std::string::npos) {
    return std::nullopt;
  }
  const bool hex = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
  errno = 0;
  char* end = nullptr;
  const unsigned long long value = std::strtoull(text.c_str(), &end, hex ? 16 : 10);
  if (errno != 0 || end != text.c_str() + text.size()) return std::nullopt;
  return value;
}

std::optional<std::int64_t> parseSigned(const std::string& text) {
  if (!text.empty() && text[0] == '-') {
    auto magnitude = parseUnsigned(text.substr(1));
    if (!magnitude || *magnitude > static_cast<std::uint64_t>(INT64_MAX) + 1) return std::nullopt;
    return static_cast<std::int64_t>(0 - *magnitude);
  }
  auto value = parseUnsigned(text);
  if (!value || *value > static_cast<std::uint64_t>(INT64_MAX)) return std::nullopt;
  return static_cast<std::int64_t>(*value);
}

std::optional<double> parseReal(const std::string& text) {
  if (text.empty() || text.find(' ') != std::string::npos) return std::nullopt;
  errno = 0;
  char* end = nullptr;
  const double value = std::strtod(text.c_str(), &end);
  if (errno != 0 || end != text.c_str() + text.size() || !std::isfinite(value)) return std::nullopt;
  return value;
}

}  // namespace

YamlField YamlField::loadText(std::string_view text, const std::string& name) {
  auto file = std::make_shared<const std::string>(name);
  if (text.size() > kMaxYamlSize) {
    throw InputError(name, 0, "", "larger than " + std::to_string(kMaxYamlSize) + " bytes");
  }
  try {
    return YamlField(YAML::Load(std::string(text)), file, "");
  } catch (const YAML::Exception& e) {
    throw InputError(name, e.mark.is_null() ? 0 : e.mark.line + 1, "", "not valid YAML: " + e.msg);
  }
}

YamlField YamlField::loadFile(const std::string& path) {
  std::error_code ec;
  if (std::filesystem::is_directory(path, ec)) {
    throw InputError(path, 0, "", "cannot read the file: it is a directory");
  }
  std::ifstream in(path, std::ios::binary);
  if (!in) throw InputError(path, 0, "", "cannot read the file: " + std::string(strerror(errno)));
  // Read in pieces and stop past the limit: a file without end (a device, a pipe) must not fill
  // the memory before the size is checked.
  std::string text;
  char piece[64 * 1024];
  while (in.read(piece, sizeof piece) || in.gcount() > 0) {
    text.append(piece, static_cast<std::size_t>(in.gcount()));
    if (text.size() > kMaxYamlSize) {
      throw InputError(path, 0, "", "larger than " + std::to_string(kMaxYamlSize) + " bytes");
    }
  }
  if (in.bad()) throw InputError(path, 0, "", "cannot read the file");
  return loadText(text, path);
}

YamlField::YamlField(YAML::Node node, std::shared_ptr<const std::string> file, std::string path)
    : node_(std::move(node)), file_(std::move(file)), path_(std::move(path)) {}

int YamlField::line() const {
  // An empty value has no place of its own: the parser puts it at the next token, often on the
  // next line. Its key's line is where the reader looks.
  if (keyLine_ > 0 && node_.IsNull()) return keyLine_;
  const YAML::Mark mark = node_.Mark();
  return mark.is_null() ? keyLine_ : mark.line + 1;
}

void YamlField::fail(const std::string& message) const {
  throw InputError(*file_, line(), path_, message);
}

YamlField YamlField::child(YAML::Node node, std::string path, const YAML::Node* key) const {
  YamlField field(std::move(node), file_, std::move(path));
  if (key != nullptr && !key->Mark().is_null()) field.keyLine_ = key->Mark().line + 1;
  return field;
}

bool YamlField::has(std::string_view key) const {
  return node_.IsMap() && node_[std::string(key)].IsDefined();
}

YamlField YamlField::operator[](std::string_view key) const {
  if (!node_.IsMap()) fail("expected a mapping with the field \"" + std::string(key) + "\"");
  auto found = optional(key);
  if (!found) fail("the field \"" + std::string(key) + "\" is missing");
  return *found;
}

std::optional<YamlField> YamlField::optional(std::string_view key) const {
  if (!node_.IsMap()) return std::nullopt;
  for (const auto& entry : node_) {
    if (entry.first.IsScalar() && entry.first.Scalar() == key) {
      return child(entry.second, path_.empty() ? std::string(key) : path_ + "." + std::string(key),
                   &entry.first);
    }
  }
  return std::nullopt;
}

void YamlField::allowOnly(std::initializer_list<std::string_view> keys) const {
  allowOnly(std::vector<std::string>(keys.begin(), keys.end()));
}

void YamlField::allowOnly(const std::vector<std::string>& keys) const {
  for (const auto& [key, value] : entries()) {
    bool known = false;
    for (const auto& allowed : keys) known = known || key == allowed;
    if (!known) {
      value.fail("unknown field \"" + key + "\" (expected one of: " + joinKeys(keys) + ")");
    }
  }
}

std::vector<std::pair<std::string, YamlField>> YamlField::entries() const {
  if (!node_.IsMap()) fail("expected a mapping");
  std::vector<std::pair<std::string, YamlField>> out;
  for (const auto& entry : node_) {
    if (!entry.first.IsScalar()) {
      child(entry.first, path_).fail("a key must be a plain text");
    }
    const std::string key = entry.first.Scalar();
    if (!plist::text::isValidUtf8(key))
      child(entry.first, path_).fail("the key is not valid UTF-8");
    out.emplace_back(key,
                     child(entry.second, path_.empty() ? key : path_ + "." + key, &entry.first));
  }
  return out;
}

std::vector<YamlField> YamlField::items() const {
  if (node_.IsNull()) return {};
  if (!node_.IsSequence()) fail("expected a list");
  std::vector<YamlField> out;
  std::size_t i = 0;
  for (const auto& item : node_) {
    out.push_back(child(item, path_ + "[" + std::to_string(i++) + "]"));
  }
  return out;
}

std::string YamlField::scalar(std::string_view expected) const {
  if (!node_.IsScalar()) fail("expected " + std::string(expected));
  return node_.Scalar();
}

std::string YamlField::string() const {
  std::string text = scalar("a text");
  if (!plist::text::isValidUtf8(text)) fail("the text is not valid UTF-8");
  return text;
}

std::int64_t YamlField::integer() const {
  auto value = parseSigned(scalar("an integer"));
  if (!value) fail("expected an integer, found \"" + node_.Scalar() + "\"");
  return *value;
}

std::uint64_t YamlField::unsignedInteger() const {
  auto value = parseUnsigned(scalar("an unsigned integer"));
  if (!value) fail("expected an unsigned integer, found \"" + node_.Scalar() + "\"");
  return *value;
}

double YamlField::real() const {
  auto value = parseReal(scalar("a number"));
  if (!value) fail("expected a number, found \"" + node_.Scalar() + "\"");
  return *value;
}

bool YamlField::boolean() const {
  const std::string text = scalar("true or false");
  if (text == "true") return true;
  if (text == "false") return false;
  fail("expected true or false, found \"" + text + "\"");
}

std::vector<std::string> YamlField::strings() const {
  std::vector<std::string> out;
  for (const auto& item : items()) out.push_back(item.string());
  return out;
}

Duration YamlField::duration() const {
  const std::string text = scalar("a duration such as 30s");
  struct Unit {
    std::string_view suffix;
    double nanoseconds;
  };
  static constexpr Unit kUnits[] = {{"ms", 1e6}, {"s", 1e9}, {"m", 60e9}, {"h", 3600e9}, {"", 1e9}};
  for (const Unit& unit : kUnits) {
    if (text.size() <= unit.suffix.size() || !text.ends_with(unit.suffix)) continue;
    auto number = parseReal(text.substr(0, text.size() - unit.suffix.size()));
    if (!number) continue;
    const double ns = *number * unit.nanoseconds;
    if (ns < 0 || ns > 1e18) fail("the duration must be between 0 and 31 years");
    return Duration(static_cast<Duration::rep>(ns));
  }
  fail("expected a duration such as 30s, 1500ms, 2m or 1h, found \"" + text + "\"");
}

namespace {

struct PlistBuilder {
  std::size_t nodes = 0;

  plist::Value build(const YamlField& field, int depth) {
    if (++nodes > kMaxPlistNodes) field.fail("the value has too many elements");
    if (depth > kMaxDepth) field.fail("the value is nested too deeply");
    const YAML::Node& node = field.node();
    const std::string tag = node.Tag();
    if (node.IsMap()) {
      plist::Dict dict;
      for (const auto& [key, value] : field.entries()) {
        if (dict.contains(key)) value.fail("the key \"" + key + "\" appears twice");
        dict.set(key, build(value, depth + 1));
      }
      return dict;
    }
    if (node.IsSequence()) {
      plist::Array array;
      for (const auto& item : field.items()) array.push_back(build(item, depth + 1));
      return array;
    }
    if (!node.IsScalar()) {
      field.fail(
          "a property list has no null: write \"\" for an empty text, or leave the field out");
    }
    return scalar(field, tag);
  }

  static plist::Value scalar(const YamlField& field, const std::string& tag) {
    const std::string& text = field.node().Scalar();
    if (tag == "!string" || tag == "!") return field.string();
    if (tag == "!int") return plist::Value(plist::Integer::fromSigned(field.integer()));
    if (tag == "!uint") return plist::Value(plist::Integer::fromUnsigned(field.unsignedInteger()));
    if (tag == "!real") return field.real();
    if (tag == "!bool") return field.boolean();
    if (tag == "!data") {
      auto bytes = plist::text::base64Decode(text);
      if (!bytes) field.fail("expected base64 data");
      return *bytes;
    }
    if (tag == "!date") {
      auto seconds = plist::text::parseIsoDate(text);
      if (!seconds) field.fail("expected a date such as 2026-11-23T10:00:00Z");
      return plist::Date{*seconds};
    }
    if (tag != "?") {
      field.fail("unknown tag " + tag +
                 " (use !string, !int, !uint, !real, !bool, !data or !date)");
    }
    if (text == "true") return true;
    if (text == "false") return false;
    if (text == "~" || text == "null" || text.empty()) {
      field.fail(
          "a property list has no null: write \"\" for an empty text, or leave the field out");
    }
    if (auto value = parseSigned(text)) return plist::Value(plist::Integer::fromSigned(*value));
    if (auto value = parseUnsigned(text)) return plist::Value(plist::Integer::fromUnsigned(*value));
    // Reals only with !real: a version such as 1.0 stays the text it looks like.
    return field.string();
  }
};

}  // namespace

plist::Value YamlField::plist() const {
  PlistBuilder builder;
  return builder.build(*this, 0);
}

}  // namespace appsync::host
