// The SAN's records in the directory: a group record holding the whole Vorn
// configuration as an XML property list, and a user record (the SAN's
// directory user) whose password is the shared secret.
//
// Every operation works on a node that the caller opened and, where needed,
// authenticated. Flag statuses are 0 on success and 1 on failure. Error slots
// are written only when given; directory errors are passed on unchanged.
#ifndef KOLT_DIRECTORY_RECORDS_H
#define KOLT_DIRECTORY_RECORDS_H

#include <optional>
#include <string>
#include <string_view>

#include "kolt/directory.h"
#include "kolt/error.h"
#include "kolt/export.h"
#include "kolt/plist.h"

namespace kolt {

// The SAN name escaped for record names: every byte that is not an ASCII
// letter, digit or one of - . ~ ! $ & ' ( ) * + , ; = : [ ] becomes "_" and
// two upper-case hexadecimal digits ("_" itself becomes "_5F").
// "My SAN" -> "My_20SAN", "é" -> "_C3_A9".
KOLT_EXPORT std::string ldapSanNameForName(std::string_view sanName);
// "com.orvat.vorn.conf." + the escaped name: the configuration group record.
KOLT_EXPORT std::string ldapSanConfNameForName(std::string_view sanName);
// "com.orvat.vorn.auth." + the escaped name: the SAN's directory user.
KOLT_EXPORT std::string ldapSanUserNameForName(std::string_view sanName);
// "com.orvat.vorn.access." + the escaped name: an access group name for
// callers; kolt neither creates nor reads it.
KOLT_EXPORT std::string ldapSanAccessNameForName(std::string_view sanName);

// A new Vorn configuration: {"globals": {"revision": zero UUID,
// "certSetRevision": zero UUID, "controllers": {}}, "volumes": {}}.
KOLT_EXPORT Value newVornConfig();

// The stored configuration of the SAN `sanName` (null: absent). Nothing, with
// 501 "No existing configuration" when there is no name or no record, POSIX 22
// with the parser's text when the stored text is empty, unreadable or not a
// dictionary, or the directory's error when the look-up fails.
KOLT_EXPORT std::optional<Value> getVornConfig(DirectoryNode& node, const std::string* sanName,
                                               ErrorSlot* error);
// getVornConfig with the "sanName" of a local document.
KOLT_EXPORT std::optional<Value> getVornConfigForConfig(DirectoryNode& node, const Value& document,
                                                        ErrorSlot* error);

// Creates both records for a new configuration whose globals hold only the
// zero revisions, an empty controller table and "sharedSecret" (left out
// when `sharedSecret` is null). Records created before a failure stay; a
// later culVornConfig removes them. 1 without an error when the name is
// absent or empty.
KOLT_EXPORT int createNewVornConfig(DirectoryNode& node, const std::string* sanName,
                                    const std::string* sharedSecret, ErrorSlot* error);
// createNewVornConfig with the document's "sanName".
KOLT_EXPORT int createNewVornConfigForConfig(DirectoryNode& node, const Value& document,
                                             const std::string* sharedSecret, ErrorSlot* error);

// Rewrites the stored configuration. With `newRevision` the configuration's
// globals first get a fresh upper-case "revision" (changed in the caller's
// value). A null `sanName` means the "sanName" of the globals. 501 and 1 when
// no record exists (nothing is created). On success the slot is cleared.
KOLT_EXPORT int saveVornConfig(DirectoryNode& node, Value& configuration, const std::string* sanName,
                               bool newRevision, ErrorSlot* error);

// Marks the stored configuration dead: no volumes, no controllers, no name
// servers, "sanState" "dead", "primaryZombie" the first controller's host
// UUID; saved with a fresh revision. 1 without an error when the name is
// absent or empty.
KOLT_EXPORT int destroyVornConfig(DirectoryNode& node, const std::string* sanName, ErrorSlot* error);

// Removes both records. The first failure is reported (501 when a record is
// missing); the group record is deleted even when the user record is missing.
KOLT_EXPORT int culVornConfig(DirectoryNode& node, const std::string* sanName, ErrorSlot* error);

// The save (create = false) or creation (create = true) step behind
// saveVornConfig and createNewVornConfig.
int doCreateOrSaveConfig(DirectoryNode& node, const Value& configuration, const std::string* sanName,
                         bool create, ErrorSlot* error);
// Deletes the record named `recordName` (a group when `isGroup`); 501 when
// there is none. Returns whether it was deleted.
bool findAndZap(DirectoryNode& node, const std::string& recordName, bool isGroup, ErrorSlot* error);

}  // namespace kolt

#endif  // KOLT_DIRECTORY_RECORDS_H
