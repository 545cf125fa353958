// The property-list value: one type for everything the plugin reads and writes on disk.
#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <variant>
#include <vector>

namespace appsync::plist {

class Value;

using Bytes = std::vector<std::uint8_t>;
using Array = std::vector<Value>;

// An integer as a property list stores it: signed 64-bit, or unsigned when above INT64_MAX.
struct Integer {
  std::uint64_t bits = 0;
  bool isUnsigned = false;  // true only for values above INT64_MAX

  static Integer fromSigned(std::int64_t v) { return {static_cast<std::uint64_t>(v), false}; }
  static Integer fromUnsigned(std::uint64_t v) {
    return {v, v > static_cast<std::uint64_t>(INT64_MAX)};
  }
  std::optional<std::int64_t> asInt64() const;
  std::optional<std::uint64_t> asUInt64() const;
  bool operator==(const Integer&) const = default;
};

// Seconds since 2001-01-01 00:00:00 UTC.
struct Date {
  double secondsSince2001 = 0;
  bool operator==(const Date&) const = default;
};

// A keyed-archive object reference; kept so that such files survive a load-change-write.
struct Uid {
  std::uint64_t value = 0;
  bool operator==(const Uid&) const = default;
};

// A dictionary that keeps the order in which keys were inserted. Lookups are linear for small
// dictionaries and go through a hash index for large ones (restore lists with thousands of keys).
class Dict {
 public:
  struct Entry;
  using iterator = std::vector<Entry>::iterator;
  using const_iterator = std::vector<Entry>::const_iterator;

  Dict();
  Dict(std::initializer_list<std::pair<std::string, Value>> entries);
  Dict(const Dict&);
  Dict(Dict&&) noexcept;
  Dict& operator=(const Dict&);
  Dict& operator=(Dict&&) noexcept;
  ~Dict();

  const Value* find(std::string_view key) const;
  Value* find(std::string_view key);
  bool contains(std::string_view key) const { return find(key) != nullptr; }

  // Replaces the value of an existing key in place (keeping its position) or appends the key.
  void set(std::string key, Value value);
  // Appends without looking for an existing key; false (and nothing added) if the key exists.
  bool insertNew(std::string key, Value value);
  bool erase(std::string_view key);
  void clear();

  std::size_t size() const;
  bool empty() const;
  void reserve(std::size_t n);

  iterator begin();
  iterator end();
  const_iterator begin() const;
  const_iterator end() const;

  bool operator==(const Dict& other) const;

 private:
  void rebuildIndex();
  std::optional<std::size_t> indexOf(std::string_view key) const;

  std::vector<Entry> entries_;
  struct KeyHash {
    using is_transparent = void;
    std::size_t operator()(std::string_view s) const { return std::hash<std::string_view>{}(s); }
  };
  using Index = std::unordered_map<std::string, std::size_t, KeyHash, std::equal_to<>>;
  // Only built once the dictionary is larger than kIndexThreshold, and kept behind a pointer so
  // that the many small dictionaries stay small and cheap to move.
  std::unique_ptr<Index> index_;
  static constexpr std::size_t kIndexThreshold = 16;
};

// Null is the platform's null object: it may stand in a dictionary built in memory (install
// options), but a property list cannot carry it, so every writer refuses it.
enum class Type { Boolean, Integer, Real, String, Data, Date, Uid, Array, Dict, Null };

struct Null {
  bool operator==(const Null&) const = default;
};

const char* typeName(Type type);

class Value {
 public:
  // A default value is boolean false (containers need a default; nothing relies on which).
  Value() : v_(false) {}
  Value(bool b) : v_(b) {}
  template <std::integral T>
    requires(!std::same_as<T, bool> && !std::same_as<T, char>)
  Value(T i)
      : v_(std::is_signed_v<T> ? Integer::fromSigned(static_cast<std::int64_t>(i))
                               : Integer::fromUnsigned(static_cast<std::uint64_t>(i))) {}
  Value(Integer i) : v_(i) {}
  Value(double d) : v_(d) {}
  Value(std::string s) : v_(std::move(s)) {}
  Value(std::string_view s) : v_(std::string(s)) {}
  Value(const char* s) : v_(std::string(s)) {}
  Value(Bytes data) : v_(std::move(data)) {}
  Value(Date d) : v_(d) {}
  Value(Uid u) : v_(u) {}
  Value(Array a) : v_(std::move(a)) {}
  Value(Dict d) : v_(std::move(d)) {}
  Value(Null n) : v_(n) {}
  static Value null() { return Value(Null{}); }

  Type type() const { return static_cast<Type>(v_.index()); }

  // Typed access: null (or absent) when the value has another type.
  const bool* boolean() const { return std::get_if<bool>(&v_); }
  const Integer* integer() const { return std::get_if<Integer>(&v_); }
  const double* real() const { return std::get_if<double>(&v_); }
  const std::string* string() const { return std::get_if<std::string>(&v_); }
  std::string* string() { return std::get_if<std::string>(&v_); }
  const Bytes* data() const { return std::get_if<Bytes>(&v_); }
  const Date* date() const { return std::get_if<Date>(&v_); }
  const Uid* uid() const { return std::get_if<Uid>(&v_); }
  const Array* array() const { return std::get_if<Array>(&v_); }
  Array* array() { return std::get_if<Array>(&v_); }
  const Dict* dict() const { return std::get_if<Dict>(&v_); }
  Dict* dict() { return std::get_if<Dict>(&v_); }
  bool isNull() const { return std::holds_alternative<Null>(v_); }

  std::optional<std::int64_t> int64() const;
  std::optional<std::uint64_t> uint64() const;
  // Integers and reals as a double.
  std::optional<double> number() const;

  // The value's answer to "boolValue": booleans as they are, numbers when non-zero, strings
  // whose first significant character is Y, y, T, t or a digit 1-9 (after blanks, a sign and
  // leading zeros). Absent for data, dates, uids, arrays and dictionaries.
  std::optional<bool> truthValue() const;

  // Single-line description, used wherever a value is logged with %@.
  std::string describe() const;

  bool operator==(const Value& other) const { return v_ == other.v_; }

 private:
  std::variant<bool, Integer, double, std::string, Bytes, Date, Uid, Array, Dict, Null> v_;
};

struct Dict::Entry {
  std::string key;
  Value value;
  bool operator==(const Entry&) const = default;
};

// Convenience lookups on an optional dictionary chain: absent whenever a level is missing or
// has another type.
const std::string* stringAt(const Dict& dict, std::string_view key);
const Dict* dictAt(const Dict& dict, std::string_view key);
const Array* arrayAt(const Dict& dict, std::string_view key);

}  // namespace appsync::plist
