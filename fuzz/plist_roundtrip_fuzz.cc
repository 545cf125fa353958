// Fuzzes write-then-read: whatever parses must survive writeBinary exactly, and writeXml as far
// as XML can carry it (uids come back as CF$UID dictionaries, dates in whole seconds). A second
// XML write must be byte-identical to the first.
#include <bit>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>

#include "runtime/plist/codec.h"

namespace {

using namespace appsync::plist;

// a as read back from XML equals b (or exactly equals, when xml is false). NaN equals NaN.
bool same(const Value& a, const Value& b, bool xml) {
  if (xml && a.uid()) return b == Value(Dict{{"CF$UID", Integer::fromUnsigned(a.uid()->value)}});
  if (a.type() != b.type()) return false;
  switch (a.type()) {
    case Type::Real:
      return (std::isnan(*a.real()) && std::isnan(*b.real())) ||
             std::bit_cast<std::uint64_t>(*a.real()) == std::bit_cast<std::uint64_t>(*b.real());
    case Type::Date: {
      double x = a.date()->secondsSince2001, y = b.date()->secondsSince2001;
      if (xml) x = std::floor(x);
      return (std::isnan(x) && std::isnan(y)) ||
             std::bit_cast<std::uint64_t>(x) == std::bit_cast<std::uint64_t>(y) || x == y;
    }
    case Type::Array: {
      const Array &x = *a.array(), &y = *b.array();
      if (x.size() != y.size()) return false;
      for (std::size_t i = 0; i < x.size(); ++i) {
        if (!same(x[i], y[i], xml)) return false;
      }
      return true;
    }
    case Type::Dict: {
      const Dict &x = *a.dict(), &y = *b.dict();
      if (x.size() != y.size()) return false;
      for (auto i = x.begin(), j = y.begin(); i != x.end(); ++i, ++j) {
        if (i->key != j->key || !same(i->value, j->value, xml)) return false;
      }
      return true;
    }
    default:
      return a == b;
  }
}

[[noreturn]] void fail(const char* what, const std::string& detail) {
  std::fprintf(stderr, "%s: %s\n", what, detail.c_str());
  std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::optional<Value> value = parse({data, size});
  if (!value) return 0;

  std::string error;
  std::optional<Bytes> binary = writeBinary(*value, &error);
  if (!binary) fail("writeBinary refused a parsed value", error);
  ParseError parseError;
  std::optional<Value> fromBinary = parse(*binary, &parseError);
  if (!fromBinary) fail("cannot read our own binary", parseError.message);
  if (!same(*value, *fromBinary, false)) fail("binary round trip differs", value->describe());

  std::optional<std::string> xml = writeXml(*value, &error);
  if (!xml) {
    // Only control characters and dates beyond years 0001-9999 cannot be written as XML.
    if (error.empty()) fail("writeXml failed without a message", "");
    return 0;
  }
  std::optional<Value> fromXml =
      parse({reinterpret_cast<const std::uint8_t*>(xml->data()), xml->size()}, &parseError);
  if (!fromXml) fail("cannot read our own XML", parseError.message + "\n" + *xml);
  if (!same(*value, *fromXml, true)) fail("XML round trip differs", value->describe());
  if (writeXml(*fromXml) != xml) fail("second XML write differs", *xml);
  return 0;
}
