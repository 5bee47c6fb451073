#include "platform/directory/trust_store.h"

#include <ldap.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

#include <memory>

#include "platform/directory/directory_error.h"

namespace kolt {
namespace {

// The SHA-256 of the certificate's DER form, hex; nothing when `pem` holds
// no certificate.
std::optional<std::string> fingerprint(const std::string& pem) {
  std::unique_ptr<BIO, decltype(&BIO_free)> bio(
      BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())), BIO_free);
  if (!bio) return std::nullopt;
  std::unique_ptr<X509, decltype(&X509_free)> cert(
      PEM_read_bio_X509(bio.get(), nullptr, nullptr, nullptr), X509_free);
  if (!cert) return std::nullopt;
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  if (X509_digest(cert.get(), EVP_sha256(), digest, &length) != 1) return std::nullopt;
  static const char* kHex = "0123456789abcdef";
  std::string hex;
  for (unsigned int i = 0; i < length; ++i) {
    hex += kHex[digest[i] >> 4];
    hex += kHex[digest[i] & 15];
  }
  return hex;
}

}  // namespace

std::optional<Error> addTrustedCertificates(Env& env, const std::vector<std::string>& pems) {
  const std::string dir(kTrustStoreDirectory);
  if (const int rc = env.createDirectories(dir, 0755); rc != 0) {
    return Error::fromErrno(rc, "cannot create the trust store " + dir);
  }
  for (const std::string& pem : pems) {
    const std::optional<std::string> name = fingerprint(pem);
    if (!name) return directoryError(LDAP_PARAM_ERROR, "not a PEM certificate");
    const std::string path = dir + "/" + *name + ".pem";
    if (const int rc = writeFileAtomically(env, path, pem, 0644); rc != 0) {
      return Error::fromErrno(rc, "cannot write " + path);
    }
  }
  return std::nullopt;
}

}  // namespace kolt
