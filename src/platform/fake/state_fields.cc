// Typed reading of saved fake state, with messages that name the field.
#include "platform/fake/state_fields.h"

#include <cstdint>
#include <utility>

namespace appsync {

StateFields::StateFields(const plist::Dict& dict, std::string where)
    : dict_(dict), where_(std::move(where)) {}

std::string StateFields::path(std::string_view key) const {
  return where_.empty() ? std::string(key) : where_ + "." + std::string(key);
}

void StateFields::fail(std::string_view key, std::string_view message) const {
  throw StateFormatError(path(key) + ": " + std::string(message));
}

const plist::Value& StateFields::required(std::string_view key) const {
  const plist::Value* value = dict_.find(key);
  if (value == nullptr) fail(key, "missing");
  return *value;
}

std::string StateFields::string(std::string_view key) const {
  const std::string* s = required(key).string();
  if (s == nullptr) fail(key, "expected a string");
  return *s;
}

std::optional<std::string> StateFields::optionalString(std::string_view key) const {
  if (!has(key)) return std::nullopt;
  return string(key);
}

std::uint64_t StateFields::unsignedInteger(std::string_view key) const {
  auto value = required(key).uint64();
  if (!value || required(key).integer() == nullptr) fail(key, "expected an unsigned integer");
  return *value;
}

std::optional<std::uint64_t> StateFields::optionalUnsigned(std::string_view key) const {
  if (!has(key)) return std::nullopt;
  return unsignedInteger(key);
}

std::int64_t StateFields::integer(std::string_view key) const {
  auto value = required(key).int64();
  if (!value || required(key).integer() == nullptr) fail(key, "expected an integer");
  return *value;
}

std::optional<std::int64_t> StateFields::optionalInteger(std::string_view key) const {
  if (!has(key)) return std::nullopt;
  return integer(key);
}

std::int32_t StateFields::int32(std::string_view key) const {
  auto value = required(key).int64();
  if (!value || required(key).integer() == nullptr || *value < INT32_MIN || *value > INT32_MAX) {
    fail(key, "expected a 32-bit integer");
  }
  return static_cast<std::int32_t>(*value);
}

std::optional<std::int32_t> StateFields::optionalInt32(std::string_view key) const {
  if (!has(key)) return std::nullopt;
  return int32(key);
}

double StateFields::real(std::string_view key) const {
  const plist::Value& value = required(key);
  if (value.real() == nullptr && value.integer() == nullptr) fail(key, "expected a number");
  return *value.number();
}

bool StateFields::boolean(std::string_view key, bool fallback) const {
  if (!has(key)) return fallback;
  const bool* b = required(key).boolean();
  if (b == nullptr) fail(key, "expected a boolean");
  return *b;
}

plist::Bytes StateFields::data(std::string_view key) const {
  const plist::Bytes* bytes = required(key).data();
  if (bytes == nullptr) fail(key, "expected data");
  return *bytes;
}

std::optional<plist::Bytes> StateFields::optionalData(std::string_view key) const {
  if (!has(key)) return std::nullopt;
  return data(key);
}

plist::Dict StateFields::dictionary(std::string_view key) const {
  if (!has(key)) return {};
  const plist::Dict* d = required(key).dict();
  if (d == nullptr) fail(key, "expected a dictionary");
  return *d;
}

plist::Array StateFields::array(std::string_view key) const {
  if (!has(key)) return {};
  const plist::Array* a = required(key).array();
  if (a == nullptr) fail(key, "expected an array");
  return *a;
}

StateFields StateFields::child(std::string_view key) const {
  const plist::Dict* d = required(key).dict();
  if (d == nullptr) fail(key, "expected a dictionary");
  return StateFields(*d, path(key));
}

std::optional<StateFields> StateFields::optionalChild(std::string_view key) const {
  if (!has(key)) return std::nullopt;
  return child(key);
}

std::vector<StateFields> StateFields::records(std::string_view key) const {
  std::vector<StateFields> out;
  const plist::Array items = array(key);
  for (std::size_t i = 0; i < items.size(); ++i) {
    const std::string at = path(key) + "[" + std::to_string(i) + "]";
    const plist::Dict* d = items[i].dict();
    if (d == nullptr) throw StateFormatError(at + ": expected a dictionary");
    out.emplace_back(*d, at);
  }
  return out;
}

std::vector<std::string> StateFields::strings(std::string_view key) const {
  std::vector<std::string> out;
  const plist::Array items = array(key);
  for (std::size_t i = 0; i < items.size(); ++i) {
    const std::string* s = items[i].string();
    if (s == nullptr) {
      throw StateFormatError(path(key) + "[" + std::to_string(i) + "]: expected a string");
    }
    out.push_back(*s);
  }
  return out;
}

std::vector<std::int32_t> StateFields::int32s(std::string_view key) const {
  std::vector<std::int32_t> out;
  const plist::Array items = array(key);
  for (std::size_t i = 0; i < items.size(); ++i) {
    auto value = items[i].int64();
    if (!value || items[i].integer() == nullptr || *value < INT32_MIN || *value > INT32_MAX) {
      throw StateFormatError(path(key) + "[" + std::to_string(i) + "]: expected a 32-bit integer");
    }
    out.push_back(static_cast<std::int32_t>(*value));
  }
  return out;
}

ErrorRef StateFields::error(std::string_view key) const {
  StateFields fields = child(key);
  auto error = std::make_shared<Error>();
  error->domain = fields.string("domain");
  error->code = fields.integer("code");
  error->userInfo = fields.dictionary("userInfo");
  error->underlying = fields.optionalError("underlying");
  return error;
}

ErrorRef StateFields::optionalError(std::string_view key) const {
  if (!has(key)) return nullptr;
  return error(key);
}

plist::Array stringsState(const std::vector<std::string>& strings) {
  return plist::Array(strings.begin(), strings.end());
}

plist::Dict errorState(const Error& error) {
  plist::Dict state{{"domain", error.domain}, {"code", plist::Integer::fromSigned(error.code)}};
  if (!error.userInfo.empty()) state.set("userInfo", error.userInfo);
  if (error.underlying) state.set("underlying", errorState(*error.underlying));
  return state;
}

}  // namespace appsync
