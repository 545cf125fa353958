// The null marker in saved state. Dictionaries built in memory (install options) may hold the
// platform's null object, which no property-list writer carries; saved state writes it as the
// dictionary {"$null": true} and reads that back as null, at any depth and in its place.
#pragma once

#include "runtime/plist/value.h"

namespace appsync {

// `dict` with every null, at any depth, written as the marker.
plist::Dict nullsMarked(const plist::Dict& dict);
// `dict` with every marker, at any depth, read back as null.
plist::Dict nullsRestored(const plist::Dict& dict);

}  // namespace appsync
