#include "plist/number_text.h"

#include <charconv>
#include <cmath>
#include <cstdint>

namespace kolt::number_text {

std::string formatInteger(const Integer& i) {
  char buf[32];
  std::to_chars_result r =
      i.isUnsigned ? std::to_chars(buf, buf + sizeof buf, static_cast<std::uint64_t>(i.bits))
                   : std::to_chars(buf, buf + sizeof buf, i.bits);
  return std::string(buf, r.ptr);
}

std::string formatReal(double d) {
  if (std::isnan(d)) return "nan";
  if (std::isinf(d)) return d > 0 ? "+infinity" : "-infinity";
  char buf[64];
  std::to_chars_result r = std::to_chars(buf, buf + sizeof buf, d);
  return std::string(buf, r.ptr);
}

}  // namespace kolt::number_text
