// The two property-list readers behind plist::parse; private to the codec.
#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "runtime/plist/codec.h"

namespace appsync::plist::internal {

// Both expect a document no larger than kMaxInputSize; error may be null.
std::optional<Value> parseXml(std::span<const std::uint8_t> bytes, ParseError* error);
std::optional<Value> parseBinary(std::span<const std::uint8_t> bytes, ParseError* error);

}  // namespace appsync::plist::internal
