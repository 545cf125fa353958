// The first difference between an expected property list and the one found.
#include "replay/plist_difference.h"

namespace appsync::host::replay {

namespace {

// Texts in quotes, so that "1" and 1, or an empty text, can be told apart; booleans as the
// script writes them, not as the 1 and 0 of a description.
std::string shown(const plist::Value& value) {
  if (const std::string* text = value.string()) return "\"" + *text + "\"";
  if (const bool* flag = value.boolean()) return *flag ? "true" : "false";
  return value.describe();
}

std::string at(const std::string& path, const std::string& message) {
  return path.empty() ? message : path + ": " + message;
}

std::string key(const std::string& path, const std::string& name) {
  return path.empty() ? name : path + "." + name;
}

std::optional<std::string> compare(const plist::Value& expected, const plist::Value& found,
                                   const std::string& path) {
  if (expected.type() == plist::Type::Dict && found.type() == plist::Type::Dict) {
    for (const auto& entry : *expected.dict()) {
      const plist::Value* other = found.dict()->find(entry.key);
      if (!other) {
        return at(key(path, entry.key), "expected " + shown(entry.value) + ", found nothing");
      }
      if (auto difference = compare(entry.value, *other, key(path, entry.key))) return difference;
    }
    for (const auto& entry : *found.dict()) {
      if (!expected.dict()->contains(entry.key)) {
        return at(key(path, entry.key), "expected nothing, found " + shown(entry.value));
      }
    }
    return std::nullopt;
  }
  if (expected.type() == plist::Type::Array && found.type() == plist::Type::Array) {
    const plist::Array& want = *expected.array();
    const plist::Array& have = *found.array();
    for (std::size_t i = 0; i < want.size() || i < have.size(); ++i) {
      const std::string item = path + "[" + std::to_string(i) + "]";
      if (i >= have.size()) return at(item, "expected " + shown(want[i]) + ", found nothing");
      if (i >= want.size()) return at(item, "expected nothing, found " + shown(have[i]));
      if (auto difference = compare(want[i], have[i], item)) return difference;
    }
    return std::nullopt;
  }
  // A number is its value: the 5 a script writes equals the unsigned 5 an operation returns.
  if (expected.integer() && found.integer() && expected.int64() == found.int64() &&
      expected.uint64() == found.uint64()) {
    return std::nullopt;
  }
  if (expected == found) return std::nullopt;
  return at(path, "expected " + shown(expected) + ", found " + shown(found));
}

}  // namespace

std::optional<std::string> firstDifference(const plist::Value& expected, const plist::Value& found,
                                           const std::string& root) {
  return compare(expected, found, root);
}

}  // namespace appsync::host::replay
