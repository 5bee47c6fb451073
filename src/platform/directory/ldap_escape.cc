#include "platform/directory/ldap_escape.h"

#include <ldap.h>
#include <strings.h>

#include <string>
#include <vector>

namespace kolt {
namespace {

// A parsed DN as (type, value) pairs per RDN; nothing when it does not parse.
std::optional<std::vector<std::vector<std::pair<std::string, std::string>>>> parseDn(
    const std::string& dn) {
  LDAPDN parsed = nullptr;
  if (ldap_str2dn(dn.c_str(), &parsed, LDAP_DN_FORMAT_LDAPV3) != LDAP_SUCCESS) {
    return std::nullopt;
  }
  std::vector<std::vector<std::pair<std::string, std::string>>> out;
  for (int i = 0; parsed != nullptr && parsed[i] != nullptr; ++i) {
    std::vector<std::pair<std::string, std::string>> rdn;
    for (int j = 0; parsed[i][j] != nullptr; ++j) {
      const LDAPAVA* ava = parsed[i][j];
      std::string type(ava->la_attr.bv_val, ava->la_attr.bv_len);
      for (char& c : type) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
      rdn.emplace_back(std::move(type), std::string(ava->la_value.bv_val, ava->la_value.bv_len));
    }
    out.push_back(std::move(rdn));
  }
  ldap_dnfree(parsed);
  return out;
}

}  // namespace

std::string escapeDnValue(std::string_view value) {
  static const char* kHex = "0123456789ABCDEF";
  std::string out;
  out.reserve(value.size() + 8);
  for (std::size_t i = 0; i < value.size(); ++i) {
    const unsigned char c = static_cast<unsigned char>(value[i]);
    const bool special = c == ',' || c == '+' || c == '"' || c == '\\' || c == '<' || c == '>' ||
                         c == ';' || c == '=';
    const bool edge = (i == 0 && (c == ' ' || c == '#')) || (i + 1 == value.size() && c == ' ');
    if (c < 0x20 || c == 0x7f) {
      out += '\\';
      out += kHex[c >> 4];
      out += kHex[c & 15];
    } else if (special || edge) {
      out += '\\';
      out += static_cast<char>(c);
    } else {
      out += static_cast<char>(c);
    }
  }
  return out;
}

std::string escapeFilterValue(std::string_view value) {
  berval in{static_cast<ber_len_t>(value.size()), const_cast<char*>(value.data())};
  berval out{0, nullptr};
  if (ldap_bv2escaped_filter_value(&in, &out) != 0 || out.bv_val == nullptr) {
    // Only an allocation failure gets here; escape by hand then.
    static const char* kHex = "0123456789ABCDEF";
    std::string text;
    for (unsigned char c : value) {
      text += '\\';
      text += kHex[c >> 4];
      text += kHex[c & 15];
    }
    return text;
  }
  std::string text(out.bv_val, out.bv_len);
  ber_memfree(out.bv_val);
  return text;
}

std::optional<std::string> firstRdnValue(const std::string& dn) {
  auto parsed = parseDn(dn);
  if (!parsed || parsed->empty() || (*parsed)[0].size() != 1) return std::nullopt;
  return (*parsed)[0][0].second;
}

bool sameDn(const std::string& a, const std::string& b) {
  auto pa = parseDn(a);
  auto pb = parseDn(b);
  return pa && pb && *pa == *pb;
}

}  // namespace kolt
