// Reading and writing property lists: XML and binary, detected from the bytes. Strict: every
// malformed, out-of-range or hostile input is an error that says what is wrong and where.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "runtime/plist/value.h"

namespace appsync::plist {

enum class Format { Xml, Binary };

// Bounds on what the readers accept; nothing recurses or allocates beyond them.
inline constexpr std::size_t kMaxDepth = 512;                      // nested containers
inline constexpr std::size_t kMaxInputSize = 256u * 1024u * 1024u;  // bytes of one document

// What went wrong, and where: "binary property list: object 12 at offset 0x4f: ..." or
// "XML property list, line 3, column 7: ...".
struct ParseError {
  std::string message;
};

// Parses a whole document. Returns the root value, or absent with *error filled (error may be
// null). *format, when given, receives the format that was detected: binary when the bytes
// start with "bplist", XML otherwise (a UTF-8 byte-order mark may precede it).
//
// XML: the root is <plist> holding one value, or a value element on its own; entity
// declarations are refused. Binary: an object may be referenced from several places but never
// from inside itself, and what such shared references expand to is bounded (in the order of
// 64 bytes of values per input byte), so a small file cannot become a huge tree.
std::optional<Value> parse(std::span<const std::uint8_t> bytes, ParseError* error = nullptr,
                           Format* format = nullptr);

// Serialises a value. Fails (absent, *error filled) only for values the format cannot carry:
// nesting deeper than kMaxDepth, or strings that are not valid UTF-8.
std::optional<Bytes> writeBinary(const Value& value, std::string* error = nullptr);

// XML carries less than binary: strings and keys must also be free of the control characters
// XML cannot hold (anything below U+0020 but tab, line feed and carriage return; U+FFFE, U+FFFF),
// and dates must fall in years 0001-9999; dates are written in whole seconds. A uid does not
// survive XML: it is written as <dict><key>CF$UID</key><integer>N</integer></dict> and reads
// back as that dictionary. Everything else reads back exactly as it was.
std::optional<std::string> writeXml(const Value& value, std::string* error = nullptr);

// Writes in the given format (XML as its bytes).
std::optional<Bytes> write(const Value& value, Format format, std::string* error = nullptr);

}  // namespace appsync::plist
