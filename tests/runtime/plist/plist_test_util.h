// Shared by the property-list tests: a value holding every type, and a way to assemble binary
// property lists byte by byte.
#pragma once

#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include "runtime/plist/value.h"

namespace appsync::plist::testing {

// Every type and the integer boundaries; keys deliberately out of alphabetical order.
// 730902896 seconds after 2001 is 2024-02-29T12:34:56Z.
inline Value everyType() {
  Bytes data;
  for (int i = 0; i < 200; ++i) data.push_back(static_cast<std::uint8_t>(i * 37));
  return Dict{
      {"string", "hello & <world>"},
      {"unicode", "caf\u00e9 \U0001F600"},
      {"empty", ""},
      {"true", true},
      {"false", false},
      {"zero", 0},
      {"small", 255},
      {"medium", 65536},
      {"negative", -42},
      {"int64min", std::numeric_limits<std::int64_t>::min()},
      {"int64max", std::numeric_limits<std::int64_t>::max()},
      {"uint64max", std::numeric_limits<std::uint64_t>::max()},
      {"real", 3.25},
      {"tiny", 1e-300},
      {"third", 1.0 / 3},
      {"date", Date{730902896}},
      {"data", data},
      {"uid", Uid{7}},
      {"array", Array{1, "two", Array{}, Dict{}}},
      {"nested", Dict{{"b", 1}, {"a", Bytes{}}}},
  };
}

// The same value as XML reads it back: the uid becomes its CF$UID dictionary.
inline Value everyTypeAsXmlReadsIt() {
  Value v = everyType();
  v.dict()->set("uid", Dict{{"CF$UID", 7}});
  return v;
}

// Assembles "bplist00" + objects + offset table + trailer. Offsets and references are written
// with the given sizes; the trailer can be edited afterwards with setTrailer().
struct BplistBuilder {
  std::vector<Bytes> objects;
  std::size_t offsetSize = 1;
  std::size_t refSize = 1;
  std::uint64_t top = 0;

  Bytes build() const {
    Bytes out = {'b', 'p', 'l', 'i', 's', 't', '0', '0'};
    std::vector<std::uint64_t> offsets;
    for (const Bytes& object : objects) {
      offsets.push_back(out.size());
      out.insert(out.end(), object.begin(), object.end());
    }
    std::uint64_t table = out.size();
    for (std::uint64_t offset : offsets) appendBE(out, offset, offsetSize);
    appendBE(out, 0, 6);
    out.push_back(static_cast<std::uint8_t>(offsetSize));
    out.push_back(static_cast<std::uint8_t>(refSize));
    appendBE(out, objects.size(), 8);
    appendBE(out, top, 8);
    appendBE(out, table, 8);
    return out;
  }

  static void appendBE(Bytes& out, std::uint64_t v, std::size_t n) {
    for (std::size_t i = n; i-- > 0;) out.push_back(static_cast<std::uint8_t>(v >> (8 * i)));
  }
};

enum class TrailerField { NumObjects = 8, TopObject = 16, TableOffset = 24 };

inline Bytes setTrailer(Bytes file, TrailerField field, std::uint64_t value) {
  std::size_t at = file.size() - 32 + static_cast<std::size_t>(field);
  for (std::size_t i = 0; i < 8; ++i) {
    file[at + i] = static_cast<std::uint8_t>(value >> (8 * (7 - i)));
  }
  return file;
}

}  // namespace appsync::plist::testing
