// The apply step of the change check: copies the published settings into the
// working document, rewrites the side files, decides the role, applies the
// volumes and saves.
#ifndef KOLT_SYNC_CHANGE_APPLY_H
#define KOLT_SYNC_CHANGE_APPLY_H

#include <cstdint>

#include "kolt/plist.h"

namespace kolt {

struct ApplyContext {
  Value* newConfig = nullptr;  // the handed-in document, or null
  Value* loaded = nullptr;     // config.plist as loaded, or null
  Value* working = nullptr;    // newConfig, else loaded
  Value* globals = nullptr;    // the fetched globals (may be the working document itself)
  const Value* volumes = nullptr;  // the fetched "volumes", or null
  bool usedNode = false;       // the configuration came from a directory node
  std::uint32_t* changeMask = nullptr;
};

// Applies the fetched configuration; returns the check's result code.
int applyConfiguration(const ApplyContext& context);

// The revision is unchanged but a new document was handed in: it takes the
// loaded document's role, its secret goes to ".auth_secret", and it is saved.
// Returns 0.
int saveUnchangedJoin(const ApplyContext& context);

}  // namespace kolt

#endif  // KOLT_SYNC_CHANGE_APPLY_H
