// Property-list entry points: format detection, the input bound, and writing by format.
#include "runtime/plist/codec.h"

#include <cstring>

#include "runtime/plist/readers.h"

namespace appsync::plist {

std::optional<Value> parse(std::span<const std::uint8_t> bytes, ParseError* error, Format* format) {
  if (bytes.size() > kMaxInputSize) {
    if (error) {
      error->message = "property list of " + std::to_string(bytes.size()) +
                       " bytes is larger than the limit of " + std::to_string(kMaxInputSize) +
                       " bytes";
    }
    return std::nullopt;
  }
  // Any "bplist" header goes to the binary reader, which names versions it does not read.
  const bool binary = bytes.size() >= 6 && std::memcmp(bytes.data(), "bplist", 6) == 0;
  if (format) *format = binary ? Format::Binary : Format::Xml;
  return binary ? internal::parseBinary(bytes, error) : internal::parseXml(bytes, error);
}

std::optional<Bytes> write(const Value& value, Format format, std::string* error) {
  if (format == Format::Binary) return writeBinary(value, error);
  std::optional<std::string> xml = writeXml(value, error);
  if (!xml) return std::nullopt;
  return Bytes(xml->begin(), xml->end());
}

}  // namespace appsync::plist
