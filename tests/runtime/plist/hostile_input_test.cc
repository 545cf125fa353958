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
  std::string name;
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
      {"integer with trailing junk",
       inPlist("<integer>12abc</integer>"),
       {"line 3, column 1: invalid integer \"12abc\""}},
      {"empty integer",
       inPlist("<array><true/><integer> </integer></array>"),
       {"line 3, column 15: invalid integer \"\""}},
      {"integer above 2^64-1",
       inPlist("<integer>18446744073709551616</integer>"),
       {"line 3", "integer out of range \"18446744073709551616\""}},
      {"integer below INT64_MIN",
       inPlist("<integer>-9223372036854775809</integer>"),
       {"integer out of range \"-9223372036854775809\""}},
      {"hex integer above 2^64-1",
       inPlist("<integer>0x1FFFFFFFFFFFFFFFF</integer>"),
       {"integer out of range"}},
      {"integer with two signs", inPlist("<integer>+-5</integer>"), {"invalid integer \"+-5\""}},
      {"real that is not a number",
       inPlist("<real>abc</real>"),
       {"line 3", "invalid real \"abc\""}},
      {"real with junk", inPlist("<real>1.5x</real>"), {"invalid real \"1.5x\""}},
      {"real out of range", inPlist("<real>1e999</real>"), {"invalid real \"1e999\""}},
      {"hexadecimal real", inPlist("<real>0x1p3</real>"), {"invalid real \"0x1p3\""}},
      {"base64 with a bad character", inPlist("<data>AAE$</data>"), {"line 3", "invalid base64"}},
      {"base64 with misplaced padding", inPlist("<data>AB=C</data>"), {"invalid base64"}},
      {"base64 cut short", inPlist("<data>AAECA</data>"), {"invalid base64"}},
      {"day that does not exist",
       inPlist("<date>2023-02-29T00:00:00Z</date>"),
       {"line 3", "invalid date \"2023-02-29T00:00:00Z\""}},
      {"month 13", inPlist("<date>2024-13-01T00:00:00Z</date>"), {"invalid date"}},
      {"hour 24", inPlist("<date>2024-01-01T24:00:00Z</date>"), {"invalid date"}},
      {"date without zone", inPlist("<date>2024-01-01T00:00:00</date>"), {"invalid date"}},
      {"date with a space", inPlist("<date>2024-01-01 00:00:00Z</date>"), {"invalid date"}},
      {"year zero", inPlist("<date>0000-01-01T00:00:00Z</date>"), {"invalid date"}},
      // ---- XML: structure ----
      {"duplicate key",
       inPlist("<dict>\n<key>a</key><true/>\n<key>a</key><false/></dict>"),
       {"line 5, column 1: duplicate key \"a\""}},
      {"key without a value",
       inPlist("<dict><key>a</key></dict>"),
       {"line 3", "key \"a\" has no value"}},
      {"two keys in a row",
       inPlist("<dict><key>a</key><key>b</key></dict>"),
       {"key \"a\" has no value"}},
      {"value without a key",
       inPlist("<dict><true/></dict>"),
       {"line 3, column 7: <true> without a <key> in <dict>"}},
      {"key in an array", inPlist("<array><key>a</key></array>"), {"<key> outside a <dict>"}},
      {"unknown element",
       inPlist("<array><foo/></array>"),
       {"line 3, column 8: unknown element <foo>"}},
      {"text in a dictionary",
       inPlist("<dict>stray</dict>"),
       {"line 3", "unexpected text \"stray\" in <dict>"}},
      {"text in <true>", inPlist("<true>yes</true>"), {"unexpected text \"yes\" in <true>"}},
      {"element inside a string",
       inPlist("<string>a<b/>c</string>"),
       {"line 3, column 10: element <b> inside <string>"}},
      {"two values in <plist>",
       inPlist("<true/><false/>"),
       {"line 3, column 8: more than one value in <plist>"}},
      {"empty <plist>", inPlist(""), {"<plist> holds no value"}},
      {"<plist> inside a value", inPlist("<array><plist/></array>"), {"<plist> inside <array>"}},
      {"two root elements", xml("<true/><false/>"), {"line 1, column 8", "junk after document"}},
      {"unclosed element",
       xml("<plist>\n<dict>"),
       {"XML property list, line 2, column 7: no element found"}},
      {"empty document", xml(""), {"XML property list, line 1", "no element found"}},
      {"100,000-deep XML",
       xml(deepXml),
       {"line 1, column 3585: containers nested deeper than 512 levels"}},
      // ---- XML: encoding ----
      {"invalid UTF-8 in text",
       inPlist("<string>\xC3\x28</string>"),
       {"line 3, column 9", "not well-formed"}},
      {"overlong UTF-8", inPlist("<string>\xC0\xAF</string>"), {"line 3", "not well-formed"}},
      {"UTF-8 encoded surrogate",
       inPlist("<string>\xED\xA0\x80</string>"),
       {"line 3", "not well-formed"}},
      {"control character", inPlist("<string>\x01</string>"), {"line 3", "not well-formed"}},
      {"reference to a forbidden character",
       inPlist("<string>&#1;</string>"),
       {"line 3", "reference to invalid character number"}},
      // ---- XML: entities ----
      {"billion laughs",
       xml(laughs),
       {"XML property list, line 3", "entity declaration \"lol\" is not allowed"}},
      {"external entity",
       xml("<!DOCTYPE plist [<!ENTITY xxe SYSTEM \"file:///etc/passwd\">]>"
           "<plist><string>&xxe;</string></plist>"),
       {"line 1", "entity declaration \"xxe\" is not allowed"}},
      {"parameter entity",
       xml("<!DOCTYPE plist [<!ENTITY % p SYSTEM \"http://example.invalid/x.dtd\"> %p;]>"
           "<plist><true/></plist>"),
       {"line 1", "parameter entity declaration \"p\" is not allowed"}},
      {"undeclared entity behind an external DTD",
       xml("<!DOCTYPE plist PUBLIC \"-//Example//DTD PLIST 1.0//EN\" "
           "\"http://example.invalid/PropertyList-1.0.dtd\">\n"
           "<plist><string>&secret;</string></plist>"),
       {"line 2, column 16: reference to undeclared entity &secret;"}},
      {"undeclared entity", inPlist("<string>&secret;</string>"), {"line 3", "undefined entity"}},

      // ---- binary: trailer and offsets ----
      {"unsupported version",
       xml("bplist15" + std::string(40, '\0')),
       {"binary property list: unsupported format version \"15\""}},
      {"too short", xml("bplist00\x08"), {"binary property list: file is too short (9 bytes)"}},
      {"offset table outside the file",
       setTrailer(bplist({{0x09}}), TrailerField::TableOffset, 0x1000),
       {"binary property list: trailer at offset 0xa: offset table at 0x1000 lies outside the "
        "file"}},
      {"offset table inside the header",
       setTrailer(bplist({{0x09}}), TrailerField::TableOffset, 3),
       {"offset table at 0x3 lies outside the file"}},
      {"2^60 objects declared",
       setTrailer(bplist({{0x09}}), TrailerField::NumObjects, 1ull << 60),
       {"trailer at offset 0xa: 1152921504606846976 objects do not fit in the offset table at "
        "0x9"}},
      {"no objects", setTrailer(bplist({{0x09}}), TrailerField::NumObjects, 0), {"no objects"}},
      {"top object that does not exist",
       setTrailer(bplist({{0x09}}), TrailerField::TopObject, 1),
       {"top object 1 does not exist (1 objects)"}},
      {"offset into the offset table",
       [] {
         Bytes b = bplist({{0xA1, 1}, {0x09}});
         b[b.size() - 32 - 1] = 0x0B;  // object 1 "starts" at the offset table
         return b;
       }(),
       {"binary property list: object 1: offset 0xb lies outside the object area 0x8-0xb"}},
      {"offset into the header",
       [] {
         Bytes b = bplist({{0xA1, 1}, {0x09}});
         b[b.size() - 32 - 1] = 0x02;
         return b;
       }(),
       {"object 1: offset 0x2 lies outside the object area"}},
      {"reference to a missing object",
       bplist({{0xA1, 7}}),
       {"binary property list: object 0 at offset 0x8: reference to object 7, but there are only "
        "1 objects"}},
      // ---- binary: cycles and depth ----
      {"array containing itself",
       bplist({{0xA1, 0}}),
       {"object 0 at offset 0x8: reference cycle: object 0 contains itself"}},
      {"two arrays containing each other",
       bplist({{0xA1, 1}, {0xA1, 0}}),
       {"object 1 at offset 0xa: reference cycle: object 0 contains itself"}},
      {"dictionary containing itself",
       bplist({{0xD1, 1, 0}, {0x51, 'k'}}),
       {"object 0 at offset 0x8: reference cycle"}},
      {"100,000-deep binary",
       deepBinary(100000),
       {"object 512 at offset 0xa08: containers nested deeper than 512 levels"}},
      {"2^40 leaves through shared references",
       exponentialBinary(40),
       {"shared references expand beyond"}},
      // ---- binary: declared lengths ----
      {"data of length 2^60",
       lengthAbove(0x40, 1ull << 60),
       {"object 0 at offset 0x8: data of 1152921504606846976 bytes does not fit in the 1 bytes "
        "left"}},
      {"ASCII string of length 2^62",
       lengthAbove(0x50, 1ull << 62),
       {"string of 4611686018427387904 bytes does not fit"}},
      {"UTF-16 string of length 2^63",
       lengthAbove(0x60, 1ull << 63),
       {"string of 9223372036854775808 UTF-16 units does not fit"}},
      {"array of 2^61 members",
       lengthAbove(0xA0, 1ull << 61),
       {"array of 2305843009213693952 members does not fit"}},
      {"dictionary of 2^64-1 entries",
       lengthAbove(0xD0, ~0ull),
       {"dictionary of 18446744073709551615 entries does not fit"}},
      {"length that is not an integer",
       bplist({{0x4F, 0x23, 0, 0, 0, 0, 0, 0, 0, 0}}),
       {"object 0 at offset 0x8: length is not an integer (marker 0x23)"}},
      {"integer cut short", bplist({{0x13, 0, 0}}), {"integer is truncated"}},
      // ---- binary: values ----
      {"non-ASCII byte in an ASCII string",
       bplist({{0x53, 'a', 0xC3, 0xA9}}),
       {"object 0 at offset 0x8: byte 0xc3 at offset 0xa in an ASCII string is not ASCII"}},
      {"unpaired high surrogate",
       bplist({{0x62, 0xD8, 0x3D, 0x00, 0x41}}),
       {"object 0 at offset 0x8: unpaired UTF-16 surrogate 0xd83d at offset 0x9"}},
      {"lone low surrogate", bplist({{0x61, 0xDE, 0x00}}), {"unpaired UTF-16 surrogate 0xde00"}},
      {"high surrogate at the end",
       bplist({{0x61, 0xD8, 0x00}}),
       {"unpaired UTF-16 surrogate 0xd800"}},
      {"duplicate key",
       bplist({{0xD2, 1, 2, 3, 3}, {0x51, 'a'}, {0x51, 'a'}, {0x08}}),
       {"object 0 at offset 0x8: duplicate key \"a\""}},
      {"the same key object twice",
       bplist({{0xD2, 1, 1, 2, 2}, {0x51, 'a'}, {0x08}}),
       {"duplicate key \"a\""}},
      {"integer as a key",
       bplist({{0xD1, 1, 1}, {0x10, 5}}),
       {"object 0 at offset 0x8: dictionary key (object 1) is an integer, not a string"}},
      {"array as a key",
       bplist({{0xD1, 1, 2}, {0xA0}, {0x08}}),
       {"dictionary key (object 1) is an array, not a string"}},
      {"128-bit integer beyond 64 bits",
       bplist({{0x14, 0, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0}}),
       {"object 0 at offset 0x8: 128-bit integer does not fit in 64 bits"}},
      {"null", bplist({{0x00}}), {"object 0 at offset 0x8: null is not a property-list value"}},
      {"fill byte",
       bplist({{0xA1, 1}, {0x0F}}),
       {"object 1 at offset 0xa: fill byte where an object was expected"}},
      {"unknown marker", bplist({{0x70}}), {"object 0 at offset 0x8: unknown marker 0x70"}},
      {"odd real size", bplist({{0x21, 0, 0}}), {"unknown marker 0x21"}},
      {"uid of 9 bytes", bplist({{0x88, 0, 0, 0, 0, 0, 0, 0, 0, 1}}), {"uid of 9 bytes"}},
  };

  // A valid file cut at every length.
  const Bytes whole = *writeBinary(testing::everyType());
  for (std::size_t n = 0; n < whole.size(); ++n) {
    cases.push_back({"truncated to " + std::to_string(n) + " bytes",
                     Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(n)),
                     {n < 6 ? "XML property list, line 1" : "binary property list: "}});
  }
  return cases;
}

TEST(HostileInputTest, IsRefusedWithAMessageSayingWhatAndWhere) {
  for (const Case& c : hostileCases()) {
    SCOPED_TRACE(c.name);
    ParseError error;
    std::optional<Value> value = parse(c.input, &error);
    EXPECT_FALSE(value) << value->describe().substr(0, 200);
    for (const std::string& part : c.expected) {
      EXPECT_NE(error.message.find(part), std::string::npos)
          << "message: " << error.message << "\nexpected to contain: " << part;
    }
  }
}

}  // namespace
}  // namespace appsync::plist
