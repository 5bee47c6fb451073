// One LDAP session of a node: the libldap handle, its transport security,
// its credentials and the search base. Shared by the node and its records.
#ifndef KOLT_PLATFORM_DIRECTORY_LDAP_CONNECTION_H
#define KOLT_PLATFORM_DIRECTORY_LDAP_CONNECTION_H

#include <ldap.h>
#include <signal.h>

#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "kolt/directory.h"
#include "kolt/env.h"
#include "kolt/error.h"
#include "platform/directory/node_address.h"

namespace kolt {

// Network time-outs: connecting, and waiting for any one operation.
inline constexpr int kLdapConnectTimeoutSeconds = 10;
inline constexpr int kLdapOperationTimeoutSeconds = 60;

// Keeps SIGPIPE from the calling thread while it lives. libldap (and
// OpenSSL's socket I/O) write with write(2): a request on a connection that
// the server has closed, an ldapi socket above all, would otherwise end the
// caller's process. A SIGPIPE raised meanwhile is consumed; one pending
// before is left as it was.
class SigpipeBlock {
 public:
  SigpipeBlock();
  ~SigpipeBlock();
  SigpipeBlock(const SigpipeBlock&) = delete;
  SigpipeBlock& operator=(const SigpipeBlock&) = delete;

 private:
  sigset_t previous_;
  bool wasPending_ = false;
};

class LdapConnection {
 public:
  LdapConnection(Env& env, NodeAddress address);
  ~LdapConnection();
  LdapConnection(const LdapConnection&) = delete;
  LdapConnection& operator=(const LdapConnection&) = delete;

  // Every call below needs one of these alive: the connection's mutex held
  // and SIGPIPE kept away.
  class Use {
   public:
    explicit Use(LdapConnection& connection) : lock_(connection.mutex_) {}

   private:
    SigpipeBlock block_;
    std::lock_guard<std::mutex> lock_;
  };
  Env& env() { return env_; }
  const NodeAddress& address() const { return address_; }

  // Connects when not connected (at the node's opening, and again after a
  // lost connection), binds as the session's credentials (none, SASL
  // EXTERNAL on ldapi, or the user set by setCredentials) and finds the
  // search base: at the first connection from the Env's search-base cache
  // when it knows the server, else from the root DSE (then cached). The
  // connection is kept for every later operation; one that the server
  // closed since its last use (a restart) is noticed before the next
  // operation, which then connects again.
  std::optional<Error> ready();
  LDAP* handle() { return ld_; }
  const std::string& base() const { return base_; }

  // Simple bind as the user record `name` on the kept connection (after
  // StartTLS where the transport rule asks for it); see DirectoryNode. A
  // failure leaves the session anonymous. Invalid credentials under a
  // cached base are tried once more when the root DSE names other contexts.
  std::optional<Error> setCredentials(const std::string& name, const std::string& password);

  // True for the results a wrong base explains, for an operation on a DN
  // under the base: noSuchObject (32), and unwillingToPerform (53), which
  // slapd answers for a DN under no suffix it serves.
  static bool wrongBaseExplains(int rc) {
    return rc == LDAP_NO_SUCH_OBJECT || rc == LDAP_UNWILLING_TO_PERFORM;
  }

  // For an operation under the base that failed in a way a wrong base
  // explains (see above). When the base came from the Env's cache and was
  // not confirmed on this connection yet, reads the root DSE once and
  // chooses the base anew, dropping the cache entry when the server's
  // contexts changed. True when the base changed, so the operation is worth
  // one more try (and only one: a second call returns false).
  bool refreshStaleBase();

  // The error for result code `rc` of the last operation, with the
  // server's diagnostic message. A lost connection is dropped, so the next
  // operation connects again.
  Error error(int rc);

  // The DN of a record, and the container of a record type.
  std::string recordDn(RecordType type, const std::string& name) const;
  std::string container(RecordType type) const;

 private:
  std::optional<Error> connect();
  std::optional<Error> configureTls();
  std::optional<Error> startTlsIfRequired();
  std::optional<Error> bindAsUser(const std::string& name, const std::string& password);
  void becomeAnonymous();
  bool closedByServer() const;
  std::optional<Error> readNamingContexts(std::vector<std::string>* contexts);
  bool takeCachedBase();
  bool openingIdentity() const;
  void rememberBase();
  int simpleBind(const std::string& dn, const std::string& password);
  void chooseBaseByProbing();
  void drop();

  std::mutex mutex_;
  Env& env_;
  NodeAddress address_;
  LDAP* ld_ = nullptr;
  bool tls_ = false;
  std::string serverKey_;  // the key of the Env's search-base cache
  std::vector<std::string> namingContexts_;
  std::string base_;
  bool baseConfirmed_ = false;
  // The contexts and base came from the Env's cache and no root DSE of this
  // connection has confirmed them yet.
  bool baseFromCache_ = false;
  // The user the session is bound as, kept to bind again after a lost
  // connection. Never logged, never put into an error.
  std::optional<std::string> userName_;
  std::string password_;
  // False once credentials were set: a failed bind leaves the session
  // anonymous, also on ldapi.
  bool external_ = true;
};

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_LDAP_CONNECTION_H
