// Record names of a SAN: the SAN name escaped to the characters a URL host
// may hold, "%" excluded.
#include "kolt/directory_records.h"

namespace kolt {
namespace {

bool keptAsIs(unsigned char c) {
  if ((c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9')) return true;
  switch (c) {
    case '-': case '.': case '~': case '!': case '$': case '&': case '\'': case '(': case ')':
    case '*': case '+': case ',': case ';': case '=': case ':': case '[': case ']':
      return true;
    default:
      return false;  // "_" too: it is the escape character
  }
}

}  // namespace

std::string ldapSanNameForName(std::string_view sanName) {
  static const char kHex[] = "0123456789ABCDEF";
  std::string out;
  out.reserve(sanName.size() * 3);
  for (unsigned char c : sanName) {
    if (keptAsIs(c)) {
      out += static_cast<char>(c);
    } else {
      out += '_';
      out += kHex[c >> 4];
      out += kHex[c & 15];
    }
  }
  return out;
}

std::string ldapSanConfNameForName(std::string_view sanName) {
  return "com.orvat.vorn.conf." + ldapSanNameForName(sanName);
}

std::string ldapSanUserNameForName(std::string_view sanName) {
  return "com.orvat.vorn.auth." + ldapSanNameForName(sanName);
}

std::string ldapSanAccessNameForName(std::string_view sanName) {
  return "com.orvat.vorn.access." + ldapSanNameForName(sanName);
}

}  // namespace kolt
