// Text forms of property-list numbers, shared by the XML codec and the
// printed form.
#ifndef KOLT_PLIST_NUMBER_TEXT_H
#define KOLT_PLIST_NUMBER_TEXT_H

#include <optional>
#include <string>
#include <string_view>

#include "kolt/plist.h"

namespace kolt::number_text {

// Decimal digits with the sign, over the full signed and unsigned range.
std::string formatInteger(const Integer& i);
// The shortest text that reads back to the same double; "nan", "+infinity"
// and "-infinity" for the special values; "-0" keeps the sign of zero.
std::string formatReal(double d);
// Appends the same texts without a temporary string.
void appendInteger(std::string& out, const Integer& i);
void appendReal(std::string& out, double d);

// Reads an integer: an optional sign, then decimal digits or "0x" and
// hexadecimal digits, nothing else. Values from INT64_MIN to UINT64_MAX;
// anything outside that range, or any other character, is no integer.
std::optional<Integer> parseInteger(std::string_view text);
// Reads a real: an optional sign, then a decimal number with optional
// fraction and exponent, or "inf", "infinity", "nan" in any case. Values
// beyond the range of a double become infinite or zero, as strtod gives.
std::optional<double> parseReal(std::string_view text);

}  // namespace kolt::number_text

#endif  // KOLT_PLIST_NUMBER_TEXT_H
