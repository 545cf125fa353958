// The text encodings the property-list formats are built on: UTF-8 and UTF-16, base64, and the
// ISO 8601 form of dates. Private to the codec.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "runtime/plist/value.h"

namespace appsync::plist::text {

// Decodes the UTF-8 sequence starting at s[pos] into *cp and returns its length, or 0 when the
// sequence is malformed (truncated, overlong, a surrogate or above U+10FFFF).
std::size_t decodeUtf8(std::string_view s, std::size_t pos, char32_t* cp);

bool isValidUtf8(std::string_view s);

// Appends the UTF-16 code units of s; false (out unspecified) when s is not valid UTF-8.
bool utf8ToUtf16(std::string_view s, std::u16string& out);

// Appends the UTF-8 form of a Unicode scalar value.
void appendUtf8(char32_t cp, std::string& out);

// Standard base64 with '=' padding, as one line.
std::string base64Encode(std::span<const std::uint8_t> bytes);

// Decodes base64, skipping blanks and line breaks anywhere. Absent on any other character,
// misplaced padding or an incomplete final group.
std::optional<Bytes> base64Decode(std::string_view text);

// "YYYY-MM-DDTHH:MM:SSZ" (years 0001-9999) to seconds since 2001-01-01 00:00:00 UTC. Absent
// unless the text is exactly that form with every field in range.
std::optional<double> parseIsoDate(std::string_view text);

// The inverse, in whole seconds (fractions are dropped, rounding down). Absent for dates that
// are not finite or fall outside years 0001-9999.
std::optional<std::string> formatIsoDate(double secondsSince2001);

}  // namespace appsync::plist::text
