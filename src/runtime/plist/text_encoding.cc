// UTF-8/UTF-16 conversion, base64 and ISO 8601 dates for the property-list codec.
#include "runtime/plist/text_encoding.h"

#include <array>
#include <cmath>
#include <cstdio>

namespace appsync::plist::text {

std::size_t decodeUtf8(std::string_view s, std::size_t pos, char32_t* cp) {
  auto c0 = static_cast<unsigned char>(s[pos]);
  if (c0 < 0x80) {
    *cp = c0;
    return 1;
  }
  std::size_t len;
  char32_t value;
  char32_t min;
  if (c0 < 0xC2) {
    return 0;  // continuation byte or overlong two-byte lead
  } else if (c0 < 0xE0) {
    len = 2, value = c0 & 0x1F, min = 0x80;
  } else if (c0 < 0xF0) {
    len = 3, value = c0 & 0x0F, min = 0x800;
  } else if (c0 < 0xF5) {
    len = 4, value = c0 & 0x07, min = 0x10000;
  } else {
    return 0;
  }
  if (s.size() - pos < len) return 0;
  for (std::size_t k = 1; k < len; ++k) {
    auto c = static_cast<unsigned char>(s[pos + k]);
    if ((c & 0xC0) != 0x80) return 0;
    value = (value << 6) | (c & 0x3F);
  }
  if (value < min || value > 0x10FFFF || (value >= 0xD800 && value <= 0xDFFF)) return 0;
  *cp = value;
  return len;
}

bool isValidUtf8(std::string_view s) {
  std::size_t pos = 0;
  while (pos < s.size()) {
    if (static_cast<unsigned char>(s[pos]) < 0x80) {
      ++pos;
      continue;
    }
    char32_t cp;
    std::size_t len = decodeUtf8(s, pos, &cp);
    if (len == 0) return false;
    pos += len;
  }
  return true;
}

bool utf8ToUtf16(std::string_view s, std::u16string& out) {
  out.reserve(out.size() + s.size());
  std::size_t pos = 0;
  while (pos < s.size()) {
    char32_t cp;
    std::size_t len = decodeUtf8(s, pos, &cp);
    if (len == 0) return false;
    pos += len;
    if (cp < 0x10000) {
      out.push_back(static_cast<char16_t>(cp));
    } else {
      cp -= 0x10000;
      out.push_back(static_cast<char16_t>(0xD800 + (cp >> 10)));
      out.push_back(static_cast<char16_t>(0xDC00 + (cp & 0x3FF)));
    }
  }
  return true;
}

void appendUtf8(char32_t cp, std::string& out) {
  if (cp < 0x80) {
    out.push_back(static_cast<char>(cp));
  } else if (cp < 0x800) {
    out.push_back(static_cast<char>(0xC0 | (cp >> 6)));
    out.push_back(static_cast<char>(0x80 | (cp & 0x3F)));
  } else if (cp < 0x10000) {
    out.push_back(static_cast<char>(0xE0 | (cp >> 12)));
    out.push_back(static_cast<char>(0x80 | ((cp >> 6) & 0x3F)));
    out.push_back(static_cast<char>(0x80 | (cp & 0x3F)));
  } else {
    out.push_back(static_cast<char>(0xF0 | (cp >> 18)));
    out.push_back(static_cast<char>(0x80 | ((cp >> 12) & 0x3F)));
    out.push_back(static_cast<char>(0x80 | ((cp >> 6) & 0x3F)));
    out.push_back(static_cast<char>(0x80 | (cp & 0x3F)));
  }
}

// ---- base64 ----------------------------------------------------------------------------------

namespace {

constexpr char kBase64Alphabet[] =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr std::array<std::int8_t, 256> makeBase64Table() {
  std::array<std::int8_t, 256> table{};
  for (auto& v : table) v = -1;
  for (int i = 0; i < 64; ++i)
    table[static_cast<unsigned char>(kBase64Alphabet[i])] = static_cast<std::int8_t>(i);
  return table;
}
constexpr auto kBase64Table = makeBase64Table();

}  // namespace

std::string base64Encode(std::span<const std::uint8_t> bytes) {
  std::string out;
  out.reserve((bytes.size() + 2) / 3 * 4);
  std::size_t i = 0;
  for (; i + 3 <= bytes.size(); i += 3) {
    std::uint32_t n = (bytes[i] << 16) | (bytes[i + 1] << 8) | bytes[i + 2];
    out.push_back(kBase64Alphabet[n >> 18]);
    out.push_back(kBase64Alphabet[(n >> 12) & 63]);
    out.push_back(kBase64Alphabet[(n >> 6) & 63]);
    out.push_back(kBase64Alphabet[n & 63]);
  }
  std::size_t rest = bytes.size() - i;
  if (rest > 0) {
    std::uint32_t n = bytes[i] << 16;
    if (rest == 2) n |= bytes[i + 1] << 8;
    out.push_back(kBase64Alphabet[n >> 18]);
    out.push_back(kBase64Alphabet[(n >> 12) & 63]);
    out.push_back(rest == 2 ? kBase64Alphabet[(n >> 6) & 63] : '=');
    out.push_back('=');
  }
  return out;
}

std::optional<Bytes> base64Decode(std::string_view text) {
  Bytes out;
  out.reserve(text.size() / 4 * 3);
  std::uint32_t group = 0;
  int filled = 0;   // characters of the current group of four
  int padding = 0;  // '=' seen; once non-zero only more '=' (and blanks) may follow
  for (char c : text) {
    if (c == ' ' || c == '\t' || c == '\n' || c == '\r') continue;
    if (c == '=') {
      if (filled < 2) return std::nullopt;
      ++padding;
      group <<= 6;
    } else {
      int v = kBase64Table[static_cast<unsigned char>(c)];
      if (v < 0 || padding > 0) return std::nullopt;
      group = (group << 6) | static_cast<std::uint32_t>(v);
    }
    if (++filled == 4) {
      out.push_back(static_cast<std::uint8_t>(group >> 16));
      if (padding < 2) out.push_back(static_cast<std::uint8_t>(group >> 8));
      if (padding < 1) out.push_back(static_cast<std::uint8_t>(group));
      group = 0;
      filled = 0;
    }
  }
  if (filled != 0) return std::nullopt;
  return out;
}

// ---- dates -----------------------------------------------------------------------------------

namespace {

// Days since 1970-01-01 of a proleptic Gregorian date, and back.
constexpr std::int64_t daysFromCivil(std::int64_t y, unsigned m, unsigned d) {
  y -= m <= 2 ? 1 : 0;
  const std::int64_t era = (y >= 0 ? y : y - 399) / 400;
  const auto yoe = static_cast<unsigned>(y - era * 400);
  const unsigned doy = (153 * (m > 2 ? m - 3 : m + 9) + 2) / 5 + d - 1;
  const unsigned doe = yoe * 365 + yoe / 4 - yoe / 100 + doy;
  return era * 146097 + static_cast<std::int64_t>(doe) - 719468;
}

void civilFromDays(std::int64_t z, std::int64_t* year, unsigned* month, unsigned* day) {
  z += 719468;
  const std::int64_t era = (z >= 0 ? z : z - 146096) / 146097;
  const auto doe = static_cast<unsigned>(z - era * 146097);
  const unsigned yoe = (doe - doe / 1460 + doe / 36524 - doe / 146096) / 365;
  const unsigned doy = doe - (365 * yoe + yoe / 4 - yoe / 100);
  const unsigned mp = (5 * doy + 2) / 153;
  *day = doy - (153 * mp + 2) / 5 + 1;
  *month = mp < 10 ? mp + 3 : mp - 9;
  *year = static_cast<std::int64_t>(yoe) + era * 400 + (*month <= 2 ? 1 : 0);
}

constexpr std::int64_t kEpoch2001 = daysFromCivil(2001, 1, 1);
constexpr std::int64_t kFirstSecond = (daysFromCivil(1, 1, 1) - kEpoch2001) * 86400;
constexpr std::int64_t kEndSecond = (daysFromCivil(10000, 1, 1) - kEpoch2001) * 86400;

bool isLeap(std::int64_t y) { return (y % 4 == 0 && y % 100 != 0) || y % 400 == 0; }

unsigned daysInMonth(std::int64_t y, unsigned m) {
  static constexpr unsigned kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  return m == 2 && isLeap(y) ? 29 : kDays[m - 1];
}

bool digits(std::string_view s, std::size_t pos, std::size_t n, unsigned* out) {
  unsigned v = 0;
  for (std::size_t i = pos; i < pos + n; ++i) {
    if (s[i] < '0' || s[i] > '9') return false;
    v = v * 10 + static_cast<unsigned>(s[i] - '0');
  }
  *out = v;
  return true;
}

}  // namespace

std::optional<double> parseIsoDate(std::string_view s) {
  // 0123456789012345678 9
  // YYYY-MM-DDTHH:MM:SS Z
  if (s.size() != 20 || s[4] != '-' || s[7] != '-' || s[10] != 'T' || s[13] != ':' ||
      s[16] != ':' || s[19] != 'Z') {
    return std::nullopt;
  }
  unsigned year, month, day, hour, minute, second;
  if (!digits(s, 0, 4, &year) || !digits(s, 5, 2, &month) || !digits(s, 8, 2, &day) ||
      !digits(s, 11, 2, &hour) || !digits(s, 14, 2, &minute) || !digits(s, 17, 2, &second)) {
    return std::nullopt;
  }
  if (year < 1 || month < 1 || month > 12 || day < 1 || day > daysInMonth(year, month) ||
      hour > 23 || minute > 59 || second > 59) {
    return std::nullopt;
  }
  std::int64_t days = daysFromCivil(year, month, day) - kEpoch2001;
  return static_cast<double>(days * 86400 + hour * 3600 + minute * 60 + second);
}

std::optional<std::string> formatIsoDate(double secondsSince2001) {
  double whole = std::floor(secondsSince2001);
  if (!(whole >= static_cast<double>(kFirstSecond) && whole < static_cast<double>(kEndSecond))) {
    return std::nullopt;
  }
  auto total = static_cast<std::int64_t>(whole);
  std::int64_t days = total >= 0 ? total / 86400 : -((-total + 86399) / 86400);
  std::int64_t secondOfDay = total - days * 86400;
  std::int64_t year;
  unsigned month, day;
  civilFromDays(days + kEpoch2001, &year, &month, &day);
  char buf[32];
  std::snprintf(buf, sizeof buf, "%04d-%02u-%02uT%02d:%02d:%02dZ", static_cast<int>(year), month,
                day, static_cast<int>(secondOfDay / 3600), static_cast<int>(secondOfDay / 60 % 60),
                static_cast<int>(secondOfDay % 60));
  return std::string(buf);
}

}  // namespace appsync::plist::text
