#include "platform/directory/node_address.h"

#include <arpa/inet.h>

#include <cctype>
#include <charconv>

namespace kolt {
namespace {

std::string toLower(std::string_view s) {
  std::string out(s);
  for (char& c : out) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return out;
}

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

std::optional<std::string> percentDecode(std::string_view s) {
  std::string out;
  for (std::size_t i = 0; i < s.size(); ++i) {
    if (s[i] != '%') {
      out += s[i];
      continue;
    }
    if (i + 2 >= s.size()) return std::nullopt;
    const int hi = hexDigit(s[i + 1]);
    const int lo = hexDigit(s[i + 2]);
    if (hi < 0 || lo < 0) return std::nullopt;
    out += static_cast<char>(hi * 16 + lo);
    i += 2;
  }
  return out;
}


// Splits "host[:port]" (IPv6 in brackets) into its parts; false when the
// text is not such a pair.
bool parseHostPort(std::string_view hostPort, int defaultPort, std::string* host, int* port) {
  std::string_view portText;
  if (!hostPort.empty() && hostPort[0] == '[') {
    const std::size_t close = hostPort.find(']');
    if (close == std::string_view::npos) return false;
    *host = std::string(hostPort.substr(1, close - 1));
    const std::string_view rest = hostPort.substr(close + 1);
    if (!rest.empty()) {
      if (rest[0] != ':') return false;
      portText = rest.substr(1);
    }
    if (host->find(':') == std::string::npos) return false;
  } else {
    const std::size_t colon = hostPort.find(':');
    *host = std::string(hostPort.substr(0, colon));
    if (colon != std::string_view::npos) portText = hostPort.substr(colon + 1);
  }
  if (host->empty()) return false;
  for (unsigned char c : *host) {
    // Host names, IPv4 and IPv6 literals only: nothing that could start a
    // path, user information or another URL part.
    if (!(std::isalnum(c) || c == '-' || c == '.' || c == '_' || c == ':' || c == '%')) {
      return false;
    }
  }
  *port = defaultPort;
  if (!hostPort.empty() && hostPort.back() == ':') return false;  // "host:" names no port
  if (!portText.empty()) {
    int value = 0;
    const auto [end, ec] =
        std::from_chars(portText.data(), portText.data() + portText.size(), value);
    if (ec != std::errc() || end != portText.data() + portText.size() || value < 1 ||
        value > 65535) {
      return false;
    }
    *port = value;
  }
  return true;
}

}  // namespace

std::optional<NodeAddress> parseNodeName(std::string_view nodeName) {
  if (nodeName.substr(0, kLdapNodePrefix.size()) != kLdapNodePrefix) return std::nullopt;
  std::string_view rest = nodeName.substr(kLdapNodePrefix.size());
  if (rest.empty()) return std::nullopt;

  NodeAddress address;
  address.url = std::string(rest);
  const std::size_t schemeEnd = rest.find("://");
  if (schemeEnd == std::string_view::npos) {
    // host[:port] means ldap://host[:port].
    if (!parseHostPort(rest, 389, &address.host, &address.port)) return std::nullopt;
    address.scheme = LdapScheme::kLdap;
    address.url = "ldap://" + std::string(rest);
    return address;
  }
  const std::string scheme = toLower(rest.substr(0, schemeEnd));
  std::string_view body = rest.substr(schemeEnd + 3);
  // A URL names a server only: an optional trailing "/" and nothing more.
  if (!body.empty() && body.back() == '/') body.remove_suffix(1);
  if (body.find_first_of("/?#@ ") != std::string_view::npos) return std::nullopt;
  if (scheme == "ldapi") {
    address.scheme = LdapScheme::kLdapi;
    if (body.empty()) {
      address.socketPath = std::string(kDefaultLdapiSocket);
      return address;
    }
    std::optional<std::string> path = percentDecode(body);
    if (!path || path->empty() || (*path)[0] != '/' || path->find('\0') != std::string::npos) {
      return std::nullopt;
    }
    address.socketPath = std::move(*path);
    return address;
  }
  if (scheme == "ldap" || scheme == "ldaps") {
    address.scheme = scheme == "ldap" ? LdapScheme::kLdap : LdapScheme::kLdaps;
    if (!parseHostPort(body, scheme == "ldap" ? 389 : 636, &address.host, &address.port)) {
      return std::nullopt;
    }
    return address;
  }
  return std::nullopt;
}

std::string connectionUrl(const NodeAddress& address, const std::string& mappedSocketPath) {
  if (address.scheme == LdapScheme::kLdapi) return "ldapi://" + percentEncodePath(mappedSocketPath);
  const std::string host =
      address.host.find(':') != std::string::npos ? "[" + address.host + "]" : address.host;
  return (address.scheme == LdapScheme::kLdaps ? "ldaps://" : "ldap://") + host + ":" +
         std::to_string(address.port);
}

bool isLoopbackHost(std::string_view host) {
  std::string h = toLower(host);
  if (!h.empty() && h.back() == '.') h.pop_back();
  if (h == "localhost" || h.ends_with(".localhost")) return true;
  in_addr v4{};
  if (inet_pton(AF_INET, h.c_str(), &v4) == 1) return (ntohl(v4.s_addr) >> 24) == 127;
  in6_addr v6{};
  if (inet_pton(AF_INET6, h.c_str(), &v6) == 1) {
    if (IN6_IS_ADDR_LOOPBACK(&v6)) return true;
    if (IN6_IS_ADDR_V4MAPPED(&v6)) return v6.s6_addr[12] == 127;
  }
  return false;
}

bool startTlsRequiredBeforeBind(const NodeAddress& address) {
  return address.scheme == LdapScheme::kLdap && !isLoopbackHost(address.host);
}

std::string serverKey(const NodeAddress& address) {
  if (address.scheme == LdapScheme::kLdapi)
    return "ldapi://" + percentEncodePath(address.socketPath);
  return connectionUrl(NodeAddress{address.scheme, toLower(address.host), address.port, {}, {}},
                       {});
}

std::string percentEncodePath(std::string_view s) {
  static const char* kHex = "0123456789ABCDEF";
  std::string out;
  for (unsigned char c : s) {
    if (std::isalnum(c) || c == '-' || c == '.' || c == '_' || c == '~') {
      out += static_cast<char>(c);
    } else {
      out += '%';
      out += kHex[c >> 4];
      out += kHex[c & 15];
    }
  }
  return out;
}

}  // namespace kolt
