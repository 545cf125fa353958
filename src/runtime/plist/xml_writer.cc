// Writes XML property lists: the standard header, one element per line, tab indentation.
//
// XML has no uid element: a uid is written as <dict><key>CF$UID</key><integer>N</integer></dict>
// and reads back as that dictionary. Every other value reads back as it was written, except
// that dates keep whole seconds only.
#include <charconv>
#include <cmath>
#include <cstdio>
#include <vector>

#include "runtime/plist/codec.h"
#include "runtime/plist/text_encoding.h"

namespace appsync::plist {
namespace {

constexpr std::string_view kHeader =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<plist version=\"1.0\">\n";
constexpr std::size_t kBase64LineLength = 76;

class XmlWriter {
 public:
  std::optional<std::string> run(const Value& root, std::string* error);

 private:
  // An open <array> or <dict> whose members are being written.
  struct Frame {
    const Value* container;
    std::size_t next;
  };

  bool value(const Value& v);  // writes a leaf, or opens a container
  bool escaped(std::string_view s);
  void indent() { out_.append(stack_.size(), '\t'); }
  void integer(std::uint64_t bits, bool isSigned) {
    char buf[24];
    auto res = isSigned ? std::to_chars(buf, buf + sizeof buf, static_cast<std::int64_t>(bits))
                        : std::to_chars(buf, buf + sizeof buf, bits);
    out_.append(buf, res.ptr);
  }
  bool fail(std::string what) {
    error_ = std::move(what);
    return false;
  }

  std::vector<Frame> stack_;
  std::string out_;
  std::string error_;
};

bool XmlWriter::escaped(std::string_view s) {
  std::size_t pos = 0;
  while (pos < s.size()) {
    auto c = static_cast<unsigned char>(s[pos]);
    if (c >= 0x80) {
      char32_t cp;
      std::size_t len = text::decodeUtf8(s, pos, &cp);
      if (len == 0) return fail("string is not valid UTF-8");
      if (cp == 0xFFFE || cp == 0xFFFF) {
        return fail("character U+" + std::string(cp == 0xFFFE ? "FFFE" : "FFFF") +
                    " cannot be written in XML");
      }
      out_.append(s.substr(pos, len));
      pos += len;
      continue;
    }
    switch (c) {
      case '&':
        out_ += "&amp;";
        break;
      case '<':
        out_ += "&lt;";
        break;
      case '>':
        out_ += "&gt;";
        break;
      case '\r':
        out_ += "&#13;";
        break;  // a raw CR would be read back as a line feed
      case '\t':
      case '\n':
        out_ += static_cast<char>(c);
        break;
      default:
        if (c < 0x20) {
          char buf[8];
          std::snprintf(buf, sizeof buf, "%04X", c);
          return fail("control character U+" + std::string(buf) + " cannot be written in XML");
        }
        out_ += static_cast<char>(c);
    }
    ++pos;
  }
  return true;
}

bool XmlWriter::value(const Value& v) {
  indent();
  switch (v.type()) {
    case Type::Null:
      return fail("a property list cannot carry null");
    case Type::Boolean:
      out_ += *v.boolean() ? "<true/>\n" : "<false/>\n";
      return true;
    case Type::Integer:
      out_ += "<integer>";
      integer(v.integer()->bits, !v.integer()->isUnsigned);
      out_ += "</integer>\n";
      return true;
    case Type::Real: {
      double d = *v.real();
      out_ += "<real>";
      if (std::isnan(d)) {
        out_ += "nan";
      } else if (std::isinf(d)) {
        out_ += d > 0 ? "inf" : "-inf";
      } else {
        char buf[32];
        auto res = std::to_chars(buf, buf + sizeof buf, d);
        out_.append(buf, res.ptr);
      }
      out_ += "</real>\n";
      return true;
    }
    case Type::String:
      out_ += "<string>";
      if (!escaped(*v.string())) return false;
      out_ += "</string>\n";
      return true;
    case Type::Date: {
      std::optional<std::string> text = text::formatIsoDate(v.date()->secondsSince2001);
      if (!text) return fail("date " + v.describe() + " is outside years 0001-9999");
      out_ += "<date>" + *text + "</date>\n";
      return true;
    }
    case Type::Data: {
      const Bytes& data = *v.data();
      if (data.empty()) {
        out_ += "<data></data>\n";
        return true;
      }
      out_ += "<data>\n";
      std::string base64 = text::base64Encode(data);
      for (std::size_t pos = 0; pos < base64.size(); pos += kBase64LineLength) {
        indent();
        out_.append(base64, pos, kBase64LineLength);
        out_ += '\n';
      }
      indent();
      out_ += "</data>\n";
      return true;
    }
    case Type::Uid:
      out_ += "<dict>\n";
      indent();
      out_ += "\t<key>CF$UID</key>\n";
      indent();
      out_ += "\t<integer>";
      integer(v.uid()->value, false);
      out_ += "</integer>\n";
      indent();
      out_ += "</dict>\n";
      return true;
    case Type::Array:
    case Type::Dict: {
      const bool isDict = v.type() == Type::Dict;
      if (stack_.size() >= kMaxDepth) {
        return fail("containers nested deeper than " + std::to_string(kMaxDepth) + " levels");
      }
      if (isDict ? v.dict()->empty() : v.array()->empty()) {
        out_ += isDict ? "<dict/>\n" : "<array/>\n";
        return true;
      }
      out_ += isDict ? "<dict>\n" : "<array>\n";
      stack_.push_back({&v, 0});
      return true;
    }
  }
  return true;
}

std::optional<std::string> XmlWriter::run(const Value& root, std::string* error) {
  out_ += kHeader;
  bool ok = value(root);
  while (ok && !stack_.empty()) {
    Frame& frame = stack_.back();
    if (const Dict* dict = frame.container->dict()) {
      if (frame.next == dict->size()) {
        stack_.pop_back();
        indent();
        out_ += "</dict>\n";
        continue;
      }
      const Dict::Entry& entry = *(dict->begin() + static_cast<std::ptrdiff_t>(frame.next++));
      indent();
      out_ += "<key>";
      ok = escaped(entry.key);
      out_ += "</key>\n";
      ok = ok && value(entry.value);
    } else {
      const Array& array = *frame.container->array();
      if (frame.next == array.size()) {
        stack_.pop_back();
        indent();
        out_ += "</array>\n";
        continue;
      }
      ok = value(array[frame.next++]);
    }
  }
  if (!ok) {
    if (error) *error = "XML property list: " + error_;
    return std::nullopt;
  }
  out_ += "</plist>\n";
  return std::move(out_);
}

}  // namespace

std::optional<std::string> writeXml(const Value& value, std::string* error) {
  XmlWriter writer;
  return writer.run(value, error);
}

}  // namespace appsync::plist
