// The search service's settings of a local document, reduced to flags and a
// hash so that the change check can tell whether they changed.
#ifndef KOLT_VOLUMES_QUERIX_FLAGS_H
#define KOLT_VOLUMES_QUERIX_FLAGS_H

#include <cstdint>

#include "kolt/plist.h"

namespace kolt {

inline constexpr int kQuerixServerEnabled = 1;  // "enableQuerixServer" is true
inline constexpr int kQuerixServerHasList = 2;  // ... and "querixServerVolumeList" is present

// Returns 0 when `config` is null or its "enableQuerixServer" is absent or
// false; 1 when enabled without a "querixServerVolumeList"; 3 when enabled
// with one, and then `*hash` is that list's hash (equal lists give equal
// hashes). `*hash` is 0 otherwise.
int querixServerFlagsForConfig(const Value* config, std::uint64_t* hash);

// A hash of a value consistent with Value equality: equal values (1 and 1.0
// included) give equal hashes.
std::uint64_t hashValue(const Value& value);

}  // namespace kolt

#endif  // KOLT_VOLUMES_QUERIX_FLAGS_H
