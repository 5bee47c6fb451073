#include "platform/directory/ldap_connection.h"

#include <poll.h>
#include <pthread.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>

#include "platform/directory/directory_error.h"
#include "platform/directory/ldap_escape.h"
#include "platform/directory/trust_store.h"

namespace kolt {
namespace {

const char* kRootDseAttributes[] = {"namingContexts", nullptr};
const char* kNoAttributes[] = {LDAP_NO_ATTRS, nullptr};

// SASL EXTERNAL asks nothing; any prompt gets the default answer.
int noInteraction(LDAP*, unsigned, void*, void*) {
  return LDAP_SUCCESS;
}

timeval operationTimeout() {
  return {kLdapOperationTimeoutSeconds, 0};
}

}  // namespace

SigpipeBlock::SigpipeBlock() {
  sigset_t pipe;
  sigemptyset(&pipe);
  sigaddset(&pipe, SIGPIPE);
  sigset_t pending;
  sigemptyset(&pending);
  ::sigpending(&pending);
  wasPending_ = sigismember(&pending, SIGPIPE) == 1;
  ::pthread_sigmask(SIG_BLOCK, &pipe, &previous_);
}

SigpipeBlock::~SigpipeBlock() {
  sigset_t pipe;
  sigemptyset(&pipe);
  sigaddset(&pipe, SIGPIPE);
  if (!wasPending_) {
    const timespec zero{};
    while (::sigtimedwait(&pipe, nullptr, &zero) < 0 && errno == EINTR) {
    }
  }
  ::pthread_sigmask(SIG_SETMASK, &previous_, nullptr);
}

LdapConnection::LdapConnection(Env& env, NodeAddress address)
    : env_(env), address_(std::move(address)) {
  // An ldapi server is known by the socket it is reached through: the same
  // system path leads to another server below another root.
  serverKey_ = address_.scheme == LdapScheme::kLdapi
                   ? "ldapi://" + percentEncodePath(env_.hostPath(address_.socketPath))
                   : serverKey(address_);
}

LdapConnection::~LdapConnection() {
  SigpipeBlock block;  // the unbind may meet a closed connection
  drop();
  explicit_bzero(password_.data(), password_.size());
}

void LdapConnection::drop() {
  if (ld_ != nullptr) ldap_unbind_ext_s(ld_, nullptr, nullptr);
  ld_ = nullptr;
  tls_ = false;
}

Error LdapConnection::error(int rc) {
  std::string diagnostic;
  if (ld_ != nullptr) {
    char* text = nullptr;
    if (ldap_get_option(ld_, LDAP_OPT_DIAGNOSTIC_MESSAGE, &text) == LDAP_OPT_SUCCESS && text) {
      diagnostic = text;
      ldap_memfree(text);
    }
  }
  if (rc == LDAP_SERVER_DOWN || rc == LDAP_CONNECT_ERROR || rc == LDAP_TIMEOUT) drop();
  return directoryError(rc, diagnostic);
}

std::string LdapConnection::container(RecordType type) const {
  return (type == RecordType::kUsers ? "cn=users," : "cn=groups,") + base_;
}

std::string LdapConnection::recordDn(RecordType type, const std::string& name) const {
  return (type == RecordType::kUsers ? "uid=" : "cn=") + escapeDnValue(name) + "," +
         container(type);
}

std::optional<Error> LdapConnection::connect() {
  std::string socketPath;
  if (address_.scheme == LdapScheme::kLdapi) {
    socketPath = env_.hostPath(address_.socketPath);
    // libldap would cut a longer path and reach another socket.
    if (socketPath.size() > kMaxSocketPathLength) {
      return directoryError(LDAP_PARAM_ERROR, "ldapi socket path too long: " + socketPath);
    }
  }
  const std::string url = connectionUrl(address_, socketPath);
  if (const int rc = ldap_initialize(&ld_, url.c_str()); rc != LDAP_SUCCESS) {
    ld_ = nullptr;
    return directoryError(rc, url);
  }
  const int version = LDAP_VERSION3;
  const timeval network{kLdapConnectTimeoutSeconds, 0};
  const timeval operation = operationTimeout();
  ldap_set_option(ld_, LDAP_OPT_PROTOCOL_VERSION, &version);
  ldap_set_option(ld_, LDAP_OPT_REFERRALS, LDAP_OPT_OFF);
  ldap_set_option(ld_, LDAP_OPT_RESTART, LDAP_OPT_ON);
  ldap_set_option(ld_, LDAP_OPT_NETWORK_TIMEOUT, &network);
  ldap_set_option(ld_, LDAP_OPT_TIMEOUT, &operation);
  if (address_.scheme == LdapScheme::kLdaps) {
    if (auto e = configureTls()) return e;
  }
  if (const int rc = ldap_connect(ld_); rc != LDAP_SUCCESS) return error(rc);
  tls_ = address_.scheme == LdapScheme::kLdaps;
  return std::nullopt;
}

// Verifies the server against the system's trust store and kolt's own. Only
// for a connection that uses TLS: loading the system's trust store costs
// more than a whole exchange with a server on this machine.
std::optional<Error> LdapConnection::configureTls() {
  const int demand = LDAP_OPT_X_TLS_DEMAND;
  ldap_set_option(ld_, LDAP_OPT_X_TLS_REQUIRE_CERT, &demand);
  const std::string bundle(kSystemTrustBundle);
  if (::access(bundle.c_str(), R_OK) == 0) {
    ldap_set_option(ld_, LDAP_OPT_X_TLS_CACERTFILE, bundle.c_str());
  }
  FileInfo info;
  const std::string trustDir(kTrustStoreDirectory);
  if (env_.fileInfo(trustDir, &info) == 0 && info.isDirectory) {
    const std::string hostDir = env_.hostPath(trustDir);
    ldap_set_option(ld_, LDAP_OPT_X_TLS_CACERTDIR, hostDir.c_str());
  }
  const int newContext = 0;
  if (const int rc = ldap_set_option(ld_, LDAP_OPT_X_TLS_NEWCTX, &newContext);
      rc != LDAP_OPT_SUCCESS) {
    return error(rc);
  }
  return std::nullopt;
}

std::optional<Error> LdapConnection::startTlsIfRequired() {
  if (tls_ || !startTlsRequiredBeforeBind(address_)) return std::nullopt;
  if (auto e = configureTls()) return e;
  if (const int rc = ldap_start_tls_s(ld_, nullptr, nullptr); rc != LDAP_SUCCESS) {
    Error e = error(rc);
    return directoryError(static_cast<int>(e.code()),
                          "StartTLS failed; a password is never sent in clear to another host (" +
                              e.description().value_or("") + ")");
  }
  tls_ = true;
  return std::nullopt;
}

std::optional<Error> LdapConnection::readNamingContexts(std::vector<std::string>* contexts) {
  LDAPMessage* result = nullptr;
  timeval timeout = operationTimeout();
  const int rc = ldap_search_ext_s(ld_, "", LDAP_SCOPE_BASE, "(objectClass=*)",
                                   const_cast<char**>(kRootDseAttributes), 0, nullptr, nullptr,
                                   &timeout, 0, &result);
  std::unique_ptr<LDAPMessage, decltype(&ldap_msgfree)> holder(result, ldap_msgfree);
  if (rc != LDAP_SUCCESS) return error(rc);
  contexts->clear();
  LDAPMessage* entry = ldap_first_entry(ld_, result);
  if (entry != nullptr) {
    berval** values = ldap_get_values_len(ld_, entry, "namingContexts");
    for (int i = 0; values != nullptr && values[i] != nullptr; ++i) {
      contexts->emplace_back(values[i]->bv_val, values[i]->bv_len);
    }
    ldap_value_free_len(values);
  }
  if (contexts->empty()) {
    return directoryError(LDAP_NO_SUCH_OBJECT, "the server names no naming context");
  }
  return std::nullopt;
}

// What the Env's cache knows of this server, taken as if read from its root
// DSE; confirmed by the first operation that finds the base.
bool LdapConnection::takeCachedBase() {
  std::optional<SearchBaseCache::Entry> entry = env_.searchBaseCache().find(serverKey_);
  if (!entry || entry->namingContexts.empty() || entry->base.empty()) return false;
  namingContexts_ = std::move(entry->namingContexts);
  base_ = std::move(entry->base);
  baseConfirmed_ = true;
  baseFromCache_ = true;
  return true;
}

// The session acts as every node of the server does at opening (anonymous,
// or the local superuser on ldapi), so the base it chose is every node's.
bool LdapConnection::openingIdentity() const {
  return !userName_ && (address_.scheme != LdapScheme::kLdapi || external_);
}

void LdapConnection::rememberBase() {
  if (baseFromCache_ || !baseConfirmed_ || !openingIdentity()) return;
  env_.searchBaseCache().store(serverKey_, {namingContexts_, base_});
}

bool LdapConnection::refreshStaleBase() {
  if (!baseFromCache_) return false;
  // Once per connection: whatever the root DSE says now is final.
  baseFromCache_ = false;
  if (ld_ == nullptr && connect()) return false;
  std::vector<std::string> contexts;
  if (readNamingContexts(&contexts)) return false;
  // The contexts the cache knew: the base is right and the failure the
  // operation's own (a wrong password, a record that is not there).
  if (contexts == namingContexts_) return false;
  env_.searchBaseCache().forget(serverKey_);
  namingContexts_ = std::move(contexts);
  base_ = namingContexts_[0];
  baseConfirmed_ = false;
  chooseBaseByProbing();
  rememberBase();
  return true;
}

// The first naming context whose groups container the session can see.
void LdapConnection::chooseBaseByProbing() {
  if (baseConfirmed_) return;
  if (namingContexts_.size() == 1) {
    baseConfirmed_ = true;
    return;
  }
  for (const std::string& context : namingContexts_) {
    LDAPMessage* result = nullptr;
    timeval timeout = operationTimeout();
    const std::string dn = "cn=groups," + context;
    const int rc = ldap_search_ext_s(ld_, dn.c_str(), LDAP_SCOPE_BASE, "(objectClass=*)",
                                     const_cast<char**>(kNoAttributes), 0, nullptr, nullptr,
                                     &timeout, 0, &result);
    ldap_msgfree(result);
    if (rc == LDAP_SUCCESS) {
      base_ = context;
      baseConfirmed_ = true;
      return;
    }
  }
}

int LdapConnection::simpleBind(const std::string& dn, const std::string& password) {
  berval credentials{static_cast<ber_len_t>(password.size()), const_cast<char*>(password.data())};
  return ldap_sasl_bind_s(ld_, dn.c_str(), LDAP_SASL_SIMPLE, &credentials, nullptr, nullptr,
                          nullptr);
}

// True when the server closed the kept connection since its last use (it
// stopped or restarted): its half of the connection is shut down.
bool LdapConnection::closedByServer() const {
  int fd = -1;
  if (ldap_get_option(ld_, LDAP_OPT_DESC, &fd) != LDAP_OPT_SUCCESS || fd < 0) return true;
  pollfd p{fd, POLLRDHUP, 0};
  return ::poll(&p, 1, 0) > 0 && (p.revents & (POLLRDHUP | POLLHUP | POLLERR | POLLNVAL)) != 0;
}

std::optional<Error> LdapConnection::ready() {
  if (ld_ != nullptr && closedByServer()) drop();
  if (ld_ != nullptr) return std::nullopt;
  if (auto e = connect()) return e;
  // The first connection takes the base from the Env's cache when it knows
  // the server. A later one (after a lost connection: the server may have
  // restarted with other contexts) reads the root DSE again.
  const bool first = namingContexts_.empty();
  if (!first || !takeCachedBase()) {
    std::vector<std::string> contexts;
    if (auto e = readNamingContexts(&contexts)) return e;
    if (!first && contexts != namingContexts_ &&
        std::find(contexts.begin(), contexts.end(), base_) == contexts.end()) {
      // The base is gone: choose again.
      env_.searchBaseCache().forget(serverKey_);
      base_.clear();
      baseConfirmed_ = false;
    }
    baseFromCache_ = false;
    namingContexts_ = std::move(contexts);
    if (base_.empty()) base_ = namingContexts_[0];
  }
  if (userName_) {
    if (auto e = startTlsIfRequired()) return e;
    const int rc = simpleBind(recordDn(RecordType::kUsers, *userName_), password_);
    if (rc != LDAP_SUCCESS) return error(rc);
  } else if (address_.scheme == LdapScheme::kLdapi && external_) {
    // The local superuser acts with the rights the server maps to it.
    const int rc = ldap_sasl_interactive_bind_s(ld_, nullptr, "EXTERNAL", nullptr, nullptr,
                                                LDAP_SASL_QUIET, noInteraction, nullptr);
    if (rc != LDAP_SUCCESS) return error(rc);
  }
  chooseBaseByProbing();
  if (first) rememberBase();
  return std::nullopt;
}

// Ends whatever identity the session had; a connection that cannot be made
// anonymous is dropped (the next operation connects anew, anonymously).
void LdapConnection::becomeAnonymous() {
  if (ld_ == nullptr) return;
  berval none{0, nullptr};
  if (ldap_sasl_bind_s(ld_, nullptr, LDAP_SASL_SIMPLE, &none, nullptr, nullptr, nullptr) !=
      LDAP_SUCCESS) {
    drop();
  }
}

std::optional<Error> LdapConnection::bindAsUser(const std::string& name,
                                                const std::string& password) {
  if (auto e = ready()) return e;
  if (auto e = startTlsIfRequired()) {
    becomeAnonymous();
    return e;
  }
  // The user lives under the first naming context that knows it.
  int rc = LDAP_INVALID_CREDENTIALS;
  for (const std::string& context : namingContexts_) {
    base_ = context;
    rc = simpleBind(recordDn(RecordType::kUsers, name), password);
    if (rc != LDAP_INVALID_CREDENTIALS) break;
  }
  if (rc == LDAP_SUCCESS) return std::nullopt;
  Error e = error(rc);
  base_ = namingContexts_.empty() ? std::string() : namingContexts_[0];
  becomeAnonymous();
  return e;
}

std::optional<Error> LdapConnection::setCredentials(const std::string& name,
                                                    const std::string& password) {
  // Whatever happens, the session is no longer the previous user's.
  userName_.reset();
  external_ = false;
  explicit_bzero(password_.data(), password_.size());
  password_.clear();
  // An empty password would make an unauthenticated bind, which succeeds
  // as anonymous: refuse it as a wrong password.
  if (password.empty()) {
    becomeAnonymous();
    return directoryError(LDAP_INVALID_CREDENTIALS, "empty password");
  }
  std::optional<Error> e = bindAsUser(name, password);
  // A user not found under a cached base may live under the server's
  // current one (the server was set up anew with another suffix).
  if (e && e->code() == LDAP_INVALID_CREDENTIALS && refreshStaleBase()) {
    e = bindAsUser(name, password);
  }
  if (e) return e;
  // The server accepted a DN under the base: it is the server's own.
  baseFromCache_ = false;
  baseConfirmed_ = true;
  userName_ = name;
  password_ = password;
  return std::nullopt;
}

}  // namespace kolt
