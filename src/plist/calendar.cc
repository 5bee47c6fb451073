#include "plist/calendar.h"

#include <cmath>
#include <cstdio>

namespace kolt::calendar {
namespace {

// Days since 1970-01-01 of a civil date (Howard Hinnant's algorithm).
std::int64_t daysFromCivil(std::int64_t y, int m, int d) {
  y -= m <= 2;
  const std::int64_t era = (y >= 0 ? y : y - 399) / 400;
  const std::int64_t yoe = y - era * 400;
  const std::int64_t doy = (153 * (m + (m > 2 ? -3 : 9)) + 2) / 5 + d - 1;
  const std::int64_t doe = yoe * 365 + yoe / 4 - yoe / 100 + doy;
  return era * 146097 + doe - 719468;
}

void civilFromDays(std::int64_t z, std::int64_t* y, int* m, int* d) {
  z += 719468;
  const std::int64_t era = (z >= 0 ? z : z - 146096) / 146097;
  const std::int64_t doe = z - era * 146097;
  const std::int64_t yoe = (doe - doe / 1460 + doe / 36524 - doe / 146096) / 365;
  const std::int64_t doy = doe - (365 * yoe + yoe / 4 - yoe / 100);
  const std::int64_t mp = (5 * doy + 2) / 153;
  *d = static_cast<int>(doy - (153 * mp + 2) / 5 + 1);
  *m = static_cast<int>(mp < 10 ? mp + 3 : mp - 9);
  *y = yoe + era * 400 + (*m <= 2);
}

bool isLeap(std::int64_t y) {
  return (y % 4 == 0 && y % 100 != 0) || y % 400 == 0;
}

int daysInMonth(std::int64_t y, int m) {
  static const int kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  return m == 2 && isLeap(y) ? 29 : kDays[m - 1];
}

// Reads exactly `count` digits at `pos`.
bool readDigits(std::string_view s, std::size_t& pos, std::size_t count, int* out) {
  if (pos + count > s.size()) return false;
  int v = 0;
  for (std::size_t i = 0; i < count; ++i) {
    const char c = s[pos + i];
    if (c < '0' || c > '9') return false;
    v = v * 10 + (c - '0');
  }
  pos += count;
  *out = v;
  return true;
}

std::string formatCivil(const CivilTime& t, const char* pattern) {
  char buf[64];
  std::snprintf(buf, sizeof buf, pattern, static_cast<long long>(t.year), t.month, t.day, t.hour,
                t.minute, t.second);
  return buf;
}

}  // namespace

std::int64_t secondsFromCivil(const CivilTime& t) {
  const std::int64_t days = daysFromCivil(t.year, t.month, t.day);
  return days * 86400 + t.hour * 3600 + t.minute * 60 + t.second - kUnixEpochTo2001;
}

CivilTime civilFromSeconds(double secondsSince2001) {
  // Clamp to a range the integer arithmetic can hold (years about +-2.9e11).
  double f = std::floor(secondsSince2001);
  if (!(f > -9.0e18)) f = -9.0e18;
  if (f > 9.0e18) f = 9.0e18;
  const std::int64_t total = static_cast<std::int64_t>(f) + kUnixEpochTo2001;
  std::int64_t days = total / 86400;
  std::int64_t rem = total % 86400;
  if (rem < 0) {
    rem += 86400;
    --days;
  }
  CivilTime t;
  civilFromDays(days, &t.year, &t.month, &t.day);
  t.hour = static_cast<int>(rem / 3600);
  t.minute = static_cast<int>(rem % 3600 / 60);
  t.second = static_cast<int>(rem % 60);
  return t;
}

std::string formatIso8601(double secondsSince2001) {
  const CivilTime t = civilFromSeconds(secondsSince2001);
  return formatCivil(
      t, t.year < 0 ? "%05lld-%02d-%02dT%02d:%02d:%02dZ" : "%04lld-%02d-%02dT%02d:%02d:%02dZ");
}

std::string formatForDescription(double secondsSince2001) {
  const CivilTime t = civilFromSeconds(secondsSince2001);
  return formatCivil(t, "%04lld-%02d-%02d %02d:%02d:%02d +0000");
}

std::optional<double> parseIso8601(std::string_view s) {
  std::size_t pos = 0;
  bool negative = false;
  if (pos < s.size() && s[pos] == '-') {
    negative = true;
    ++pos;
  }
  // Year: at least four digits, at most twelve.
  std::int64_t year = 0;
  std::size_t yearDigits = 0;
  while (pos < s.size() && s[pos] >= '0' && s[pos] <= '9' && yearDigits < 12) {
    year = year * 10 + (s[pos] - '0');
    ++pos;
    ++yearDigits;
  }
  // Twelve digits would overflow the seconds; kMaxYear keeps them in range
  // and still reads every date the writer can express.
  if (yearDigits < 4 || year > kMaxYear) return std::nullopt;
  if (negative) year = -year;
  CivilTime t;
  t.year = year;
  if (pos >= s.size() || s[pos++] != '-') return std::nullopt;
  if (!readDigits(s, pos, 2, &t.month)) return std::nullopt;
  if (pos >= s.size() || s[pos++] != '-') return std::nullopt;
  if (!readDigits(s, pos, 2, &t.day)) return std::nullopt;
  if (pos >= s.size() || s[pos++] != 'T') return std::nullopt;
  if (!readDigits(s, pos, 2, &t.hour)) return std::nullopt;
  if (pos >= s.size() || s[pos++] != ':') return std::nullopt;
  if (!readDigits(s, pos, 2, &t.minute)) return std::nullopt;
  if (pos >= s.size() || s[pos++] != ':') return std::nullopt;
  if (!readDigits(s, pos, 2, &t.second)) return std::nullopt;
  if (pos >= s.size() || s[pos++] != 'Z' || pos != s.size()) return std::nullopt;
  if (t.month < 1 || t.month > 12 || t.day < 1 || t.day > daysInMonth(t.year, t.month) ||
      t.hour > 23 || t.minute > 59 || t.second > 59) {
    return std::nullopt;
  }
  return static_cast<double>(secondsFromCivil(t));
}

}  // namespace kolt::calendar
