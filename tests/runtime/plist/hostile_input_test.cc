// Malformed and hostile property lists: each must be refused quickly, without crashing or
// allocating what it declares, with a message that says what is wrong and where.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "runtime/plist/codec.h"
#include "runtime/plist/plist_test_util.h"

namespace appsync::plist {
namespace {

using testing::BplistBuilder;
using testing::setTrailer;
using testing::TrailerField;

struct Case {
  Bytes input;
  std::vector<std::string> expected;  // substrings of the error message
};

Bytes xml(std::string_view body) { return Bytes(body.begin(), body.end()); }

Bytes inPlist(std::string_view body) {
  return xml("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n" +
             std::string(body) + "\n</plist>\n");
}

Bytes bplist(std::vector<Bytes> objects, std::size_t refSize = 1, std::size_t offsetSize = 1) {
  BplistBuilder b;
  b.objects = std::move(objects);
  b.refSize = refSize;
  b.offsetSize = offsetSize;
  return b.build();
}

// Objects 0..n-1, each an array holding the next; the last is empty.
Bytes deepBinary(std::size_t n) {
  std::vector<Bytes> objects;
  for (std::size_t i = 0; i + 1 < n; ++i) {
    Bytes o = {0xA1};
    BplistBuilder::appendBE(o, i + 1, 4);
    objects.push_back(o);
  }
  objects.push_back({0xA0});
  return bplist(std::move(objects), 4, 4);
}

// Each level an array holding the next level twice: 2^levels leaves from a tiny file.
Bytes exponentialBinary(std::size_t levels) {
  std::vector<Bytes> objects;
  for (std::size_t i = 0; i < levels; ++i) {
    objects.push_back({0xA2, static_cast<std::uint8_t>(i + 1), static_cast<std::uint8_t>(i + 1)});
  }
  objects.push_back({0x09});
  return bplist(std::move(objects));
}

Bytes lengthAbove(std::uint8_t marker, std::uint64_t length) {
  Bytes o = {static_cast<std::uint8_t>(marker | 0x0F), 0x13};
  BplistBuilder::appendBE(o, length, 8);
  o.push_back(0);
  return bplist({o});
}

std::vector<Case> hostileCases() {
  const std::string laughs =
      "<?xml version=\"1.0\"?>\n<!DOCTYPE plist [\n"
      " <!ENTITY lol \"lol\">\n"
      " <!ENTITY lol1 \"&lol;&lol;&lol;&lol;&lol;&lol;&lol;&lol;&lol;&lol;\">\n"
      " <!ENTITY lol2 \"&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;&lol1;\">\n"
      " <!ENTITY lol9 \"&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;&lol2;\">\n"
      "]>\n<plist><string>&lol9;</string></plist>\n";
  std::string deepXml;
  for (int i = 0; i < 100000; ++i) deepXml += "<array>";

  std::vector<Case> cases = {
      // ---- XML: values ----
      {inPlist("<integer>12abc</integer>"), {"line 3, column 1: invalid integer \"12abc\""}},
      {inPlist("<array><true/><integer> </integer></array>"),
       {"line 3, column 15: invalid integer \"\""}},
      {inPlist("<integer>18446744073709551616</integer>"),
       {"line 3", "integer out of range \"18446744073709551616\""}},
      {inPlist("<integer>-9223372036854775809</integer>"),
       {"integer out of range \"-9223372036854775809\""}},
      {inPlist("<integer>0x1FFFFFFFFFFFFFFFF</integer>"), {"integer out of range"}},
      {inPlist("<integer>+-5</integer>"), {"invalid integer \"+-5\""}},
      {inPlist("<real>abc</real>"), {"line 3", "invalid real \"abc\""}},
      {inPlist("<real>1.5x</real>"), {"invalid real \"1.5x\""}},
      {inPlist("<real>1e999</real>"), {"invalid real \"1e999\""}},
      {inPlist("<real>0x1p3</real>"), {"invalid real \"0x1p3\""}},
      {inPlist("<data>AAE$</data>"), {"line 3", "invalid base64"}},
      {inPlist("<data>AB=C</data>"), {"invalid base64"}},
      {inPlist("<data>AAECA</data>"), {"invalid base64"}},
      {inPlist("<date>2023-02-29T00:00:00Z</date>"),
       {"line 3", "invalid date \"2023-02-29T00:00:00Z\""}},
      {inPlist("<date>2024-13-01T00:00:00Z</date>"), {"invalid date"}},
      {inPlist("<date>2024-01-01T24:00:00Z</date>"), {"invalid date"}},
      {inPlist("<date>2024-01-01T00:00:00</date>"), {"invalid date"}},
      {inPlist("<date>2024-01-01 00:00:00Z</date>"), {"invalid date"}},
      {inPlist("<date>0000-01-01T00:00:00Z</date>"), {"invalid date"}},
      // ---- XML: structure ----
      {inPlist("<dict>\n<key>a</key><true/>\n<key>a</key><false/></dict>"),
       {"line 5, column 1: duplicate key \"a\""}},
      {inPlist("<dict><key>a</key></dict>"), {"line 3", "key \"a\" has no value"}},
      {inPlist("<dict><key>a</key><key>b</key></dict>"), {"key \"a\" has no value"}},
      {inPlist("<dict><true/></dict>"), {"line 3, column 7: <true> without a <key> in <dict>"}},
      {inPlist("<array><key>a</key></array>"), {"<key> outside a <dict>"}},
      {inPlist("<array><foo/></array>"), {"line 3, column 8: unknown element <foo>"}},
      {inPlist("<dict>stray</dict>"), {"line 3", "unexpected text \"stray\" in <dict>"}},
      {inPlist("<true>yes</true>"), {"unexpected text \"yes\" in <true>"}},
      {inPlist("<string>a<b/>c</string>"), {"line 3, column 10: element <b> inside <string>"}},
      {inPlist("<true/><false/>"), {"line 3, column 8: more than one value in <plist>"}},
      {inPlist(""), {"<plist> holds no value"}},
      {inPlist("<array><plist/></array>"), {"<plist> inside <array>"}},
      {xml("<true/><false/>"), {"line 1, column 8", "junk after document"}},
      {xml("<plist>\n<dict>"), {"XML property list, line 2, column 7: no element found"}},
      {xml(""), {"XML property list, line 1", "no element found"}},
      {xml(deepXml), {"line 1, column 3585: containers nested deeper than 512 levels"}},
      // ---- XML: encoding ----
      {inPlist("<string>\xC3\x28</string>"), {"line 3, column 9", "not well-formed"}},
      {inPlist("<string>\xC0\xAF</string>"), {"line 3", "not well-formed"}},
      {inPlist("<string>\xED\xA0\x80</string>"), {"line 3", "not well-formed"}},
      {inPlist("<string>\x01</string>"), {"line 3", "not well-formed"}},
      {inPlist("<string>&#1;</string>"), {"line 3", "reference to invalid character number"}},
      // ---- XML: entities ----
      {xml(laughs), {"XML property list, line 3", "entity declaration \"lol\" is not allowed"}},
      {xml("<!DOCTYPE plist [<!ENTITY xxe SYSTEM \"file:///etc/passwd\">]>"
           "<plist><string>&xxe;</string></plist>"),
       {"line 1", "entity declaration \"xxe\" is not allowed"}},
      {xml("<!DOCTYPE plist [<!ENTITY % p SYSTEM \"http://example.invalid/x.dtd\"> %p;]>"
           "<plist><true/></plist>"),
       {"line 1", "parameter entity declaration \"p\" is not allowed"}},
      {xml("<!DOCTYPE plist PUBLIC \"-//Example//DTD PLIST 1.0//EN\" "
           "\"http://example.invalid/PropertyList-1.0.dtd\">\n"
           "<plist><string>&secret;</string></plist>"),
       {"line 2, column 16: reference to undeclared entity &secret;"}},
      {inPlist("<string>&secret;</string>"), {"line 3", "undefined entity"}},

      // ---- binary: trailer and offsets ----
      {xml("bplist15" + std::string(40, '\0')),
       {"binary property list: unsupported format version \"15\""}},
      {xml("bplist00\x08"), {"binary property list: file is too short (9 bytes)"}},
      {setTrailer(bplist({{0x09}}), TrailerField::TableOffset, 0x1000),
       {"binary property list: trailer at offset 0xa: offset table at 0x1000 lies outside the "
        "file"}},
      {setTrailer(bplist({{0x09}}), TrailerField::TableOffset, 3),
       {"offset table at 0x3 lies outside the file"}},
      {setTrailer(bplist({{0x09}}), TrailerField::NumObjects, 1ull << 60),
       {"trailer at offset 0xa: 1152921504606846976 objects do not fit in the offset table at "
        "0x9"}},
      {setTrailer(bplist({{0x09}}), TrailerField::NumObjects, 0), {"no objects"}},
      {setTrailer(bplist({{0x09}}), TrailerField::TopObject, 1),
       {"top object 1 does not exist (1 objects)"}},
      {[] {
         Bytes b = bplist({{0xA1, 1}, {0x09}});
         b[b.size() - 32 - 1] = 0x0B;  // object 1 "starts" at the offset table
         return b;
       }(),
       {"binary property list: object 1: offset 0xb lies outside the object area 0x8-0xb"}},
      {[] {
         Bytes b = bplist({{0xA1, 1}, {0x09}});
         b[b.size() - 32 - 1] = 0x02;
         return b;
       }(),
       {"object 1: offset 0x2 lies outside the object area"}},
      {bplist({{0xA1, 7}}),
       {"binary property list: object 0 at offset 0x8: reference to object 7, but there are only "
        "1 objects"}},
      // ---- binary: cycles and depth ----
      {bplist({{0xA1, 0}}), {"object 0 at offset 0x8: reference cycle: object 0 contains itself"}},
      {bplist({{0xA1, 1}, {0xA1, 0}}),
       {"object 1 at offset 0xa: reference cycle: object 0 contains itself"}},
      {bplist({{0xD1, 1, 0}, {0x51, 'k'}}), {"object 0 at offset 0x8: reference cycle"}},
      {deepBinary(100000),
       {"object 512 at offset 0xa08: containers nested deeper than 512 levels"}},
      {exponentialBinary(40), {"shared references expand beyond"}},
      // ---- binary: declared lengths ----
      {lengthAbove(0x40, 1ull << 60),
       {"object 0 at offset 0x8: data of 1152921504606846976 bytes does not fit in the 1 bytes "
        "left"}},
      {lengthAbove(0x50, 1ull << 62), {"string of 4611686018427387904 bytes does not fit"}},
      {lengthAbove(0x60, 1ull << 63), {"string of 9223372036854775808 UTF-16 units does not fit"}},
      {lengthAbove(0xA0, 1ull << 61), {"array of 2305843009213693952 members does not fit"}},
      {lengthAbove(0xD0, ~0ull), {"dictionary of 18446744073709551615 entries does not fit"}},
      {bplist({{0x4F, 0x23, 0, 0, 0, 0, 0, 0, 0, 0}}),
       {"object 0 at offset 0x8: length is not an integer (marker 0x23)"}},
      {bplist({{0x13, 0, 0}}), {"integer is truncated"}},
      // ---- binary: values ----
      {bplist({{0x53, 'a', 0xC3, 0xA9}}),
       {"object 0 at offset 0x8: byte 0xc3 at offset 0xa in an ASCII string is not ASCII"}},
      {bplist({{0x62, 0xD8, 0x3D, 0x00, 0x41}}),
       {"object 0 at offset 0x8: unpaired UTF-16 surrogate 0xd83d at offset 0x9"}},
      {bplist({{0x61, 0xDE, 0x00}}), {"unpaired UTF-16 surrogate 0xde00"}},
      {bplist({{0x61, 0xD8, 0x00}}), {"unpaired UTF-16 surrogate 0xd800"}},
      {bplist({{0xD2, 1, 2, 3, 3}, {0x51, 'a'}, {0x51, 'a'}, {0x08}}),
       {"object 0 at offset 0x8: duplicate key \"a\""}},
      {bplist({{0xD2, 1, 1, 2, 2}, {0x51, 'a'}, {0x08}}), {"duplicate key \"a\""}},
      {bplist({{0xD1, 1, 1}, {0x10, 5}}),
       {"object 0 at offset 0x8: dictionary key (object 1) is an integer, not a string"}},
      {bplist({{0xD1, 1, 2}, {0xA0}, {0x08}}),
       {"dictionary key (object 1) is an array, not a string"}},
      {bplist({{0x14, 0, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0}}),
       {"object 0 at offset 0x8: 128-bit integer does not fit in 64 bits"}},
      {bplist({{0x00}}), {"object 0 at offset 0x8: null is not a property-list value"}},
      {bplist({{0xA1, 1}, {0x0F}}),
       {"object 1 at offset 0xa: fill byte where an object was expected"}},
      {bplist({{0x70}}), {"object 0 at offset 0x8: unknown marker 0x70"}},
      {bplist({{0x21, 0, 0}}), {"unknown marker 0x21"}},
      {bplist({{0x88, 0, 0, 0, 0, 0, 0, 0, 0, 1}}), {"uid of 9 bytes"}},
  };

  // A valid file cut at every length.
  const Bytes whole = *writeBinary(testing::everyType());
  for (std::size_t n = 0; n < whole.size(); ++n) {
    cases.push_back({Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(n)),
                     {n < 6 ? "XML property list, line 1" : "binary property list: "}});
  }
  return cases;
}

TEST(HostileInputTest, IsRefusedWithAMessageSayingWhatAndWhere) {
  const std::vector<Case> cases = hostileCases();
  for (std::size_t i = 0; i < cases.size(); ++i) {
    SCOPED_TRACE(::testing::Message() << "case " << i << ": " << cases[i].expected.back());
    ParseError error;
    std::optional<Value> value = parse(cases[i].input, &error);
    EXPECT_FALSE(value) << value->describe().substr(0, 200);
    for (const std::string& part : cases[i].expected) {
      EXPECT_NE(error.message.find(part), std::string::npos)
          << "message: " << error.message << "\nexpected to contain: " << part;
    }
  }
}

}  // namespace
}  // namespace appsync::plist
