// Fetching the certificates a directory server presents, without verifying
// them: what the custom call kCustomCallClientAddCACerts installs as trusted.
#ifndef KOLT_PLATFORM_DIRECTORY_SERVER_CERTIFICATES_H
#define KOLT_PLATFORM_DIRECTORY_SERVER_CERTIFICATES_H

#include <optional>
#include <string>
#include <vector>

#include "kolt/error.h"
#include "platform/directory/node_address.h"

namespace kolt {

// Connects to the server of `address` over TLS (ldaps, or StartTLS on
// ldap://) WITHOUT verifying it, and returns, PEM-encoded, the CA
// certificates of the chain it presents; the server's own certificate when
// the chain holds no CA certificate (a self-signed server). Not for ldapi
// (-12). Errors: -1 when the server cannot be reached, the server's result
// code when it refuses StartTLS, -11 when the TLS handshake fails. Waits at
// most `timeoutSeconds` for each network step.
std::optional<Error> fetchServerCaCertificates(const NodeAddress& address, int timeoutSeconds,
                                               std::vector<std::string>* pems);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_SERVER_CERTIFICATES_H
