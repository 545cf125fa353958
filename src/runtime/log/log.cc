// The message formatter, log arguments, categories and the logger that owns them.
#include "runtime/log/log.h"

#include <cmath>
#include <limits>

namespace appsync {

const char* logLevelName(LogLevel level) { return level == LogLevel::Error ? "Error" : "Default"; }

// ---- LogArg --------------------------------------------------------------------------------

namespace {

// A real converted to an integer type: truncated toward zero, saturated at the type's range,
// and 0 for NaN.
template <typename Int>
Int saturate(double d) {
  if (std::isnan(d)) return 0;
  if (d <= static_cast<double>(std::numeric_limits<Int>::min())) {
    return std::numeric_limits<Int>::min();
  }
  if (d >= static_cast<double>(std::numeric_limits<Int>::max())) {
    return std::numeric_limits<Int>::max();
  }
  return static_cast<Int>(d);
}

}  // namespace

std::int64_t LogArg::asSigned() const {
  switch (kind_) {
    case Kind::Signed:
    case Kind::Char:
      return i_;
    case Kind::Unsigned:
      return static_cast<std::int64_t>(u_);
    case Kind::Real:
      return saturate<std::int64_t>(d_);
    case Kind::Null:
    case Kind::Text:
      break;
  }
  return 0;
}

std::uint64_t LogArg::asUnsigned() const {
  switch (kind_) {
    case Kind::Signed:
    case Kind::Char:
      return static_cast<std::uint64_t>(i_);
    case Kind::Unsigned:
      return u_;
    case Kind::Real:
      return saturate<std::uint64_t>(d_);
    case Kind::Null:
    case Kind::Text:
      break;
  }
  return 0;
}

double LogArg::asReal() const {
  switch (kind_) {
    case Kind::Signed:
    case Kind::Char:
      return static_cast<double>(i_);
    case Kind::Unsigned:
      return static_cast<double>(u_);
    case Kind::Real:
      return d_;
    case Kind::Null:
    case Kind::Text:
      break;
  }
  return 0;
}

// ---- Formatter -----------------------------------------------------------------------------

namespace {

enum class Conversion { Object, Integer, Real, Char, Private };

void appendReal(std::string& out, double d) {
  char buffer[64];
  int n = std::snprintf(buffer, sizeof buffer, "%f", d);
  if (n < 0) return;
  if (static_cast<std::size_t>(n) < sizeof buffer) {
    out.append(buffer, static_cast<std::size_t>(n));
    return;
  }
  std::string big(static_cast<std::size_t>(n) + 1, '\0');
  std::snprintf(big.data(), big.size(), "%f", d);
  out.append(big.data(), static_cast<std::size_t>(n));
}

// Prints `arg` as `conversion` asks, or as the argument's own kind when the two disagree.
void appendArg(std::string& out, Conversion conversion, const LogArg* arg) {
  if (conversion == Conversion::Private) {
    out += "<private>";
    return;
  }
  if (!arg || arg->kind() == LogArg::Kind::Null) {
    out += "(null)";
    return;
  }
  switch (arg->kind()) {
    case LogArg::Kind::Null:
      break;
    case LogArg::Kind::Text:
      out += arg->text();
      return;
    case LogArg::Kind::Char:
      // Under an integer conversion a character prints as its code, as printf would.
      if (conversion == Conversion::Integer) {
        out += std::to_string(arg->asSigned());
      } else {
        out += static_cast<char>(arg->asSigned());
      }
      return;
    case LogArg::Kind::Signed:
    case LogArg::Kind::Unsigned: {
      if (conversion == Conversion::Real) {
        appendReal(out, arg->asReal());
        return;
      }
      bool isSigned = arg->kind() == LogArg::Kind::Signed;
      if (conversion == Conversion::Char && arg->asUnsigned() >= 1 && arg->asUnsigned() <= 255 &&
          (!isSigned || arg->asSigned() > 0)) {
        out += static_cast<char>(arg->asUnsigned());
        return;
      }
      out += isSigned ? std::to_string(arg->asSigned()) : std::to_string(arg->asUnsigned());
      return;
    }
    case LogArg::Kind::Real:
      appendReal(out, arg->asReal());
      return;
  }
}

// Recognises the specifier that starts right after a '%'. Returns its length (0 when it is not
// one of ours) and its conversion.
std::size_t matchSpecifier(std::string_view rest, Conversion* conversion) {
  struct Spelling {
    std::string_view text;
    Conversion conversion;
  };
  // Longer spellings first, so that "ld" is not taken for a "l" prefix of something else.
  static constexpr Spelling kSpellings[] = {
      {"{private}@", Conversion::Private},
      {"{public}@", Conversion::Object},
      {"lld", Conversion::Integer},
      {"llu", Conversion::Integer},
      {"ld", Conversion::Integer},
      {"lu", Conversion::Integer},
      {"zu", Conversion::Integer},
      {"lf", Conversion::Real},
      {"s", Conversion::Object},
      {"@", Conversion::Object},
      {"d", Conversion::Integer},
      {"i", Conversion::Integer},
      {"u", Conversion::Integer},
      {"f", Conversion::Real},
      {"c", Conversion::Char},
  };
  for (const Spelling& spelling : kSpellings) {
    if (rest.starts_with(spelling.text)) {
      *conversion = spelling.conversion;
      return spelling.text.size();
    }
  }
  return 0;
}

}  // namespace

std::string formatLogMessage(std::string_view format, std::span<const LogArg> args) {
  std::string out;
  out.reserve(format.size() + 16 * args.size());
  std::size_t nextArg = 0;
  std::size_t i = 0;
  while (i < format.size()) {
    std::size_t percent = format.find('%', i);
    if (percent == std::string_view::npos) {
      out.append(format.substr(i));
      break;
    }
    out.append(format.substr(i, percent - i));
    std::string_view rest = format.substr(percent + 1);
    if (rest.starts_with('%')) {
      out += '%';
      i = percent + 2;
      continue;
    }
    Conversion conversion;
    std::size_t length = matchSpecifier(rest, &conversion);
    if (length == 0) {
      // Not ours: the '%' is kept and what follows is copied as ordinary text.
      out += '%';
      i = percent + 1;
      continue;
    }
    const LogArg* arg = nextArg < args.size() ? &args[nextArg] : nullptr;
    ++nextArg;
    appendArg(out, conversion, arg);
    i = percent + 1 + length;
  }
  return out;
}

// ---- Categories and the logger -------------------------------------------------------------

bool LogCategory::enabled(LogLevel level) const { return owner_.levelEnabled(level); }

void LogCategory::write(LogLevel level, std::string_view message) const {
  if (!enabled(level)) return;
  if (std::shared_ptr<LogSink> sink = owner_.sink()) sink->write(number_, level, message);
}

Logger::Logger() = default;

LogCategory& Logger::category(int n) {
  std::lock_guard<std::mutex> guard(mutex_);
  std::unique_ptr<LogCategory>& slot = categories_[n];
  if (!slot) slot = std::make_unique<LogCategory>(n, *this);
  return *slot;
}

void Logger::setSink(std::shared_ptr<LogSink> sink) {
  std::lock_guard<std::mutex> guard(mutex_);
  sink_ = std::move(sink);
}

std::shared_ptr<LogSink> Logger::sink() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return sink_;
}

void Logger::setLevelEnabled(LogLevel level, bool enabled) {
  (level == LogLevel::Error ? errorEnabled_ : defaultEnabled_).store(enabled);
}

bool Logger::levelEnabled(LogLevel level) const {
  return (level == LogLevel::Error ? errorEnabled_ : defaultEnabled_).load();
}

}  // namespace appsync
