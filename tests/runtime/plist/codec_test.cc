// The property-list codec on well-formed input (every type both ways is the interop test's):
// awkward values through XML, integer and real forms, the usual XML forms, depth and what writers
// refuse.
#include "runtime/plist/codec.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <memory>
#include <string>

#include "runtime/plist/plist_test_util.h"

namespace appsync::plist {
namespace {

using testing::BplistBuilder;

std::span<const std::uint8_t> bytesOf(std::string_view s) {
  return {reinterpret_cast<const std::uint8_t*>(s.data()), s.size()};
}

std::optional<Value> parseText(std::string_view s, ParseError* error = nullptr) {
  return parse(bytesOf(s), error);
}

std::string plistXml(std::string_view body) {
  return std::string("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n") +
         std::string(body) + "\n</plist>\n";
}

Value nested(std::size_t depth) {
  Value v = Array{};
  for (std::size_t i = 1; i < depth; ++i) v = Array{std::move(v)};
  return v;
}

TEST(CodecTest, AwkwardValuesSurviveXml) {
  Bytes blob;  // longer than one base64 line
  for (int i = 0; i < 60; ++i) blob.push_back(static_cast<std::uint8_t>(i));
  const Value value = Dict{{"name", "a & b <c>\r\n\t\u00e9 ]]>"},
                           {"reals", Array{0.1, 1e100, -std::numeric_limits<double>::infinity()}},
                           {"blobs", Array{blob, Bytes{}}},
                           {"empty", Array{true, false, Array{}, Dict{}, ""}}};
  EXPECT_EQ(parseText(*writeXml(value)), value);
  // NaN stays NaN; a date keeps only its whole seconds.
  std::optional<Value> back = parseText(*writeXml(Array{std::nan(""), Date{730902896.75}}));
  ASSERT_TRUE(back);
  EXPECT_TRUE(std::isnan(*(*back->array())[0].real()));
  EXPECT_EQ((*back->array())[1].date()->secondsSince2001, 730902896);
}

TEST(CodecTest, IntegerForms) {
  const std::pair<const char*, Integer> cases[] = {
      {"0", Integer::fromSigned(0)},
      {"+255", Integer::fromSigned(255)},
      {" 0x10000 ", Integer::fromSigned(65536)},
      {"0XffffFFFF", Integer::fromSigned(0xFFFFFFFF)},
      {"-1", Integer::fromSigned(-1)},
      {"-0x10", Integer::fromSigned(-16)},
      {"-0", Integer::fromSigned(0)},
      {"-9223372036854775808", Integer::fromSigned(std::numeric_limits<std::int64_t>::min())},
      {"9223372036854775807", Integer::fromSigned(std::numeric_limits<std::int64_t>::max())},
      {"9223372036854775808", Integer::fromUnsigned(1ull << 63)},
      {"18446744073709551615", Integer::fromUnsigned(~0ull)},
  };
  for (const auto& [text, expected] : cases) {
    SCOPED_TRACE(text);
    ParseError error;
    std::optional<Value> v =
        parseText(plistXml(std::string("<integer>") + text + "</integer>"), &error);
    ASSERT_TRUE(v) << error.message;
    EXPECT_EQ(*v->integer(), expected);
    EXPECT_EQ(parse(*writeBinary(*v)), v);
  }

  // The platform's other encodings: 1/2/4-byte integers are unsigned, and a 16-byte integer
  // may carry a negative 64-bit value.
  BplistBuilder b;
  b.objects = {{0xA3, 1, 2, 3},
               {0x12, 0xFF, 0xFF, 0xFF, 0xFE},
               {0x14, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF,
                0xFF, 0xFF, 0xFE},
               {0x14, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 5}};
  EXPECT_EQ(parse(b.build()), Value(Array{0xFFFFFFFEll, -2, 5}));
}

TEST(CodecTest, RealForms) {
  struct Case {
    const char* text;
    double expected;
  };
  const Case cases[] = {
      {"1.5", 1.5},      {"-0.25", -0.25},  {"+2", 2.0},
      {" 1e10\n", 1e10}, {"inf", HUGE_VAL}, {"-inf", -HUGE_VAL},
      {"-0", -0.0},      {".5", 0.5},       {"4.9406564584124654e-324", 4.9406564584124654e-324},
  };
  for (const Case& c : cases) {
    ParseError error;
    std::optional<Value> v =
        parseText(plistXml(std::string("<real>") + c.text + "</real>"), &error);
    ASSERT_TRUE(v) << c.text << ": " << error.message;
    EXPECT_EQ(*v->real(), c.expected) << c.text;
    EXPECT_EQ(std::signbit(*v->real()), std::signbit(c.expected)) << c.text;
  }

  // A 4-byte binary real widens to a double.
  BplistBuilder b;
  b.objects = {{0x22, 0x3F, 0xC0, 0x00, 0x00}};
  EXPECT_EQ(parse(b.build()), Value(1.5));
}

TEST(CodecTest, SharedReferencesWithoutCyclesAreAllowed) {
  // [A, A, "s", S] where A = ["s"] and S is the set {A}, read as an array: one object reached
  // along several paths.
  BplistBuilder b;
  b.objects = {{0xA4, 1, 1, 2, 3}, {0xA1, 2}, {0x51, 's'}, {0xC1, 1}};
  // Value(...) around the inner array: braces around a lone Array would copy it, not nest it.
  EXPECT_EQ(parse(b.build()), Value(Array{Array{"s"}, Array{"s"}, "s", Array{Value(Array{"s"})}}));
}

TEST(CodecTest, XmlReaderAcceptsTheUsualForms) {
  struct Case {
    std::string xml;
    Value expected;
  };
  const Case cases[] = {
      // A byte-order mark, comments, processing instructions, CDATA and character references.
      {"\xEF\xBB\xBF<?xml version=\"1.0\"?><!-- c --><plist><?pi x?><string>a&amp;&lt;&gt;&quot;"
       "&apos;&#x41;&#66;<![CDATA[<raw>]]></string></plist>",
       "a&<>\"'AB<raw>"},
      // The standard DOCTYPE, and no version attribute.
      {"<!DOCTYPE plist PUBLIC \"-//Example//DTD PLIST 1.0//EN\" "
       "\"http://example.invalid/PropertyList-1.0.dtd\"><plist><true/></plist>",
       true},
      // No <plist> wrapper at all.
      {"<dict><key>a</key><integer>1</integer></dict>", Dict{{"a", 1}}},
      // Whitespace inside data and around numbers and dates; whitespace-only <string>.
      {plistXml("<array><data>\n\tAAEC\n\tAw==\n</data><integer>\n 5 \n</integer>"
                "<date> 2001-01-01T00:00:01Z </date><string>  </string><false></false></array>"),
       Array{Bytes{0, 1, 2, 3}, 5, Date{1}, "  ", false}},
      // Empty keys and strings, empty containers in both spellings.
      {plistXml("<dict><key></key><string/><key>d</key><dict></dict><key>a</key><array/></dict>"),
       Dict{{"", ""}, {"d", Dict{}}, {"a", Array{}}}},
      // Dates at the ends of the range and on a leap day.
      {plistXml("<array><date>0001-01-01T00:00:00Z</date><date>9999-12-31T23:59:59Z</date>"
                "<date>2000-02-29T00:00:00Z</date></array>"),
       Array{Date{-63113904000}, Date{252423993599}, Date{-86400 * 307}}},
  };
  for (const Case& c : cases) {
    ParseError error;
    EXPECT_EQ(parseText(c.xml, &error), c.expected) << c.xml << "\n" << error.message;
  }
}

TEST(CodecTest, DepthLimitIsExact) {
  for (Format format : {Format::Xml, Format::Binary}) {
    std::optional<Bytes> deepest = write(nested(kMaxDepth), format);
    ASSERT_TRUE(deepest);
    EXPECT_TRUE(parse(*deepest));
    std::string error;
    EXPECT_FALSE(write(nested(kMaxDepth + 1), format, &error));
    EXPECT_NE(error.find("nested deeper than 512 levels"), std::string::npos) << error;
  }
}

TEST(CodecTest, WritersRefuseWhatTheFormatCannotCarry) {
  struct Case {
    Value value;
    Format format;
    const char* error;
  };
  const Case cases[] = {
      {Array{"ok", std::string("\xC3\x28")}, Format::Binary,
       "binary property list: string is not valid UTF-8"},
      {Dict{{std::string("\xFF"), 1}}, Format::Binary,
       "binary property list: string is not valid UTF-8"},
      {std::string("\xED\xA0\x80"), Format::Xml, "XML property list: string is not valid UTF-8"},
      {Dict{{"k", std::string("a\x01")}}, Format::Xml,
       "XML property list: control character U+0001 cannot be written in XML"},
      {Dict{{std::string("\x1F"), 1}}, Format::Xml,
       "XML property list: control character U+001F cannot be written in XML"},
      {"\uFFFF", Format::Xml, "XML property list: character U+FFFF cannot be written in XML"},
      {Date{1e300}, Format::Xml,
       "XML property list: date <date 1e+300> is outside years 0001-9999"},
      {Date{std::nan("")}, Format::Xml,
       "XML property list: date <date nan> is outside years 0001-9999"},
  };
  for (const Case& c : cases) {
    std::string error;
    EXPECT_FALSE(write(c.value, c.format, &error)) << c.error;
    EXPECT_EQ(error, c.error);
  }
  // What XML cannot carry is fine in binary, NUL included.
  Value binaryOnly = Array{std::string("a\x01\0b", 4), Date{1e300}};
  EXPECT_EQ(parse(*writeBinary(binaryOnly)), binaryOnly);
}

TEST(CodecTest, InputSizeIsBounded) {
  auto big = std::make_unique_for_overwrite<std::uint8_t[]>(kMaxInputSize + 1);
  ParseError error;
  EXPECT_FALSE(parse({big.get(), kMaxInputSize + 1}, &error));
  EXPECT_EQ(error.message,
            "property list of 268435457 bytes is larger than the limit of 268435456 bytes");
}

}  // namespace
}  // namespace appsync::plist
