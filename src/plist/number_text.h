// Text forms of property-list numbers, shared by the XML writer and the
// printed form.
#ifndef KOLT_PLIST_NUMBER_TEXT_H
#define KOLT_PLIST_NUMBER_TEXT_H

#include <string>

#include "kolt/plist.h"

namespace kolt::number_text {

// Decimal digits with the sign, over the full signed and unsigned range.
std::string formatInteger(const Integer& i);
// The shortest text that reads back to the same double; "nan", "+infinity"
// and "-infinity" for the special values; "-0" keeps the sign of zero.
std::string formatReal(double d);

}  // namespace kolt::number_text

#endif  // KOLT_PLIST_NUMBER_TEXT_H
