#include "platform/directory/server_certificates.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <lber.h>
#include <ldap.h>
#include <netdb.h>
#include <netinet/in.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <openssl/ssl.h>
#include <openssl/x509v3.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "platform/directory/directory_error.h"

namespace kolt {
namespace {

class Socket {
 public:
  explicit Socket(int fd) : fd_(fd) {}
  ~Socket() {
    if (fd_ >= 0) ::close(fd_);
  }
  int fd() const { return fd_; }

 private:
  int fd_;
};

std::string where(const NodeAddress& a) {
  return a.host + ":" + std::to_string(a.port);
}

// A connected TCP socket with send and receive time-outs, or -1.
int connectWithTimeout(const NodeAddress& address, int timeoutSeconds, std::string* why) {
  addrinfo hints{};
  hints.ai_family = AF_UNSPEC;
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* list = nullptr;
  const std::string port = std::to_string(address.port);
  if (const int rc = ::getaddrinfo(address.host.c_str(), port.c_str(), &hints, &list); rc != 0) {
    *why = gai_strerror(rc);
    return -1;
  }
  int result = -1;
  for (addrinfo* ai = list; ai != nullptr && result < 0; ai = ai->ai_next) {
    const int fd =
        ::socket(ai->ai_family, ai->ai_socktype | SOCK_CLOEXEC | SOCK_NONBLOCK, ai->ai_protocol);
    if (fd < 0) continue;
    int rc = ::connect(fd, ai->ai_addr, ai->ai_addrlen);
    if (rc != 0 && errno == EINPROGRESS) {
      pollfd p{fd, POLLOUT, 0};
      rc = ::poll(&p, 1, timeoutSeconds * 1000);
      int soError = 0;
      socklen_t len = sizeof soError;
      if (rc == 1 && ::getsockopt(fd, SOL_SOCKET, SO_ERROR, &soError, &len) == 0 && soError == 0) {
        rc = 0;
      } else {
        errno = rc == 0 ? ETIMEDOUT : (soError != 0 ? soError : errno);
        rc = -1;
      }
    }
    if (rc != 0) {
      *why = std::strerror(errno);
      ::close(fd);
      continue;
    }
    ::fcntl(fd, F_SETFL, ::fcntl(fd, F_GETFL) & ~O_NONBLOCK);
    timeval tv{timeoutSeconds, 0};
    ::setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
    ::setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
    result = fd;
  }
  ::freeaddrinfo(list);
  return result;
}

bool readExactly(int fd, unsigned char* buffer, std::size_t length) {
  while (length > 0) {
    const ssize_t n = ::read(fd, buffer, length);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    buffer += n;
    length -= static_cast<std::size_t>(n);
  }
  return true;
}

// Sends the StartTLS extended request and reads its response; the result
// code of the response, or a client code.
int startTls(int fd, std::string* diagnostic) {
  std::unique_ptr<BerElement, void (*)(BerElement*)> request(ber_alloc_t(LBER_USE_DER),
                                                             [](BerElement* b) { ber_free(b, 1); });
  if (!request || ber_printf(request.get(), "{it{ts}}", 1, LDAP_REQ_EXTENDED, LDAP_TAG_EXOP_REQ_OID,
                             LDAP_EXOP_START_TLS) < 0) {
    return LDAP_ENCODING_ERROR;
  }
  berval* flat = nullptr;
  if (ber_flatten(request.get(), &flat) != 0) return LDAP_ENCODING_ERROR;
  const std::string bytes(flat->bv_val, flat->bv_len);
  ber_bvfree(flat);
  if (::send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(bytes.size())) {
    return LDAP_SERVER_DOWN;
  }
  // The response: an LDAPMessage SEQUENCE; read its header, then its body.
  unsigned char header[2];
  if (!readExactly(fd, header, 2) || header[0] != 0x30) return LDAP_DECODING_ERROR;
  std::size_t length = header[1];
  if (length & 0x80) {
    const std::size_t count = length & 0x7f;
    if (count == 0 || count > 4) return LDAP_DECODING_ERROR;
    unsigned char lengthBytes[4];
    if (!readExactly(fd, lengthBytes, count)) return LDAP_DECODING_ERROR;
    length = 0;
    for (std::size_t i = 0; i < count; ++i) length = (length << 8) | lengthBytes[i];
  }
  if (length > 65536) return LDAP_DECODING_ERROR;
  std::string body(length, '\0');
  if (!readExactly(fd, reinterpret_cast<unsigned char*>(body.data()), length)) {
    return LDAP_DECODING_ERROR;
  }
  // Decode the body alone: msgid, then [APPLICATION 24] with the result.
  berval bv{static_cast<ber_len_t>(body.size()), body.data()};
  std::unique_ptr<BerElement, void (*)(BerElement*)> response(
      ber_init(&bv), [](BerElement* b) { ber_free(b, 1); });
  ber_int_t msgid = 0;
  ber_int_t resultCode = 0;
  ber_len_t elementLength = 0;
  char* matched = nullptr;
  char* text = nullptr;
  if (!response || ber_scanf(response.get(), "i", &msgid) == LBER_ERROR ||
      ber_peek_tag(response.get(), &elementLength) != LDAP_RES_EXTENDED ||
      ber_scanf(response.get(), "{eaa", &resultCode, &matched, &text) == LBER_ERROR) {
    ber_memfree(matched);
    ber_memfree(text);
    return LDAP_DECODING_ERROR;
  }
  if (text != nullptr) *diagnostic = text;
  ber_memfree(matched);
  ber_memfree(text);
  return resultCode;
}

std::string openSslErrors() {
  std::string text;
  while (const unsigned long e = ERR_get_error()) {
    char buffer[256];
    ERR_error_string_n(e, buffer, sizeof buffer);
    if (!text.empty()) text += "; ";
    text += buffer;
  }
  return text;
}

std::string toPem(X509* cert) {
  std::unique_ptr<BIO, decltype(&BIO_free)> bio(BIO_new(BIO_s_mem()), BIO_free);
  if (!bio || PEM_write_bio_X509(bio.get(), cert) != 1) return {};
  char* data = nullptr;
  const long size = BIO_get_mem_data(bio.get(), &data);
  return std::string(data, static_cast<std::size_t>(size));
}

}  // namespace

std::optional<Error> fetchServerCaCertificates(const NodeAddress& address, int timeoutSeconds,
                                               std::vector<std::string>* pems) {
  if (address.scheme == LdapScheme::kLdapi) {
    return directoryError(LDAP_NOT_SUPPORTED, "an ldapi node presents no certificate");
  }
  std::string why;
  Socket socket(connectWithTimeout(address, timeoutSeconds, &why));
  if (socket.fd() < 0) return directoryError(LDAP_SERVER_DOWN, where(address) + ": " + why);
  if (address.scheme == LdapScheme::kLdap) {
    std::string diagnostic;
    const int rc = startTls(socket.fd(), &diagnostic);
    if (rc != LDAP_SUCCESS) {
      return directoryError(
          rc, "StartTLS with " + where(address) + (diagnostic.empty() ? "" : ": " + diagnostic));
    }
  }
  std::unique_ptr<SSL_CTX, decltype(&SSL_CTX_free)> ctx(SSL_CTX_new(TLS_client_method()),
                                                        SSL_CTX_free);
  if (!ctx) return directoryError(LDAP_NO_MEMORY, openSslErrors());
  // Not verified on purpose: this is how the certificates become trusted.
  SSL_CTX_set_verify(ctx.get(), SSL_VERIFY_NONE, nullptr);
  std::unique_ptr<SSL, decltype(&SSL_free)> ssl(SSL_new(ctx.get()), SSL_free);
  if (!ssl || SSL_set_fd(ssl.get(), socket.fd()) != 1) {
    return directoryError(LDAP_CONNECT_ERROR, openSslErrors());
  }
  in6_addr ignored{};
  if (inet_pton(AF_INET, address.host.c_str(), &ignored) != 1 &&
      inet_pton(AF_INET6, address.host.c_str(), &ignored) != 1) {
    SSL_set_tlsext_host_name(ssl.get(), address.host.c_str());
  }
  if (SSL_connect(ssl.get()) != 1) {
    return directoryError(LDAP_CONNECT_ERROR,
                          "TLS handshake with " + where(address) + ": " + openSslErrors());
  }
  STACK_OF(X509)* chain = SSL_get_peer_cert_chain(ssl.get());
  for (int i = 0; chain != nullptr && i < sk_X509_num(chain); ++i) {
    X509* cert = sk_X509_value(chain, i);
    if (X509_check_ca(cert) >= 1) pems->push_back(toPem(cert));
  }
  if (pems->empty()) {
    std::unique_ptr<X509, decltype(&X509_free)> leaf(SSL_get1_peer_certificate(ssl.get()),
                                                     X509_free);
    if (leaf) pems->push_back(toPem(leaf.get()));
  }
  SSL_shutdown(ssl.get());
  if (pems->empty()) {
    return directoryError(LDAP_CONNECT_ERROR, where(address) + " presented no certificate");
  }
  return std::nullopt;
}

}  // namespace kolt
