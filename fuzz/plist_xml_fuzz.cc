// Fuzzes the XML property-list reader: any bytes, parsed as XML, must not crash or hang.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "runtime/plist/codec.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace appsync::plist;
  ParseError error;
  Format format;
  std::optional<Value> value = parse({data, size}, &error, &format);
  // Anything not starting with the binary magic is read as XML; a refusal always says why.
  if (!value && error.message.empty()) std::abort();
  return 0;
}
