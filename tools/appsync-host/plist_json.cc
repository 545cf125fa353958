#include "plist_json.h"

#include "runtime/plist/text_encoding.h"

namespace appsync::host {

nlohmann::ordered_json plistToJson(const plist::Value& value) {
  switch (value.type()) {
    case plist::Type::Boolean:
      return *value.boolean();
    case plist::Type::Integer: {
      const plist::Integer& integer = *value.integer();
      if (integer.isUnsigned) return integer.bits;
      return static_cast<std::int64_t>(integer.bits);
    }
    case plist::Type::Real:
      return *value.real();
    case plist::Type::String:
      return *value.string();
    case plist::Type::Data:
      return {{"data", plist::text::base64Encode(*value.data())}};
    case plist::Type::Date: {
      const double seconds = value.date()->secondsSince2001;
      if (auto iso = plist::text::formatIsoDate(seconds)) return {{"date", *iso}};
      return {{"date", seconds}};
    }
    case plist::Type::Uid:
      return {{"uid", value.uid()->value}};
    case plist::Type::Array: {
      nlohmann::ordered_json array = nlohmann::ordered_json::array();
      for (const plist::Value& item : *value.array()) array.push_back(plistToJson(item));
      return array;
    }
    case plist::Type::Dict: {
      nlohmann::ordered_json object = nlohmann::ordered_json::object();
      for (const auto& entry : *value.dict()) object[entry.key] = plistToJson(entry.value);
      return object;
    }
    case plist::Type::Null:
      return nullptr;
  }
  return nullptr;
}

}  // namespace appsync::host
