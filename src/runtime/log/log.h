// The plugin's log: numbered categories, two levels, printf-style messages formatted only when
// their level is enabled, and pluggable sinks.
#pragma once

#include <atomic>
#include <cstdint>
#include <cstdio>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <vector>

#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync {

// The plugin bundle's own identifier: what every "%s|" message prefix is filled with.
inline constexpr const char* kPluginBundleIdentifier = "com.vantor.trc.AppSync";

enum class LogLevel { Default, Error };

const char* logLevelName(LogLevel level);  // "Default" or "Error"

// Where formatted messages go. Implementations must be safe to call from several threads.
class LogSink {
 public:
  virtual ~LogSink() = default;
  virtual void write(int category, LogLevel level, std::string_view message) = 0;
};

// One argument of a message, already reduced to what the formatter needs. Built only after the
// level check, so describing an object costs nothing when the message is not written.
class LogArg {
 public:
  enum class Kind { Null, Signed, Unsigned, Real, Char, Text };

  LogArg() = default;                        // absent: prints "(null)"
  LogArg(std::nullptr_t) {}                  // absent
  LogArg(bool b) : kind_(Kind::Signed), i_(b ? 1 : 0) {}
  LogArg(char c) : kind_(Kind::Char), i_(static_cast<unsigned char>(c)) {}
  template <typename T>
    requires(std::is_integral_v<T> && !std::is_same_v<T, bool> && !std::is_same_v<T, char>)
  LogArg(T v) {
    if constexpr (std::is_signed_v<T>) {
      kind_ = Kind::Signed;
      i_ = static_cast<std::int64_t>(v);
    } else {
      kind_ = Kind::Unsigned;
      u_ = static_cast<std::uint64_t>(v);
    }
  }
  LogArg(double d) : kind_(Kind::Real), d_(d) {}
  LogArg(float f) : kind_(Kind::Real), d_(f) {}
  LogArg(const char* s) : kind_(s ? Kind::Text : Kind::Null), text_(s ? s : "") {}
  LogArg(std::string_view s) : kind_(Kind::Text), text_(s) {}
  LogArg(const std::string& s) : kind_(Kind::Text), text_(s) {}
  LogArg(const plist::Value& v) : kind_(Kind::Text), text_(v.describe()) {}
  LogArg(const plist::Dict& d) : kind_(Kind::Text), text_(plist::Value(d).describe()) {}
  LogArg(const plist::Array& a) : kind_(Kind::Text), text_(plist::Value(a).describe()) {}
  LogArg(const Error& e) : kind_(Kind::Text), text_(e.describe()) {}
  // Anything held by pointer or optional: absent prints "(null)".
  template <typename T>
  LogArg(const std::shared_ptr<T>& p) : LogArg(p ? LogArg(*p) : LogArg()) {}
  template <typename T>
  LogArg(const std::optional<T>& o) : LogArg(o ? LogArg(*o) : LogArg()) {}
  template <typename T>
  LogArg(const T* p)
    requires(!std::is_same_v<T, char>)
      : LogArg(p ? LogArg(*p) : LogArg()) {}
  // Objects that describe themselves (proxies, coordinators, assets, ...).
  template <typename T>
    requires requires(const T& t) {
      { t.describe() } -> std::convertible_to<std::string>;
    }
  LogArg(const T& object) : kind_(Kind::Text), text_(object.describe()) {}

  Kind kind() const { return kind_; }
  std::int64_t asSigned() const;
  std::uint64_t asUnsigned() const;
  double asReal() const;
  const std::string& text() const { return text_; }

 private:
  Kind kind_ = Kind::Null;
  std::int64_t i_ = 0;
  std::uint64_t u_ = 0;
  double d_ = 0;
  std::string text_;
};

// Formats a message with the specifiers the plugin uses: %s %d %i %u %ld %lu %lld %llu %zu %f
// %lf %c %@ %{public}@ %{private}@ (printed as "<private>") %%. An argument of another kind than
// its specifier asks for is printed as best it can be (never undefined behaviour); a missing or
// absent argument prints "(null)". Any other specifier is copied as it is and takes no argument.
std::string formatLogMessage(std::string_view format, std::span<const LogArg> args);

// The log object of one category.
class LogCategory {
 public:
  LogCategory(int number, class Logger& owner) : number_(number), owner_(owner) {}
  LogCategory(const LogCategory&) = delete;
  LogCategory& operator=(const LogCategory&) = delete;

  int number() const { return number_; }
  bool enabled(LogLevel level) const;
  // Writes an already formatted message to the owner's sink (if the level is enabled).
  void write(LogLevel level, std::string_view message) const;

 private:
  int number_;
  class Logger& owner_;
};

// Owns the categories, the enabled levels and the sink. Thread-safe.
class Logger {
 public:
  Logger();
  Logger(const Logger&) = delete;
  Logger& operator=(const Logger&) = delete;

  // The log object of category n; the reference stays valid for the Logger's lifetime.
  LogCategory& category(int n);

  void setSink(std::shared_ptr<LogSink> sink);
  std::shared_ptr<LogSink> sink() const;
  void setLevelEnabled(LogLevel level, bool enabled);
  bool levelEnabled(LogLevel level) const;

 private:
  mutable std::mutex mutex_;
  std::map<int, std::unique_ptr<LogCategory>> categories_;
  std::shared_ptr<LogSink> sink_;
  std::atomic<bool> defaultEnabled_{true};
  std::atomic<bool> errorEnabled_{true};
};

// Writes one message: formatted (and its arguments described) only when the level is enabled.
template <typename... Args>
void logMessage(const LogCategory& category, LogLevel level, std::string_view format,
                const Args&... args) {
  if (!category.enabled(level)) return;
  const LogArg list[] = {LogArg(args)..., LogArg()};
  category.write(level, formatLogMessage(format, std::span<const LogArg>(list, sizeof...(Args))));
}

// A message of the plugin: its leading "%s|" is filled with the plugin bundle identifier.
template <typename... Args>
void pluginLog(const LogCategory& category, LogLevel level, std::string_view format,
               const Args&... args) {
  logMessage(category, level, format, kPluginBundleIdentifier, args...);
}

// ---- Sinks ---------------------------------------------------------------------------------

// Keeps every line in memory, for tests.
class MemoryLogSink : public LogSink {
 public:
  struct Line {
    int category;
    LogLevel level;
    std::string message;
  };
  void write(int category, LogLevel level, std::string_view message) override;
  std::vector<Line> lines() const;
  // Just the message texts, in order.
  std::vector<std::string> messages() const;
  // How many messages equal `message` exactly.
  std::size_t count(std::string_view message) const;
  bool contains(std::string_view message) const { return count(message) > 0; }
  void clear();

 private:
  mutable std::mutex mutex_;
  std::vector<Line> lines_;
};

// Appends one line per message to a file: TIMESTAMP<TAB>CATEGORY<TAB>LEVEL<TAB>MESSAGE, where a
// newline inside the message is written as \n. TIMESTAMP is UTC, ISO 8601 with milliseconds.
class FileLogSink : public LogSink {
 public:
  explicit FileLogSink(std::string path);
  ~FileLogSink() override;
  void write(int category, LogLevel level, std::string_view message) override;
  bool ok() const { return file_ != nullptr; }

 private:
  std::mutex mutex_;
  std::FILE* file_ = nullptr;
};

}  // namespace appsync
