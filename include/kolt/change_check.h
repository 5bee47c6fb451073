// The member-side change check: reads the SAN configuration that the
// controllers publish, and applies it to this machine's local document and
// side files when its revision differs from the one applied last. Also joins
// a machine to a SAN with a new configuration document.
#ifndef KOLT_CHANGE_CHECK_H
#define KOLT_CHANGE_CHECK_H

#include <cstdint>
#include <string>

#include "kolt/export.h"
#include "kolt/plist.h"

namespace kolt {

// Bits of the change mask.
enum ChangeMaskBit : std::uint32_t {
  kChangeApplied = 0x01,             // the published configuration was applied
  kChangeRole = 0x02,                // the role changed (not controller to client) or was unknown
  kChangeQuerixServer = 0x04,        // the search-service settings differ
  kChangeControllerToClient = 0x08,  // controller became client; the profile is being unloaded
  kChangeNewConfig = 0x40,           // a new configuration document was handed in
};

// checkSanConfigChangeWithServer without a server.
KOLT_EXPORT int checkSanConfigChange(std::uint32_t* changeMask, Value* newConfig);

// Runs the change check. `server` (null: none) is a directory server tried
// before all others, over ldaps. `changeMask` is required: it is set to 0 and
// then gets the bits of what happened. `newConfig` (null: none) is a new local
// document to join with; it is changed in place and saved.
//
// Returns 0 on success or when there is nothing to do; 14 without a mask;
// 504 "San name missing" (also for a local document that names directory
// URLs but no SAN); 505 "San server missing"; 502 "San name mismatch"; 22
// when config.plist could not be saved ("Error saving config.plist") or the
// stored configuration cannot be read; 500 when the SAN is dead and a
// newConfig was given; otherwise the directory's code (501 when there is no
// configuration record). Nothing local is written before the configuration
// was fetched. A published "volumes" that is not a dictionary touches no
// volume file. The shared secret is never saved in config.plist; it lives in
// ".auth_secret" (mode 0600).
//
// When the published revision equals the applied one ("sanRevision"), only
// the configuration's "globals" are read, and only they are logged ("Got
// config"); the rest of the stored configuration is not looked at.
KOLT_EXPORT int checkSanConfigChangeWithServer(const std::string* server, std::uint32_t* changeMask,
                                               Value* newConfig);

// Starts "vornctl unloadProfile" without waiting and logs
// "vornctl unloadProfile launched".
void startVornctlToUnloadProfile();

}  // namespace kolt

#endif  // KOLT_CHANGE_CHECK_H
