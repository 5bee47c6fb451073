// The name-server list: "/Library/Preferences/Vorn/fsnameservers", one IPv4
// address a line ("<address>\n"), in list order, and the same list as
// globals "fsnameservers". An entry is a plain address string or a
// dictionary {"addr": address, "uuid": controller UUID}.
#ifndef KOLT_VOLUMES_NAMESERVERS_H
#define KOLT_VOLUMES_NAMESERVERS_H

#include <string>
#include <string_view>

#include "kolt/plist.h"

namespace kolt {

inline constexpr const char* kFsnameserversPath = "/Library/Preferences/Vorn/fsnameservers";

// Parses the text of an fsnameservers file. Lines end at "\n" only; a line of
// six characters or fewer is skipped, as is a line that does not start with
// an address (inet_addr notation, see parseInetAddress). Each address is
// given in dotted-quad decimal form: as a string when `map` (address to
// controller UUID) is null, else as {"addr", "uuid"}, without "uuid" when the
// map lacks the address. Text that is not valid UTF-8 gives an empty list.
// Pure: touches nothing.
Array parseFsnameservers(std::string_view text, const Dictionary* map);

// The file text of a list: each string entry, and each dictionary entry's
// string "addr", followed by "\n". Other entries, and text holding a line
// feed (it would split into two lines), contribute nothing.
std::string formatFsnameservers(const Array& list);

// Reads the file (parseFsnameservers); a missing or unreadable file gives an
// empty list.
Array read_fsnameservers(const Dictionary* map);

// Writes formatFsnameservers(list) to the file atomically (mode 0644), even
// when empty. Returns whether it was written; the old file stays otherwise.
bool write_fsnameservers(const Array& list);

// The list in address-only form: a dictionary's string "addr", a string as it
// is; other entries are dropped.
Array fsnameservers_without_uuids(const Array& list);

}  // namespace kolt

#endif  // KOLT_VOLUMES_NAMESERVERS_H
