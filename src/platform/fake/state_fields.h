// Reading a fake's saved state back: typed access to the fields of a property-list dictionary.
// A missing or mistyped field throws StateFormatError naming the field's path
// ("applications[2].version: expected a string"), so a hand-edited device file is refused
// with a message that points at the mistake.
#pragma once

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync {

struct StateFormatError : std::runtime_error {
  using std::runtime_error::runtime_error;
};

class StateFields {
 public:
  // `where` is the path of `dict` itself ("" for a file's root).
  StateFields(const plist::Dict& dict, std::string where = {});

  const plist::Dict& dict() const { return dict_; }
  bool has(std::string_view key) const { return dict_.contains(key); }
  // "where.key", for messages.
  std::string path(std::string_view key) const;
  [[noreturn]] void fail(std::string_view key, std::string_view message) const;

  std::string string(std::string_view key) const;
  std::optional<std::string> optionalString(std::string_view key) const;
  std::uint64_t unsignedInteger(std::string_view key) const;
  std::optional<std::uint64_t> optionalUnsigned(std::string_view key) const;
  std::int64_t integer(std::string_view key) const;
  std::optional<std::int64_t> optionalInteger(std::string_view key) const;
  // An integer that fits 32 bits (statuses, codes, setting values).
  std::int32_t int32(std::string_view key) const;
  std::optional<std::int32_t> optionalInt32(std::string_view key) const;
  double real(std::string_view key) const;
  // A missing boolean is `fallback`.
  bool boolean(std::string_view key, bool fallback) const;
  plist::Bytes data(std::string_view key) const;
  std::optional<plist::Bytes> optionalData(std::string_view key) const;
  // A missing dictionary or array is empty.
  plist::Dict dictionary(std::string_view key) const;
  plist::Array array(std::string_view key) const;
  // A dictionary field read field by field.
  StateFields child(std::string_view key) const;
  std::optional<StateFields> optionalChild(std::string_view key) const;
  // An array of dictionaries, each read field by field ("key[i]"). Missing: none.
  std::vector<StateFields> records(std::string_view key) const;
  // An array of strings. Missing: none.
  std::vector<std::string> strings(std::string_view key) const;
  // An array of 32-bit integers. Missing: none.
  std::vector<std::int32_t> int32s(std::string_view key) const;

  // An error saved by errorState (domain, code, userInfo, underlying).
  ErrorRef error(std::string_view key) const;
  ErrorRef optionalError(std::string_view key) const;

 private:
  const plist::Value& required(std::string_view key) const;

  plist::Dict dict_;
  std::string where_;
};

// Strings as saved state: an array of them, in order.
plist::Array stringsState(const std::vector<std::string>& strings);

// An error as saved state: {"domain", "code", "userInfo"?, "underlying"?}.
plist::Dict errorState(const Error& error);

}  // namespace appsync
