// Calendar arithmetic for property-list dates (seconds since 2001-01-01
// 00:00:00 UTC), valid far beyond 1970-2038: proleptic Gregorian, UTC.
#ifndef KOLT_PLIST_CALENDAR_H
#define KOLT_PLIST_CALENDAR_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kolt::calendar {

struct CivilTime {
  std::int64_t year = 2001;
  int month = 1;  // 1..12
  int day = 1;    // 1..31
  int hour = 0;
  int minute = 0;
  int second = 0;
};

// Whole seconds since 2001 of a civil UTC time (no range checks).
std::int64_t secondsFromCivil(const CivilTime& t);
// The civil UTC time of floor(seconds).
CivilTime civilFromSeconds(double secondsSince2001);

// "YYYY-MM-DDTHH:MM:SSZ" (the XML form; fractions are dropped by flooring).
std::string formatIso8601(double secondsSince2001);
// Reads the XML form strictly: a four-digit year (optionally preceded by
// "-" or with more digits, up to kMaxYear), month, day, hour, minute and
// second with their ranges checked, and a final "Z". Anything else is no
// date.
std::optional<double> parseIso8601(std::string_view text);
// "YYYY-MM-DD HH:MM:SS +0000" (the printed form).
std::string formatForDescription(double secondsSince2001);

// The largest year (either side of year 0) that parseIso8601 accepts; about
// 8.2e18 seconds from 2001, inside 64-bit arithmetic.
inline constexpr std::int64_t kMaxYear = 260000000000;
// The largest distance from 2001 in seconds that formatIso8601 is used for
// (writers refuse dates beyond it): years of fewer digits than kMaxYear.
inline constexpr double kMaxIso8601Seconds = 8.0e18;

// Seconds between 1970-01-01 and 2001-01-01.
inline constexpr std::int64_t kUnixEpochTo2001 = 978307200;

}  // namespace kolt::calendar

#endif  // KOLT_PLIST_CALENDAR_H
