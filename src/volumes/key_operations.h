// The key operations: single keys of a dictionary tied to each other and to
// the single-value files of "/Library/Preferences/Vorn/" (".auth_secret",
// "fsports"). The changed flag collects bit value 1 whenever a key changes.
#ifndef KOLT_VOLUMES_KEY_OPERATIONS_H
#define KOLT_VOLUMES_KEY_OPERATIONS_H

#include <sys/types.h>

#include <cstdint>
#include <string>

#include "kolt/plist.h"

namespace kolt {

// Bit value of the changed flag that the key operations set.
inline constexpr std::uint8_t kKeyChanged = 1;

// Makes destination[key] equal source[key]: stores the source's value when it
// differs, removes the key when the source lacks it; either sets kKeyChanged.
// Equal values (or both absent) change nothing. `changed` may be null.
void copyValue(Dictionary* destination, const Dictionary& source, const std::string& key,
               std::uint8_t* changed);

// Makes dictionary[key] the text of the file `fileName` (read_vorn_cfg_file):
// sets it, or removes it when there is no file, and sets kKeyChanged; equal
// text (or both absent) changes nothing. `changed` may be null.
void update_from_file(Dictionary* dictionary, const std::string& fileName, const std::string& key,
                      std::uint8_t* changed);

// Makes the file "/Library/Preferences/Vorn/<fileName>" hold dictionary[key]
// (a string): an unequal text is written atomically in a file created with
// `mode` from its first byte (callers pass 0644, or 0600 for the secret); an
// absent key removes the file. An equal file is not rewritten, but a mode
// that grants more than `mode` is narrowed. A value that is not a string
// leaves the file alone. Failures are ignored.
void update_from_config(const Dictionary& dictionary, const std::string& fileName,
                        const std::string& key, mode_t mode);

}  // namespace kolt

#endif  // KOLT_VOLUMES_KEY_OPERATIONS_H
