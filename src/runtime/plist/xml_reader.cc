// Reads XML property lists through expat, hardened against entity tricks, building the value
// tree with an explicit stack of open containers.
//
// The root element is <plist> holding exactly one value, or (as other readers allow) a value
// element itself. Entity declarations of any kind are refused, so nothing can expand or be
// fetched; the usual <!DOCTYPE plist PUBLIC ...> header is fine.
#include <expat.h>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/plist/readers.h"
#include "runtime/plist/text_encoding.h"

namespace appsync::plist::internal {
namespace {

enum class Element { Plist, Dict, Array, Key, String, Integer, Real, Date, Data, True, False };

std::optional<Element> elementNamed(std::string_view name) {
  static constexpr std::pair<std::string_view, Element> kNames[] = {
      {"key", Element::Key},     {"string", Element::String},   {"dict", Element::Dict},
      {"array", Element::Array}, {"integer", Element::Integer}, {"real", Element::Real},
      {"true", Element::True},   {"false", Element::False},     {"date", Element::Date},
      {"data", Element::Data},   {"plist", Element::Plist},
  };
  for (const auto& [n, e] : kNames) {
    if (n == name) return e;
  }
  return std::nullopt;
}

const char* nameOf(Element e) {
  switch (e) {
    case Element::Plist:
      return "plist";
    case Element::Dict:
      return "dict";
    case Element::Array:
      return "array";
    case Element::Key:
      return "key";
    case Element::String:
      return "string";
    case Element::Integer:
      return "integer";
    case Element::Real:
      return "real";
    case Element::Date:
      return "date";
    case Element::Data:
      return "data";
    case Element::True:
      return "true";
    case Element::False:
      return "false";
  }
  return "?";
}

bool isXmlSpace(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

std::string_view trim(std::string_view s) {
  while (!s.empty() && isXmlSpace(s.front())) s.remove_prefix(1);
  while (!s.empty() && isXmlSpace(s.back())) s.remove_suffix(1);
  return s;
}

// Quoted for a message, cut short when long.
std::string quoted(std::string_view s) {
  constexpr std::size_t kShown = 40;
  std::string out = "\"";
  if (s.size() <= kShown) {
    out += s;
  } else {
    // Do not cut a UTF-8 sequence in half.
    std::size_t cut = kShown;
    while (cut > 0 && (static_cast<unsigned char>(s[cut]) & 0xC0) == 0x80) --cut;
    out += s.substr(0, cut);
    out += "...";
  }
  out += '"';
  return out;
}

enum class IntegerProblem { None, Malformed, OutOfRange };

// Decimal or 0x-prefixed hexadecimal with an optional sign; from INT64_MIN to UINT64_MAX.
IntegerProblem parseInteger(std::string_view s, Integer* out) {
  bool negative = false;
  if (!s.empty() && (s[0] == '-' || s[0] == '+')) {
    negative = s[0] == '-';
    s.remove_prefix(1);
  }
  int base = 10;
  if (s.size() > 2 && s[0] == '0' && (s[1] == 'x' || s[1] == 'X')) {
    base = 16;
    s.remove_prefix(2);
  }
  if (s.empty() || s[0] == '+' || s[0] == '-') return IntegerProblem::Malformed;
  std::uint64_t magnitude = 0;
  auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), magnitude, base);
  if (end != s.data() + s.size()) {
    // from_chars stops at the first non-digit even when the digits so far overflowed.
    bool allDigits = std::all_of(s.begin(), s.end(), [base](char c) {
      return base == 10 ? (c >= '0' && c <= '9') : std::isxdigit(static_cast<unsigned char>(c));
    });
    return allDigits ? IntegerProblem::OutOfRange : IntegerProblem::Malformed;
  }
  if (ec == std::errc::result_out_of_range) return IntegerProblem::OutOfRange;
  if (ec != std::errc()) return IntegerProblem::Malformed;
  if (negative) {
    if (magnitude > (std::uint64_t{1} << 63)) return IntegerProblem::OutOfRange;
    *out = Integer{0 - magnitude, false};
  } else {
    *out = Integer::fromUnsigned(magnitude);
  }
  return IntegerProblem::None;
}

// The whole text as a double; "nan", "inf" and "-inf" included.
std::optional<double> parseReal(std::string_view s) {
  if (s.size() > 1 && s[0] == '+' && s[1] != '-' && s[1] != '+') s.remove_prefix(1);
  if (s.empty()) return std::nullopt;
  double value = 0;
  auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), value);
  if (ec != std::errc() || end != s.data() + s.size()) return std::nullopt;
  return value;
}

class XmlReader {
 public:
  XmlReader() : parser_(XML_ParserCreate(nullptr)) {}
  ~XmlReader() {
    if (parser_) XML_ParserFree(parser_);
  }
  XmlReader(const XmlReader&) = delete;
  XmlReader& operator=(const XmlReader&) = delete;

