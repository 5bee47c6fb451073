// kolt's own trust store: the CA certificates that a member trusts for its
// controllers' directories, beside the system's trust store.
#ifndef KOLT_PLATFORM_DIRECTORY_TRUST_STORE_H
#define KOLT_PLATFORM_DIRECTORY_TRUST_STORE_H

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kolt/env.h"
#include "kolt/error.h"

namespace kolt {

// The trust store: a directory (a system path, so below the Env's root) of
// PEM files, one certificate each, named "<SHA-256 of the DER, hex>.pem".
inline constexpr std::string_view kTrustStoreDirectory = "/var/db/kolt/trust";

// The system's trust store, a host path (not mapped below any root).
inline constexpr std::string_view kSystemTrustBundle = "/etc/ssl/certs/ca-certificates.crt";

// Adds PEM-encoded certificates to the trust store (atomically, mode 0644;
// one already present is rewritten unchanged). POSIX-domain error when a
// file cannot be written; directory-domain -9 when a text is no certificate.
std::optional<Error> addTrustedCertificates(Env& env, const std::vector<std::string>& pems);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_TRUST_STORE_H
