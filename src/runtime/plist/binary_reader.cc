// Reads binary property lists ("bplist00"), treating every byte as hostile: each offset, length
// and reference is checked against the file before use, and the object graph is walked with an
// explicit stack that detects cycles and bounds depth.
//
// Layout: the 8-byte header, the objects, the offset table (one offset per object), and a
// 32-byte trailer: 6 unused bytes, the size of an offset, the size of an object reference, then
// the number of objects, the top object and the offset of the offset table (8 bytes each).
#include <bit>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "runtime/plist/readers.h"
#include "runtime/plist/text_encoding.h"

namespace appsync::plist::internal {
namespace {

constexpr std::size_t kHeaderSize = 8;
constexpr std::size_t kTrailerSize = 32;
// A file may reference one object from many places; what those references expand to is
// bounded, so that a small file cannot make a huge tree.
constexpr std::uint64_t kBaseExpansionBudget = 64u << 20;
constexpr std::uint64_t kExpansionPerInputByte = 64;
constexpr std::uint64_t kValueCost = 64;  // roughly what one Value occupies

std::string hex(std::uint64_t v) {
  char buf[24];
  std::snprintf(buf, sizeof buf, "0x%llx", static_cast<unsigned long long>(v));
  return buf;
}

const char* markerKind(std::uint8_t marker) {
  switch (marker >> 4) {
    case 0x0:
      return marker == 0x08 || marker == 0x09 ? "boolean" : "null";
    case 0x1:
      return "integer";
    case 0x2:
      return "real";
    case 0x3:
      return "date";
    case 0x4:
      return "data";
    case 0x5:
    case 0x6:
      return "string";
    case 0x8:
      return "uid";
    case 0xA:
      return "array";
    case 0xC:
      return "set";
    case 0xD:
      return "dictionary";
    default:
      return "unknown object";
  }
}

std::string withArticle(std::string_view noun) {
  bool vowel = !noun.empty() && std::string_view("aeiou").find(noun[0]) != std::string_view::npos;
  return (vowel ? "an " : "a ") + std::string(noun);
}

class BinaryReader {
 public:
  explicit BinaryReader(std::span<const std::uint8_t> bytes)
      : b_(bytes), budget_(kBaseExpansionBudget + kExpansionPerInputByte * bytes.size()) {}

  std::optional<Value> run(ParseError* error);

 private:
  // An array, set or dictionary whose members are being read.
  struct Frame {
    std::uint64_t object;
    std::uint64_t offset;  // of its marker
    std::uint64_t refs;    // offset of its first reference
    std::uint64_t count;   // members (key-value pairs for a dictionary)
    std::uint64_t next = 0;
    bool isDict;
    Array array;
    Dict dict;
    std::string key;  // dictionary: the key of the member being read
  };

  // What an object's marker and length say.
  struct Header {
    std::uint8_t marker;
    std::uint64_t count;    // length, for the types that have one
    std::uint64_t content;  // offset of what follows the marker (and length)
  };

  bool readTrailer();
  bool offsetOf(std::uint64_t object, std::uint64_t* offset);
  bool readHeader(std::uint64_t object, std::uint64_t offset, Header* header);
  bool readRef(const Frame& frame, std::uint64_t position, std::uint64_t* ref);
  // Reads the object; a container is pushed as a new frame, anything else is delivered.
  bool enter(std::uint64_t object);
  bool readKey(const Frame& frame, std::uint64_t object, std::string* key);
  bool readLeaf(std::uint64_t object, std::uint64_t offset, const Header& h, Value* out);
  bool readString(std::uint64_t object, std::uint64_t offset, const Header& h, std::string* out);
  bool charge(std::uint64_t object, std::uint64_t offset, std::uint64_t cost);
  void deliver(Value value);

  bool fail(const std::string& what) {
    if (error_.empty()) error_ = "binary property list: " + what;
    return false;
  }
  bool failObject(std::uint64_t object, std::uint64_t offset, const std::string& what) {
    return fail("object " + std::to_string(object) + " at offset " + hex(offset) + ": " + what);
  }
  std::uint64_t be(std::uint64_t at, std::size_t n) const {
    std::uint64_t v = 0;
    for (std::size_t i = 0; i < n; ++i) v = (v << 8) | b_[at + i];
    return v;
  }

