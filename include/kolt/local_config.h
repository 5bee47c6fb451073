// The local configuration document ("/Library/Preferences/Vorn/config.plist")
// and this machine's identity.
#ifndef KOLT_LOCAL_CONFIG_H
#define KOLT_LOCAL_CONFIG_H

#include <optional>
#include <string>

#include "kolt/export.h"
#include "kolt/plist.h"

namespace kolt {

// The fixed location of the local document.
inline constexpr const char* kConfigPlistPath = "/Library/Preferences/Vorn/config.plist";
// The directory of every configuration file.
inline constexpr const char* kVornDirectory = "/Library/Preferences/Vorn/";
// The zero UUID: the revision of a new configuration.
inline constexpr const char* kZeroUUID = "00000000-0000-0000-0000-000000000000";

// Loads the local document (XML or binary property list). Returns the
// dictionary, or nothing when the file is missing, unreadable or not a
// dictionary; errno then tells why (ENOENT, EACCES, or EINVAL for content
// that is not a dictionary document).
KOLT_EXPORT std::optional<Value> loadConfigPlist();

// Writes `document` whole, as an XML property list (format 1.0), atomically
// and durably: a reader sees the old document or the new one, never a torn,
// empty or missing file. The file gets mode 0644, or 0600 when the document
// holds "sharedSecret". Returns false when it was not written; the old file
// then stays in place.
KOLT_EXPORT bool saveConfigPlist(const Value& document);

// True when the document's "role" is exactly "CONTROLLER".
KOLT_EXPORT bool configPlistIsController(const Value& document);
// Always false.
KOLT_EXPORT bool configPlistIsMaster(const Value& document);
// True when "needsActivation" is true, or "primaryZombie" equals the host
// UUID ignoring case.
KOLT_EXPORT bool configPlistIsZombie(const Value& document);

// Fills the host-UUID cache if it is empty: the hardware UUID as 36 upper-case
// characters (8-4-4-4-12). When the platform cannot tell, the failure is
// logged ("fillInOurUUID returned error %d") and the cache holds the zero
// UUID. Safe to call from several threads; the platform is asked once.
KOLT_EXPORT void fillInOurUUID();
// The host UUID. The string belongs to the cache; it lives as long as the
// current Env.
KOLT_EXPORT const std::string& getOurUUID();

}  // namespace kolt

#endif  // KOLT_LOCAL_CONFIG_H