  std::optional<Value> run(std::span<const std::uint8_t> bytes, ParseError* error);

 private:
  // An open <plist>, <dict> or <array>.
  struct Container {
    Element element;
    Array array;
    Dict dict;
    std::optional<std::string> pendingKey;  // <dict>: a key still waiting for its value
    std::optional<Value> value;             // <plist>: its one value
  };

  static void XMLCALL onStart(void* self, const XML_Char* name, const XML_Char**) {
    static_cast<XmlReader*>(self)->start(name);
  }
  static void XMLCALL onEnd(void* self, const XML_Char*) { static_cast<XmlReader*>(self)->end(); }
  static void XMLCALL onText(void* self, const XML_Char* s, int len) {
    static_cast<XmlReader*>(self)->text(std::string_view(s, static_cast<std::size_t>(len)));
  }
  static void XMLCALL onEntityDecl(void* self, const XML_Char* name, int isParameter,
                                   const XML_Char*, int, const XML_Char*, const XML_Char*,
                                   const XML_Char*, const XML_Char*) {
    static_cast<XmlReader*>(self)->fail(std::string(isParameter ? "parameter " : "") +
                                        "entity declaration \"" + name + "\" is not allowed");
  }
  static void XMLCALL onSkippedEntity(void* self, const XML_Char* name, int) {
    static_cast<XmlReader*>(self)->fail(std::string("reference to undeclared entity &") + name +
                                        ";");
  }
  static int XMLCALL onExternalEntity(XML_Parser, const XML_Char*, const XML_Char*, const XML_Char*,
                                      const XML_Char*) {
    return XML_STATUS_ERROR;
  }

  void start(const char* name);
  void end();
  void text(std::string_view s);
  void finishLeaf();
  void deliver(Value value);
  void fail(const std::string& what) { failAt(position(), what); }
  void failAt(std::pair<unsigned long, unsigned long> where, const std::string& what);
  std::pair<unsigned long, unsigned long> position() const {
    return {XML_GetCurrentLineNumber(parser_), XML_GetCurrentColumnNumber(parser_) + 1};
  }

  XML_Parser parser_;
  std::vector<Container> stack_;
  std::size_t depth_ = 0;  // open <dict> and <array> elements
  bool inLeaf_ = false;
  Element leaf_ = Element::String;
  std::pair<unsigned long, unsigned long> leafStart_;
  std::string text_;
  std::optional<Value> root_;
  bool failed_ = false;
  std::string error_;
};

void XmlReader::failAt(std::pair<unsigned long, unsigned long> where, const std::string& what) {
  if (failed_) return;
  failed_ = true;
  error_ = "XML property list, line " + std::to_string(where.first) + ", column " +
           std::to_string(where.second) + ": " + what;
  XML_StopParser(parser_, XML_FALSE);
}

void XmlReader::start(const char* rawName) {
  if (failed_) return;
  std::string_view name(rawName);
  if (inLeaf_) {
    return fail("element <" + std::string(name) + "> inside <" + nameOf(leaf_) + ">");
  }
  std::optional<Element> element = elementNamed(name);
  if (!element) return fail("unknown element <" + std::string(name) + ">");

  // (A second root element never gets here: expat refuses it as junk after the document.)
  if (stack_.empty()) {
    if (*element == Element::Key) return fail("<key> outside a <dict>");
  } else {
    Container& parent = stack_.back();
    if (*element == Element::Plist) {
      return fail("<plist> inside <" + std::string(nameOf(parent.element)) + ">");
    }
    switch (parent.element) {
      case Element::Plist:
        if (*element == Element::Key) return fail("<key> outside a <dict>");
        if (parent.value) return fail("more than one value in <plist>");
        break;
      case Element::Array:
        if (*element == Element::Key) return fail("<key> outside a <dict>");
        break;
      case Element::Dict:
        if (*element == Element::Key) {
          if (parent.pendingKey) return fail("key " + quoted(*parent.pendingKey) + " has no value");
        } else if (!parent.pendingKey) {
          return fail("<" + std::string(name) + "> without a <key> in <dict>");
        }
        break;
      default:
        break;
    }
  }

  switch (*element) {
    case Element::Dict:
    case Element::Array:
      if (depth_ >= kMaxDepth) {
        return fail("containers nested deeper than " + std::to_string(kMaxDepth) + " levels");
      }
      ++depth_;
      [[fallthrough]];
    case Element::Plist:
      stack_.push_back(Container{*element, {}, {}, {}, {}});
      break;
    default:
      inLeaf_ = true;
      leaf_ = *element;
      leafStart_ = position();
      text_.clear();
      break;
  }
}

