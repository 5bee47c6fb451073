#include "sync/metadata_address.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <cctype>
#include <cstdio>
#include <cstring>

namespace kolt {
namespace {

// The integer value of the leading digits, after blanks and an optional sign;
// 0 when there are none.
long leadingInteger(const std::string& text) {
  std::size_t i = 0;
  while (i < text.size() && std::isspace(static_cast<unsigned char>(text[i]))) ++i;
  bool negative = false;
  if (i < text.size() && (text[i] == '-' || text[i] == '+')) negative = text[i++] == '-';
  long value = 0;
  while (i < text.size() && std::isdigit(static_cast<unsigned char>(text[i])) && value < 100000) {
    value = value * 10 + (text[i++] - '0');
  }
  return negative ? -value : value;
}

bool isLinkLocalV6(const std::string& address) {
  return address.size() == 16 && static_cast<unsigned char>(address[0]) == 0xfe &&
         (static_cast<unsigned char>(address[1]) & 0xc0) == 0x80;
}

}  // namespace

std::optional<std::string> metadataAddressForNetwork(Env& env, const std::string& network) {
  const std::size_t slash = network.rfind('/');
  if (slash == std::string::npos) return std::nullopt;
  long prefix = leadingInteger(network.substr(slash + 1));
  if (prefix <= 0) return std::nullopt;
  if (prefix > 32) prefix = 32;
  struct in_addr networkAddress;
  // inet_aton follows the inet_addr rules (one to four parts, octal, hex);
  // an unreadable network matches nothing, as the all-ones failure value would.
  if (::inet_aton(network.substr(0, slash).c_str(), &networkAddress) == 0) {
    networkAddress.s_addr = INADDR_NONE;
  }
  const std::uint32_t mask = prefix == 32 ? 0xffffffffu : ~(0xffffffffu >> prefix);
  const std::uint32_t wanted = ntohl(networkAddress.s_addr) & mask;

  std::vector<InterfaceAddress> interfaces;
  if (env.interfaceAddresses(&interfaces) != 0) return std::nullopt;
  std::optional<std::string> found;
  for (const InterfaceAddress& entry : interfaces) {
    if (entry.address.empty() || entry.interfaceName.empty()) continue;
    if (entry.interfaceName.compare(0, 2, "lo") == 0) continue;
    if (entry.family != AF_INET && entry.family != AF_INET6) continue;
    if (entry.family == AF_INET6 && isLinkLocalV6(entry.address)) continue;
    if (entry.family != AF_INET || entry.address.size() != 4) continue;
    std::uint32_t raw;
    std::memcpy(&raw, entry.address.data(), 4);
    if ((ntohl(raw) & mask) != wanted) continue;
    char text[INET_ADDRSTRLEN];
    if (::inet_ntop(AF_INET, entry.address.data(), text, sizeof text) == nullptr) continue;
    found = text;
    break;
  }
  std::fprintf(stderr, "Found metadata IP '%s'\n", found ? found->c_str() : "(null)");
  return found;
}

}  // namespace kolt
