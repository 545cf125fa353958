// Fuzzes the binary property-list reader. Inputs are given the "bplist00" magic when they lack
// it, so that every mutation exercises the binary reader rather than the XML one.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "runtime/plist/codec.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace appsync::plist;
  std::vector<std::uint8_t> bytes;
  if (size < 8 || std::memcmp(data, "bplist00", 8) != 0) {
    static const char kMagic[] = "bplist00";
    bytes.assign(kMagic, kMagic + 8);
  }
  bytes.insert(bytes.end(), data, data + size);
  ParseError error;
  Format format;
  std::optional<Value> value = parse(bytes, &error, &format);
  if (format != Format::Binary) std::abort();
  if (!value && error.message.rfind("binary property list: ", 0) != 0) std::abort();
  return 0;
}
