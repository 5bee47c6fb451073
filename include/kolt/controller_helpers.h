// Controller and address helpers (redaction only, until the helpers land).
#ifndef KOLT_CONTROLLER_HELPERS_H
#define KOLT_CONTROLLER_HELPERS_H

#include "kolt/export.h"
#include "kolt/plist.h"

namespace kolt {

// A copy of a local document or a Vorn configuration in which "sharedSecret"
// (at the top and in "globals") reads "********". The argument is unchanged.
KOLT_EXPORT Value redactVornSecrets(const Value& document);

}  // namespace kolt

#endif  // KOLT_CONTROLLER_HELPERS_H
