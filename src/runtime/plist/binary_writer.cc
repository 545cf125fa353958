// Writes binary property lists ("bplist00"). Objects are numbered breadth-first with equal
// strings (keys included) written once; integers, offsets and references take the fewest bytes.
#include <bit>
#include <cstring>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "runtime/plist/codec.h"
#include "runtime/plist/text_encoding.h"

namespace appsync::plist {
namespace {

// One object of the file: a value, or a string (a dictionary key or a string value).
struct Object {
  const Value* value;
  const std::string* string;
};

std::size_t bytesFor(std::uint64_t v) {
  if (v <= 0xFF) return 1;
  if (v <= 0xFFFF) return 2;
  if (v <= 0xFFFFFFFF) return 4;
  return 8;
}

std::uint8_t log2Size(std::size_t n) { return n == 1 ? 0 : n == 2 ? 1 : n == 4 ? 2 : 3; }

class BinaryWriter {
 public:
  std::optional<Bytes> run(const Value& root, std::string* error);

 private:
  bool number(const Value& root);
  std::uint64_t add(const Value* value, std::uint32_t depth);
  std::uint64_t addString(const std::string* s);
  void writeObject(std::size_t index);

  void put(std::uint8_t byte) { out_.push_back(byte); }
  void putBE(std::uint64_t v, std::size_t n) {
    for (std::size_t i = n; i-- > 0;) out_.push_back(static_cast<std::uint8_t>(v >> (8 * i)));
  }
  void putHeader(std::uint8_t type, std::uint64_t count) {
    if (count < 15) {
      put(static_cast<std::uint8_t>(type << 4 | count));
      return;
    }
    put(static_cast<std::uint8_t>(type << 4 | 0x0F));
    std::size_t n = bytesFor(count);
    put(static_cast<std::uint8_t>(0x10 | log2Size(n)));
    putBE(count, n);
  }

