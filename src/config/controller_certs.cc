// loadControllerCerts: trusting the certificate authorities of a SAN's
// directory server, then restarting the directory-service daemon.
#include <csignal>

#include "kolt/controller_helpers.h"
#include "kolt/directory.h"
#include "kolt/env.h"
#include "kolt/log.h"

namespace kolt {
namespace {

constexpr const char* kDirectoryServiceLabel = "com.orvat.opendirectoryd";

// The host of a directory URL: the third "/"-separated piece of an "ldap..."
// URL, or the text itself. Nothing for an "ldap..." URL with fewer pieces.
std::optional<std::string> hostOfDirectoryURL(const std::string& url) {
  if (url.compare(0, 4, "ldap") != 0) return url;
  std::size_t start = 0;
  for (int piece = 0; piece < 2; ++piece) {
    const std::size_t slash = url.find('/', start);
    if (slash == std::string::npos) return std::nullopt;
    start = slash + 1;
  }
  return url.substr(start, url.find('/', start) - start);
}

// Opens the node and makes the custom call; both share one error slot, and a
// node that does not open gets no call.
bool trustServerCertificates(Env& env, const std::string& nodeName, ErrorSlot* error) {
  std::unique_ptr<DirectoryNode> node = env.openDirectoryNode(nodeName, error);
  return node && node->customCall(kCustomCallClientAddCACerts, error);
}

}  // namespace

void loadControllerCerts(const std::string& url) {
  const std::optional<std::string> host = hostOfDirectoryURL(url);
  if (!host) return;
  log("loadControllerCerts called on %@", *host);

  Env& env = currentEnv();
  ErrorSlot error;
  // An ldap:// node fetches the certificates after StartTLS, which a server
  // that speaks TLS from the first byte refuses. When the URL says ldaps, the
  // host:port is such a server: ask it that way too.
  if (!trustServerCertificates(env, "/LDAPv3/ldap://" + *host, &error) &&
      url.compare(0, 8, "ldaps://") == 0) {
    error.reset();
    trustServerCertificates(env, "/LDAPv3/ldaps://" + *host, &error);
  }
  if (error) log("ClientAddCACerts returned %@", *error);

  if (env.signalJob(kDirectoryServiceLabel, SIGTERM) != 0) {
    log("Unable to kill opendirectoryd. If Vorn profile load fails, try again");
    return;
  }
  // Give the daemon time to come back before the caller uses the directory.
  env.sleepSeconds(3);
}

}  // namespace kolt
