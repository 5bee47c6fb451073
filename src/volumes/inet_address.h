// IPv4 address text as the classic inet_addr / inet_ntoa pair reads and
// writes it, without the all-ones failure value that inet_addr cannot tell
// from 255.255.255.255.
#ifndef KOLT_VOLUMES_INET_ADDRESS_H
#define KOLT_VOLUMES_INET_ADDRESS_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kolt {

// Reads an IPv4 address from the start of `text`: one to four parts, each a
// decimal, octal (leading 0) or hexadecimal (leading 0x) number, ending at
// the end of the text, at a NUL or at the first ASCII white-space character,
// after which anything may follow. "010.0.0.1 x" reads as 8.0.0.1, "1.2"
// as 1.0.0.2. Returns the address in host byte order, or nothing when the
// text is not an address.
std::optional<std::uint32_t> parseInetAddress(std::string_view text);

// The dotted-quad decimal form of an address in host byte order.
std::string formatInetAddress(std::uint32_t address);

}  // namespace kolt

#endif  // KOLT_VOLUMES_INET_ADDRESS_H