  std::vector<Object> objects_;
  std::vector<std::uint32_t> depth_;     // per object: containers above it, itself included
  std::vector<std::uint64_t> firstRef_;  // per object: its first reference in refs_
  std::vector<std::uint64_t> refs_;      // members of every container, in object order
  std::unordered_map<std::string_view, std::uint64_t> strings_;
  std::string error_;
  Bytes out_;
  std::size_t refSize_ = 1;
};

std::uint64_t BinaryWriter::addString(const std::string* s) {
  auto [it, inserted] = strings_.try_emplace(*s, objects_.size());
  if (inserted) {
    objects_.push_back({nullptr, s});
    depth_.push_back(0);
  }
  return it->second;
}

std::uint64_t BinaryWriter::add(const Value* value, std::uint32_t depth) {
  if (const std::string* s = value->string()) return addString(s);
  objects_.push_back({value, nullptr});
  depth_.push_back(depth);
  return objects_.size() - 1;
}

// Numbers every object breadth-first and records each container's member references.
bool BinaryWriter::number(const Value& root) {
  add(&root, 1);
  firstRef_.reserve(objects_.size());
  for (std::size_t i = 0; i < objects_.size(); ++i) {
    firstRef_.push_back(refs_.size());
    const Object obj = objects_[i];
    if (obj.string) {
      if (!text::isValidUtf8(*obj.string)) {
        error_ = "string is not valid UTF-8";
        return false;
      }
      continue;
    }
    if (obj.value->isNull()) {
      error_ = "a property list cannot carry null";
      return false;
    }
    const std::uint32_t depth = depth_[i];
    if ((obj.value->array() || obj.value->dict()) && depth > kMaxDepth) {
      error_ = "containers nested deeper than " + std::to_string(kMaxDepth) + " levels";
      return false;
    }
    if (const Array* array = obj.value->array()) {
      for (const Value& member : *array) refs_.push_back(add(&member, depth + 1));
    } else if (const Dict* dict = obj.value->dict()) {
      for (const auto& entry : *dict) refs_.push_back(addString(&entry.key));
      for (const auto& entry : *dict) refs_.push_back(add(&entry.value, depth + 1));
    }
  }
  return true;
}

void BinaryWriter::writeObject(std::size_t index) {
  const Object obj = objects_[index];
  if (obj.string) {
    const std::string& s = *obj.string;
    bool ascii = true;
    for (char c : s) ascii = ascii && static_cast<unsigned char>(c) < 0x80;
    if (ascii) {
      putHeader(0x5, s.size());
      out_.insert(out_.end(), s.begin(), s.end());
      return;
    }
    std::u16string units;
    text::utf8ToUtf16(s, units);  // validated while numbering
    putHeader(0x6, units.size());
    for (char16_t u : units) putBE(u, 2);
    return;
  }
  const Value& v = *obj.value;
  switch (v.type()) {
    case Type::Boolean:
      put(*v.boolean() ? 0x09 : 0x08);
      break;
    case Type::Integer: {
      const Integer& i = *v.integer();
      if (i.isUnsigned) {
        // Above INT64_MAX: a 128-bit integer whose upper half is zero.
        put(0x14);
        putBE(0, 8);
        putBE(i.bits, 8);
      } else if (static_cast<std::int64_t>(i.bits) < 0) {
        put(0x13);
        putBE(i.bits, 8);
      } else {
        std::size_t n = bytesFor(i.bits);
        put(static_cast<std::uint8_t>(0x10 | log2Size(n)));
        putBE(i.bits, n);
      }
      break;
    }
    case Type::Real:
      put(0x23);
      putBE(std::bit_cast<std::uint64_t>(*v.real()), 8);
      break;
    case Type::Date:
      put(0x33);
      putBE(std::bit_cast<std::uint64_t>(v.date()->secondsSince2001), 8);
      break;
    case Type::Data: {
      const Bytes& data = *v.data();
      putHeader(0x4, data.size());
      out_.insert(out_.end(), data.begin(), data.end());
      break;
    }
    case Type::Uid: {
      std::size_t n = bytesFor(v.uid()->value);
      put(static_cast<std::uint8_t>(0x80 | (n - 1)));
      putBE(v.uid()->value, n);
      break;
    }
    case Type::Array:
    case Type::Dict: {
      const bool isDict = v.type() == Type::Dict;
      const std::uint64_t count = isDict ? v.dict()->size() : v.array()->size();
      putHeader(isDict ? 0xD : 0xA, count);
      const std::uint64_t first = firstRef_[index];
      for (std::uint64_t r = 0; r < (isDict ? 2 * count : count); ++r) {
        putBE(refs_[first + r], refSize_);
      }
      break;
    }
    case Type::String:
      break;  // written above, as a shared string object
    case Type::Null:
      break;  // refused while numbering
  }
}

std::optional<Bytes> BinaryWriter::run(const Value& root, std::string* error) {
  if (!number(root)) {
    if (error) *error = "binary property list: " + error_;
    return std::nullopt;
  }
  refSize_ = bytesFor(objects_.size() - 1);
  out_.reserve(objects_.size() * 8 + 64);
  out_.insert(out_.end(), {'b', 'p', 'l', 'i', 's', 't', '0', '0'});
  std::vector<std::uint64_t> offsets(objects_.size());
  for (std::size_t i = 0; i < objects_.size(); ++i) {
    offsets[i] = out_.size();
    writeObject(i);
  }
  const std::uint64_t tableOffset = out_.size();
  const std::size_t offsetSize = bytesFor(offsets.back());
  for (std::uint64_t offset : offsets) putBE(offset, offsetSize);
  putBE(0, 6);
  put(static_cast<std::uint8_t>(offsetSize));
  put(static_cast<std::uint8_t>(refSize_));
  putBE(objects_.size(), 8);
  putBE(0, 8);  // the top object is always numbered first
  putBE(tableOffset, 8);
  return std::move(out_);
}

}  // namespace

std::optional<Bytes> writeBinary(const Value& value, std::string* error) {
  BinaryWriter writer;
  return writer.run(value, error);
}

}  // namespace appsync::plist
