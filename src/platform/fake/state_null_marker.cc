// The null marker in saved state: nulls written as {"$null": true} and read back.
#include "platform/fake/state_null_marker.h"

namespace appsync {
namespace {

const plist::Dict& marker() {
  static const plist::Dict kMarker{{"$null", true}};
  return kMarker;
}

plist::Dict convertedDict(const plist::Dict& dict, bool marking);

// `marking`: nulls become markers; otherwise markers become nulls.
plist::Value converted(const plist::Value& value, bool marking) {
  if (marking && value.isNull()) return marker();
  if (const plist::Dict* dict = value.dict()) {
    if (!marking && *dict == marker()) return plist::Value::null();
    return convertedDict(*dict, marking);
  }
  if (const plist::Array* array = value.array()) {
    plist::Array out;
    out.reserve(array->size());
    for (const plist::Value& item : *array) out.push_back(converted(item, marking));
    return out;
  }
  return value;
}

plist::Dict convertedDict(const plist::Dict& dict, bool marking) {
  plist::Dict out;
  out.reserve(dict.size());
  for (const auto& [key, item] : dict) out.insertNew(key, converted(item, marking));
  return out;
}

}  // namespace

plist::Dict nullsMarked(const plist::Dict& dict) { return convertedDict(dict, true); }

plist::Dict nullsRestored(const plist::Dict& dict) { return convertedDict(dict, false); }

}  // namespace appsync
