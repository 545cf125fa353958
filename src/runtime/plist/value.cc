// Property-list values: dictionary bookkeeping, conversions and descriptions.
#include "runtime/plist/value.h"

#include <charconv>
#include <cmath>
#include <ctime>

namespace appsync::plist {

std::optional<std::int64_t> Integer::asInt64() const {
  if (isUnsigned) return std::nullopt;
  return static_cast<std::int64_t>(bits);
}

std::optional<std::uint64_t> Integer::asUInt64() const {
  if (!isUnsigned && static_cast<std::int64_t>(bits) < 0) return std::nullopt;
  return bits;
}

// ---- Dict ------------------------------------------------------------------------------------

Dict::Dict() = default;
Dict::Dict(std::initializer_list<std::pair<std::string, Value>> entries) {
  for (const auto& [key, value] : entries) set(key, value);
}
Dict::Dict(const Dict& other)
    : entries_(other.entries_),
      index_(other.index_ ? std::make_unique<Index>(*other.index_) : nullptr) {}
Dict::Dict(Dict&&) noexcept = default;
Dict& Dict::operator=(const Dict& other) {
  if (this != &other) {
    entries_ = other.entries_;
    index_ = other.index_ ? std::make_unique<Index>(*other.index_) : nullptr;
  }
  return *this;
}
Dict& Dict::operator=(Dict&&) noexcept = default;
Dict::~Dict() = default;

std::optional<std::size_t> Dict::indexOf(std::string_view key) const {
  if (index_) {
    auto it = index_->find(key);
    if (it == index_->end()) return std::nullopt;
    return it->second;
  }
  for (std::size_t i = 0; i < entries_.size(); ++i) {
    if (entries_[i].key == key) return i;
  }
  return std::nullopt;
}

const Value* Dict::find(std::string_view key) const {
  auto i = indexOf(key);
  return i ? &entries_[*i].value : nullptr;
}

Value* Dict::find(std::string_view key) {
  auto i = indexOf(key);
  return i ? &entries_[*i].value : nullptr;
}

void Dict::set(std::string key, Value value) {
  if (auto i = indexOf(key)) {
    entries_[*i].value = std::move(value);
    return;
  }
  insertNew(std::move(key), std::move(value));
}

bool Dict::insertNew(std::string key, Value value) {
  if (indexOf(key)) return false;
  if (index_) index_->emplace(key, entries_.size());
  entries_.push_back(Entry{std::move(key), std::move(value)});
  if (!index_ && entries_.size() > kIndexThreshold) rebuildIndex();
  return true;
}

bool Dict::erase(std::string_view key) {
  auto i = indexOf(key);
  if (!i) return false;
  entries_.erase(entries_.begin() + static_cast<std::ptrdiff_t>(*i));
  rebuildIndex();
  return true;
}

void Dict::clear() {
  entries_.clear();
  index_.reset();
}

void Dict::rebuildIndex() {
  index_.reset();
  if (entries_.size() <= kIndexThreshold) return;
  index_ = std::make_unique<Index>();
  index_->reserve(entries_.size());
  for (std::size_t i = 0; i < entries_.size(); ++i) index_->emplace(entries_[i].key, i);
}

std::size_t Dict::size() const { return entries_.size(); }
bool Dict::empty() const { return entries_.empty(); }
void Dict::reserve(std::size_t n) { entries_.reserve(n); }
Dict::iterator Dict::begin() { return entries_.begin(); }
Dict::iterator Dict::end() { return entries_.end(); }
Dict::const_iterator Dict::begin() const { return entries_.begin(); }
Dict::const_iterator Dict::end() const { return entries_.end(); }
bool Dict::operator==(const Dict& other) const { return entries_ == other.entries_; }

// ---- Value -----------------------------------------------------------------------------------

const char* typeName(Type type) {
  switch (type) {
    case Type::Boolean: return "boolean";
    case Type::Integer: return "integer";
    case Type::Real: return "real";
    case Type::String: return "string";
    case Type::Data: return "data";
    case Type::Date: return "date";
    case Type::Uid: return "uid";
    case Type::Array: return "array";
    case Type::Dict: return "dictionary";
    case Type::Null: return "null";
  }
  return "unknown";
}

std::optional<std::int64_t> Value::int64() const {
  if (const Integer* i = integer()) return i->asInt64();
  return std::nullopt;
}

std::optional<std::uint64_t> Value::uint64() const {
  if (const Integer* i = integer()) return i->asUInt64();
  return std::nullopt;
}

std::optional<double> Value::number() const {
  if (const double* d = real()) return *d;
  if (const Integer* i = integer()) {
    return i->isUnsigned ? static_cast<double>(i->bits)
                         : static_cast<double>(static_cast<std::int64_t>(i->bits));
  }
  return std::nullopt;
}

std::optional<bool> Value::truthValue() const {
  if (const bool* b = boolean()) return *b;
  if (const Integer* i = integer()) return i->bits != 0;
  if (const double* d = real()) return *d != 0.0;
  if (const std::string* s = string()) {
    std::size_t pos = 0;
    while (pos < s->size() && ((*s)[pos] == ' ' || (*s)[pos] == '\t' || (*s)[pos] == '\n')) ++pos;
    if (pos < s->size() && ((*s)[pos] == '+' || (*s)[pos] == '-')) ++pos;
    while (pos < s->size() && (*s)[pos] == '0') ++pos;
    if (pos >= s->size()) return false;
    char c = (*s)[pos];
    return c == 'Y' || c == 'y' || c == 'T' || c == 't' || (c >= '1' && c <= '9');
  }
  return std::nullopt;
}

namespace {

bool isBareWord(const std::string& s) {
  if (s.empty()) return false;
  for (unsigned char c : s) {
    bool ok = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
              c == '_' || c == '.' || c == '-' || c == '/' || c == ':' || c == '$' || c >= 0x80;
    if (!ok) return false;
  }
  return true;
}

void describeString(const std::string& s, std::string& out) {
  if (isBareWord(s)) {
    out += s;
    return;
  }
  out += '"';
  for (char c : s) {
    switch (c) {
      case '"': out += "\\\""; break;
      case '\\': out += "\\\\"; break;
      case '\n': out += "\\n"; break;
      case '\r': out += "\\r"; break;
      case '\t': out += "\\t"; break;
      default: out += c;
    }
  }
  out += '"';
}

void describeDouble(double d, std::string& out) {
  if (std::isnan(d)) {
    out += "nan";
    return;
  }
  if (std::isinf(d)) {
    out += d > 0 ? "inf" : "-inf";
    return;
  }
  char buf[64];
  auto res = std::to_chars(buf, buf + sizeof buf, d);
  out.append(buf, res.ptr);
}

void describeDate(const Date& date, std::string& out) {
  // 978307200 is 2001-01-01 00:00:00 UTC in Unix time.
  double unix = date.secondsSince2001 + 978307200.0;
  if (!std::isfinite(unix) || unix < -62135596800.0 || unix > 253402300799.0) {
    out += "<date ";
    describeDouble(date.secondsSince2001, out);
    out += '>';
    return;
  }
  std::time_t t = static_cast<std::time_t>(std::floor(unix));
  std::tm tm{};
  gmtime_r(&t, &tm);
  char buf[64];
  std::strftime(buf, sizeof buf, "%Y-%m-%d %H:%M:%S +0000", &tm);
  out += buf;
}

void describeInto(const Value& v, std::string& out) {
  switch (v.type()) {
    case Type::Null: out += "<null>"; break;
    case Type::Boolean: out += *v.boolean() ? "1" : "0"; break;
    case Type::Integer: {
      const Integer& i = *v.integer();
      out += i.isUnsigned ? std::to_string(i.bits)
                          : std::to_string(static_cast<std::int64_t>(i.bits));
      break;
    }
    case Type::Real: describeDouble(*v.real(), out); break;
    case Type::String: describeString(*v.string(), out); break;
    case Type::Data: {
      static const char* kHex = "0123456789abcdef";
      const Bytes& b = *v.data();
      // Appended piece by piece: g++ 12 at -O3 misreports "<" + std::string as overlapping.
      out += '<';
      out += std::to_string(b.size());
      out += " bytes";
      if (!b.empty()) out += ": ";
      std::size_t shown = std::min<std::size_t>(b.size(), 24);
      for (std::size_t i = 0; i < shown; ++i) {
        out += kHex[b[i] >> 4];
        out += kHex[b[i] & 15];
      }
      if (shown < b.size()) out += "...";
      out += '>';
      break;
    }
    case Type::Date: describeDate(*v.date(), out); break;
    case Type::Uid: out += "<uid " + std::to_string(v.uid()->value) + ">"; break;
    case Type::Array: {
      out += '(';
      bool first = true;
      for (const Value& e : *v.array()) {
        if (!first) out += ", ";
        first = false;
        describeInto(e, out);
      }
      out += ')';
      break;
    }
    case Type::Dict: {
      out += '{';
      bool first = true;
      for (const auto& e : *v.dict()) {
        out += first ? "" : " ";
        first = false;
        describeString(e.key, out);
        out += " = ";
        describeInto(e.value, out);
        out += ';';
      }
      out += '}';
      break;
    }
  }
}

}  // namespace

std::string Value::describe() const {
  std::string out;
  describeInto(*this, out);
  return out;
}

const std::string* stringAt(const Dict& dict, std::string_view key) {
  const Value* v = dict.find(key);
  return v ? v->string() : nullptr;
}

const Dict* dictAt(const Dict& dict, std::string_view key) {
  const Value* v = dict.find(key);
  return v ? v->dict() : nullptr;
}

const Array* arrayAt(const Dict& dict, std::string_view key) {
  const Value* v = dict.find(key);
  return v ? v->array() : nullptr;
}

}  // namespace appsync::plist