void XmlReader::text(std::string_view s) {
  if (failed_) return;
  if (inLeaf_ && leaf_ != Element::True && leaf_ != Element::False) {
    text_.append(s);
    return;
  }
  if (std::all_of(s.begin(), s.end(), isXmlSpace)) return;
  std::string where = inLeaf_          ? nameOf(leaf_)
                      : stack_.empty() ? "document"
                                       : nameOf(stack_.back().element);
  fail("unexpected text " + quoted(trim(s)) + " in <" + where + ">");
}

void XmlReader::end() {
  if (failed_) return;
  if (inLeaf_) return finishLeaf();
  Container done = std::move(stack_.back());
  stack_.pop_back();
  switch (done.element) {
    case Element::Plist:
      if (!done.value) return fail("<plist> holds no value");
      root_ = std::move(*done.value);
      return;
    case Element::Dict:
      --depth_;
      if (done.pendingKey) return fail("key " + quoted(*done.pendingKey) + " has no value");
      return deliver(Value(std::move(done.dict)));
    default:
      --depth_;
      return deliver(Value(std::move(done.array)));
  }
}

void XmlReader::finishLeaf() {
  inLeaf_ = false;
  switch (leaf_) {
    case Element::Key: {
      Container& parent = stack_.back();
      if (parent.dict.contains(text_)) return failAt(leafStart_, "duplicate key " + quoted(text_));
      parent.pendingKey = std::move(text_);
      return;
    }
    case Element::String:
      return deliver(Value(std::move(text_)));
    case Element::Integer: {
      Integer value;
      switch (parseInteger(trim(text_), &value)) {
        case IntegerProblem::None:
          return deliver(Value(value));
        case IntegerProblem::Malformed:
          return failAt(leafStart_, "invalid integer " + quoted(trim(text_)));
        case IntegerProblem::OutOfRange:
          return failAt(leafStart_, "integer out of range " + quoted(trim(text_)));
      }
      return;
    }
    case Element::Real: {
      std::optional<double> value = parseReal(trim(text_));
      if (!value) return failAt(leafStart_, "invalid real " + quoted(trim(text_)));
      return deliver(Value(*value));
    }
    case Element::Date: {
      std::optional<double> value = text::parseIsoDate(trim(text_));
      if (!value) {
        return failAt(leafStart_,
                      "invalid date " + quoted(trim(text_)) + " (expected YYYY-MM-DDTHH:MM:SSZ)");
      }
      return deliver(Value(Date{*value}));
    }
    case Element::Data: {
      std::optional<Bytes> value = text::base64Decode(text_);
      if (!value) return failAt(leafStart_, "invalid base64 in <data>");
      return deliver(Value(std::move(*value)));
    }
    case Element::True:
      return deliver(Value(true));
    case Element::False:
      return deliver(Value(false));
    default:
      return;
  }
}

void XmlReader::deliver(Value value) {
  if (stack_.empty()) {
    root_ = std::move(value);
    return;
  }
  Container& parent = stack_.back();
  switch (parent.element) {
    case Element::Plist:
      parent.value = std::move(value);
      break;
    case Element::Array:
      parent.array.push_back(std::move(value));
      break;
    default:
      parent.dict.insertNew(std::move(*parent.pendingKey), std::move(value));
      parent.pendingKey.reset();
      break;
  }
}

std::optional<Value> XmlReader::run(std::span<const std::uint8_t> bytes, ParseError* error) {
  auto report = [&](std::string message) -> std::optional<Value> {
    if (error) error->message = std::move(message);
    return std::nullopt;
  };
  if (!parser_) return report("XML property list: out of memory");
  XML_SetUserData(parser_, this);
  XML_SetElementHandler(parser_, onStart, onEnd);
  XML_SetCharacterDataHandler(parser_, onText);
  XML_SetEntityDeclHandler(parser_, onEntityDecl);
  XML_SetSkippedEntityHandler(parser_, onSkippedEntity);
  XML_SetExternalEntityRefHandler(parser_, onExternalEntity);
  XML_SetParamEntityParsing(parser_, XML_PARAM_ENTITY_PARSING_NEVER);

  XML_Status status = XML_Parse(parser_, reinterpret_cast<const char*>(bytes.data()),
                                static_cast<int>(bytes.size()), XML_TRUE);
  if (failed_) return report(std::move(error_));
  if (status != XML_STATUS_OK) {
    auto [line, column] = position();
    return report("XML property list, line " + std::to_string(line) + ", column " +
                  std::to_string(column) + ": " + XML_ErrorString(XML_GetErrorCode(parser_)));
  }
  if (!root_) return report("XML property list, line 1, column 1: no value");
  return std::move(root_);
}

}  // namespace

std::optional<Value> parseXml(std::span<const std::uint8_t> bytes, ParseError* error) {
  XmlReader reader;
  return reader.run(bytes, error);
}

}  // namespace appsync::plist::internal