  std::span<const std::uint8_t> b_;
  std::size_t offsetSize_ = 0;
  std::size_t refSize_ = 0;
  std::uint64_t numObjects_ = 0;
  std::uint64_t topObject_ = 0;
  std::uint64_t tableOffset_ = 0;  // objects lie in [kHeaderSize, tableOffset_)
  std::uint64_t budget_;
  std::vector<bool> inProgress_;  // containers on the stack, by object number
  std::vector<Frame> stack_;
  std::optional<Value> root_;
  std::string error_;
};

bool BinaryReader::readTrailer() {
  const std::size_t size = b_.size();
  if (size < kHeaderSize + 2 + kTrailerSize) {
    return fail("file is too short (" + std::to_string(size) + " bytes)");
  }
  if (std::memcmp(b_.data(), "bplist00", kHeaderSize) != 0) {
    std::string version(reinterpret_cast<const char*>(b_.data()) + 6, 2);
    return fail("unsupported format version \"" + version + "\"");
  }
  const std::uint64_t t = size - kTrailerSize;
  offsetSize_ = b_[t + 6];
  refSize_ = b_[t + 7];
  numObjects_ = be(t + 8, 8);
  topObject_ = be(t + 16, 8);
  tableOffset_ = be(t + 24, 8);
  const std::string where = "trailer at offset " + hex(t) + ": ";
  if (offsetSize_ < 1 || offsetSize_ > 8) {
    return fail(where + "offset size " + std::to_string(offsetSize_) + " is not 1 to 8");
  }
  if (refSize_ < 1 || refSize_ > 8) {
    return fail(where + "object reference size " + std::to_string(refSize_) + " is not 1 to 8");
  }
  if (tableOffset_ <= kHeaderSize || tableOffset_ >= t) {
    return fail(where + "offset table at " + hex(tableOffset_) + " lies outside the file");
  }
  if (numObjects_ == 0) return fail(where + "no objects");
  if (numObjects_ > (t - tableOffset_) / offsetSize_) {
    return fail(where + std::to_string(numObjects_) +
                " objects do not fit in the offset table at " + hex(tableOffset_));
  }
  if (topObject_ >= numObjects_) {
    return fail(where + "top object " + std::to_string(topObject_) + " does not exist (" +
                std::to_string(numObjects_) + " objects)");
  }
  return true;
}

bool BinaryReader::offsetOf(std::uint64_t object, std::uint64_t* offset) {
  *offset = be(tableOffset_ + object * offsetSize_, offsetSize_);
  if (*offset < kHeaderSize || *offset >= tableOffset_) {
    return fail("object " + std::to_string(object) + ": offset " + hex(*offset) +
                " lies outside the object area " + hex(kHeaderSize) + "-" + hex(tableOffset_));
  }
  return true;
}

bool BinaryReader::readHeader(std::uint64_t object, std::uint64_t offset, Header* h) {
  h->marker = b_[offset];
  h->count = h->marker & 0x0F;
  h->content = offset + 1;
  switch (h->marker >> 4) {
    case 0x4:
    case 0x5:
    case 0x6:
    case 0xA:
    case 0xC:
    case 0xD:
      break;
    default:
      return true;  // no length
  }
  if (h->count == 0x0F) {
    // The length follows as an integer object.
    if (h->content >= tableOffset_) return failObject(object, offset, "length is missing");
    std::uint8_t intMarker = b_[h->content];
    if ((intMarker & 0xF0) != 0x10 || (intMarker & 0x0F) > 3) {
      return failObject(object, offset, "length is not an integer (marker " + hex(intMarker) + ")");
    }
    std::size_t n = std::size_t{1} << (intMarker & 0x0F);
    if (n > tableOffset_ - h->content - 1) return failObject(object, offset, "length is truncated");
    h->count = be(h->content + 1, n);
    h->content += 1 + n;
  }
  // Every length is checked against the bytes that are left before anything is allocated.
  const std::uint64_t left = tableOffset_ - h->content;
  std::uint64_t unit = 1;
  const char* what = "bytes";
  switch (h->marker >> 4) {
    case 0x6:
      unit = 2, what = "UTF-16 units";
      break;
    case 0xA:
    case 0xC:
      unit = refSize_, what = "members";
      break;
    case 0xD:
      unit = 2 * refSize_, what = "entries";
      break;
    default:
      break;
  }
  if (h->count > left / unit) {
    return failObject(object, offset,
                      std::string(markerKind(h->marker)) + " of " + std::to_string(h->count) + " " +
                          what + " does not fit in the " + std::to_string(left) + " bytes left");
  }
  return true;
}

bool BinaryReader::charge(std::uint64_t object, std::uint64_t offset, std::uint64_t cost) {
  if (cost > budget_) {
    return failObject(
        object, offset,
        "shared references expand beyond " +
            std::to_string(kBaseExpansionBudget + kExpansionPerInputByte * b_.size()) + " bytes");
  }
  budget_ -= cost;
  return true;
}

bool BinaryReader::readString(std::uint64_t object, std::uint64_t offset, const Header& h,
                              std::string* out) {
  const auto* p = b_.data() + h.content;
  if ((h.marker >> 4) == 0x5) {
    if (!charge(object, offset, kValueCost + h.count)) return false;
    for (std::uint64_t i = 0; i < h.count; ++i) {
      if (p[i] >= 0x80) {
        return failObject(object, offset,
                          "byte " + hex(p[i]) + " at offset " + hex(h.content + i) +
                              " in an ASCII string is not ASCII");
      }
    }
    out->assign(reinterpret_cast<const char*>(p), h.count);
    return true;
  }
  if (!charge(object, offset, kValueCost + 3 * h.count)) return false;
  out->clear();
  out->reserve(h.count);
  for (std::uint64_t i = 0; i < h.count; ++i) {
    char32_t unit = (p[2 * i] << 8) | p[2 * i + 1];
    if (unit >= 0xD800 && unit <= 0xDBFF && i + 1 < h.count) {
      char32_t low = (p[2 * i + 2] << 8) | p[2 * i + 3];
      if (low >= 0xDC00 && low <= 0xDFFF) {
        text::appendUtf8(0x10000 + ((unit - 0xD800) << 10) + (low - 0xDC00), *out);
        ++i;
        continue;
      }
    }
    if (unit >= 0xD800 && unit <= 0xDFFF) {
      return failObject(
          object, offset,
          "unpaired UTF-16 surrogate " + hex(unit) + " at offset " + hex(h.content + 2 * i));
    }
    text::appendUtf8(unit, *out);
  }
  return true;
}

bool BinaryReader::readLeaf(std::uint64_t object, std::uint64_t offset, const Header& h,
                            Value* out) {
  const std::uint8_t m = h.marker;
  auto need = [&](std::uint64_t n) {
    if (n > tableOffset_ - h.content) {
      return failObject(object, offset, std::string(markerKind(m)) + " is truncated");
    }
    return true;
  };
  switch (m >> 4) {
    case 0x0:
      if (m == 0x08 || m == 0x09) {
        *out = Value(m == 0x09);
        return charge(object, offset, kValueCost);
      }
      if (m == 0x00) return failObject(object, offset, "null is not a property-list value");
      if (m == 0x0F) return failObject(object, offset, "fill byte where an object was expected");
      break;
    case 0x1: {
      std::size_t lo = m & 0x0F;
      if (lo > 4) break;
      std::size_t n = std::size_t{1} << lo;
      if (!need(n)) return false;
      if (n <= 8) {
        // 1, 2 and 4 bytes are unsigned; 8 bytes are two's complement.
        *out = Value(Integer::fromSigned(static_cast<std::int64_t>(be(h.content, n))));
      } else {
        // 128-bit: only what fits in 64 bits (signed, or unsigned up to 2^64-1).
        std::uint64_t high = be(h.content, 8);
        std::uint64_t low = be(h.content + 8, 8);
        if (high == 0) {
          *out = Value(Integer::fromUnsigned(low));
        } else if (high == ~std::uint64_t{0} && static_cast<std::int64_t>(low) < 0) {
          *out = Value(Integer::fromSigned(static_cast<std::int64_t>(low)));
        } else {
          return failObject(object, offset, "128-bit integer does not fit in 64 bits");
        }
      }
      return charge(object, offset, kValueCost);
    }
    case 0x2:
      if (m == 0x22) {
        if (!need(4)) return false;
        *out = Value(static_cast<double>(
            std::bit_cast<float>(static_cast<std::uint32_t>(be(h.content, 4)))));
        return charge(object, offset, kValueCost);
      }
      if (m == 0x23) {
        if (!need(8)) return false;
        *out = Value(std::bit_cast<double>(be(h.content, 8)));
        return charge(object, offset, kValueCost);
      }
      break;
    case 0x3:
      if (m != 0x33) break;
      if (!need(8)) return false;
      *out = Value(Date{std::bit_cast<double>(be(h.content, 8))});
      return charge(object, offset, kValueCost);
    case 0x4: {
      if (!charge(object, offset, kValueCost + h.count)) return false;
      const auto* p = b_.data() + h.content;
      *out = Value(Bytes(p, p + h.count));
      return true;
    }
    case 0x5:
    case 0x6: {
      std::string s;
      if (!readString(object, offset, h, &s)) return false;
      *out = Value(std::move(s));
      return true;
    }
    case 0x8: {
      std::size_t n = (m & 0x0F) + 1u;
      if (n > 8) return failObject(object, offset, "uid of " + std::to_string(n) + " bytes");
      if (!need(n)) return false;
      *out = Value(Uid{be(h.content, n)});
      return charge(object, offset, kValueCost);
    }
    default:
      break;
  }
  return failObject(object, offset, "unknown marker " + hex(m));
}

bool BinaryReader::readRef(const Frame& frame, std::uint64_t position, std::uint64_t* ref) {
  *ref = be(frame.refs + position * refSize_, refSize_);
  if (*ref >= numObjects_) {
    return failObject(frame.object, frame.offset,
                      "reference to object " + std::to_string(*ref) + ", but there are only " +
                          std::to_string(numObjects_) + " objects");
  }
  if (inProgress_[*ref]) {
    return failObject(frame.object, frame.offset,
                      "reference cycle: object " + std::to_string(*ref) + " contains itself");
  }
  return true;
}

bool BinaryReader::readKey(const Frame& frame, std::uint64_t object, std::string* key) {
  std::uint64_t offset;
  Header h;
  if (!offsetOf(object, &offset) || !readHeader(object, offset, &h)) return false;
  if ((h.marker >> 4) != 0x5 && (h.marker >> 4) != 0x6) {
    return failObject(frame.object, frame.offset,
                      "dictionary key (object " + std::to_string(object) + ") is " +
                          withArticle(markerKind(h.marker)) + ", not a string");
  }
  if (!readString(object, offset, h, key)) return false;
  if (frame.dict.contains(*key)) {
    return failObject(frame.object, frame.offset, "duplicate key \"" + *key + "\"");
  }
  return true;
}

bool BinaryReader::enter(std::uint64_t object) {
  std::uint64_t offset;
  Header h;
  if (!offsetOf(object, &offset) || !readHeader(object, offset, &h)) return false;
  const std::uint8_t type = h.marker >> 4;
  if (type == 0xA || type == 0xC || type == 0xD) {
    if (stack_.size() >= kMaxDepth) {
      return failObject(object, offset,
                        "containers nested deeper than " + std::to_string(kMaxDepth) + " levels");
    }
    if (!charge(object, offset, kValueCost)) return false;  // members pay for themselves
    inProgress_[object] = true;
    Frame frame{object, offset, h.content, h.count, 0, type == 0xD, {}, {}, {}};
    if (frame.isDict) {
      frame.dict.reserve(h.count);
    } else {
      frame.array.reserve(h.count);
    }
    stack_.push_back(std::move(frame));
    return true;
  }
  Value value;
  if (!readLeaf(object, offset, h, &value)) return false;
  deliver(std::move(value));
  return true;
}

void BinaryReader::deliver(Value value) {
  if (stack_.empty()) {
    root_ = std::move(value);
    return;
  }
  Frame& parent = stack_.back();
  if (parent.isDict) {
    parent.dict.insertNew(std::move(parent.key), std::move(value));
  } else {
    parent.array.push_back(std::move(value));
  }
}

std::optional<Value> BinaryReader::run(ParseError* error) {
  auto failed = [&]() -> std::optional<Value> {
    if (error) error->message = std::move(error_);
    return std::nullopt;
  };
  if (!readTrailer()) return failed();
  inProgress_.assign(numObjects_, false);
  if (!enter(topObject_)) return failed();
  while (!stack_.empty()) {
    Frame& frame = stack_.back();
    if (frame.next == frame.count) {
      inProgress_[frame.object] = false;
      Value done = frame.isDict ? Value(std::move(frame.dict)) : Value(std::move(frame.array));
      stack_.pop_back();
      deliver(std::move(done));
      continue;
    }
    const std::uint64_t i = frame.next++;
    std::uint64_t ref;
    if (frame.isDict) {
      std::uint64_t keyRef;
      if (!readRef(frame, i, &keyRef) || !readKey(frame, keyRef, &frame.key)) return failed();
      if (!readRef(frame, frame.count + i, &ref)) return failed();
    } else if (!readRef(frame, i, &ref)) {
      return failed();
    }
    if (!enter(ref)) return failed();  // may reallocate the stack: frame is not used after this
  }
  return std::move(root_);
}

}  // namespace

std::optional<Value> parseBinary(std::span<const std::uint8_t> bytes, ParseError* error) {
  BinaryReader reader(bytes);
  return reader.run(error);
}

}  // namespace appsync::plist::internal
