// Escaping values for LDAP: one function per syntax. Every value that kolt
// puts into a DN or a filter goes through these; unescaped, a record name
// such as "My*" would match another SAN's record, "a+cn=b" would make a
// multi-valued RDN and "x,cn=groups" would address another path.
#ifndef KOLT_PLATFORM_DIRECTORY_LDAP_ESCAPE_H
#define KOLT_PLATFORM_DIRECTORY_LDAP_ESCAPE_H

#include <optional>
#include <string>
#include <string_view>

namespace kolt {

// `value` as an RDN attribute value (RFC 4514, section 2.4): the special
// characters , + " \ < > ; = are backslash-escaped, a leading blank or "#"
// and a trailing blank too, control bytes (NUL included) become \XX. Other
// bytes, UTF-8 included, stay as they are.
std::string escapeDnValue(std::string_view value);

// `value` as a filter assertion value (RFC 4515): * ( ) \ NUL and every
// non-ASCII byte become \XX (libldap's ldap_bv2escaped_filter_value).
std::string escapeFilterValue(std::string_view value);

// The value of the first RDN of `dn` (unescaped), when `dn` parses as an
// LDAPv3 DN with a single-valued first RDN. DNs are parsed, never compared
// as strings: servers may return them hex-escaped.
std::optional<std::string> firstRdnValue(const std::string& dn);

// True when `a` and `b` parse as DNs with the same RDNs: attribute types
// compared without case, values byte for byte after unescaping.
bool sameDn(const std::string& a, const std::string& b);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_LDAP_ESCAPE_H
