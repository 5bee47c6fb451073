// This controller's address on the SAN's metadata network.
#ifndef KOLT_SYNC_METADATA_ADDRESS_H
#define KOLT_SYNC_METADATA_ADDRESS_H

#include <optional>
#include <string>

#include "kolt/env.h"

namespace kolt {

// The first IPv4 address of a non-loopback interface inside `network` ("an
// IPv4 address/prefix length", e.g. "10.1.0.0/16"), in dotted form. Nothing
// when the text has no "/", the prefix is 0 or not a number, the interfaces
// cannot be listed, or no address matches. Prefixes above 32 mean 32. Writes
// "Found metadata IP '%s'\n" to standard error when the interfaces were
// searched.
std::optional<std::string> metadataAddressForNetwork(Env& env, const std::string& network);

}  // namespace kolt

#endif  // KOLT_SYNC_METADATA_ADDRESS_H
