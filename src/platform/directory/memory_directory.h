// An in-memory directory with the observable behaviour of kolt's LDAP
// directory: the same node names, record layout, name matching, access rules
// and error codes (LDAP result codes in kDirectoryErrorDomain), plus fault
// injection. It serves fast tests and the demo; it is not a production store.
//
// A MemoryDirectory is the server: every node opened on it shares its
// records. It is thread-safe.
//
// Access rules (those of the example ACLs in schema/):
//   - anonymous sessions may only bind; they see no record, and every
//     write fails with 8 (strongerAuthRequired), as slapd answers;
//   - the administrator (a user named at construction) reads and writes all;
//   - an ldapi:// node without credentials is the local superuser, with the
//     administrator's rights (SASL EXTERNAL as root);
//   - any other user reads only the groups it is a member of, and writes
//     nothing (not even its own password);
//   - a record the session may not read looks absent.
// Record names match like LDAP's uid and cn: ASCII letters ignore case,
// leading and trailing blanks are insignificant, runs of blanks count as one.
// There is no transport: TLS, trust and the StartTLS rule are the LDAP
// client's alone (the custom call only records the server as trusted).
#ifndef KOLT_PLATFORM_DIRECTORY_MEMORY_DIRECTORY_H
#define KOLT_PLATFORM_DIRECTORY_MEMORY_DIRECTORY_H

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "kolt/directory.h"
#include "kolt/error.h"

namespace kolt {

// The operations a fault can be injected into.
enum class DirectoryOperation {
  kOpenNode,
  kSetCredentials,
  kQuery,
  kCreateRecord,
  kReadValues,  // DirectoryRecord::valuesForAttribute
  kSetValues,
  kSynchronize,
  kChangePassword,
  kAddMember,
  kDeleteRecord,
  kCustomCall,
};

class MemoryDirectory : public std::enable_shared_from_this<MemoryDirectory> {
 public:
  // A directory holding only its administrator, a user record named
  // `adminName` with `adminPassword`.
  static std::shared_ptr<MemoryDirectory> create(std::string adminName = "diradmin",
                                                 std::string adminPassword = "diradmin-secret");

  // Opens a node ("/LDAPv3/" + URL or host, parsed like the LDAP client).
  // The session starts anonymous, or as the local superuser on ldapi://.
  // Error -9 for a name that is no node; like the LDAP client, opening
  // contacts the server: -1 when it is unreachable (setReachable).
  std::unique_ptr<DirectoryNode> openNode(const std::string& nodeName, ErrorSlot* error);

  // --- Setting up, without access checks ------------------------------------
  // Adds a user; false when a record of that name exists.
  bool addUser(const std::string& name, const std::string& password,
               std::optional<std::string> fullName = std::nullopt);
  // Adds a group with its members (user names); false when it exists.
  bool addGroup(const std::string& name, std::optional<std::string> fullName,
                std::optional<std::string> xmlPlist, const std::vector<std::string>& members = {});
  const std::string& adminName() const { return adminName_; }
  const std::string& adminPassword() const { return adminPassword_; }

  // --- Looking inside, without access checks ----------------------------------
  bool hasRecord(RecordType type, const std::string& name) const;
  std::optional<std::string> xmlPlist(const std::string& groupName) const;
  std::optional<std::string> fullName(RecordType type, const std::string& name) const;
  // The members' user names as stored (empty when the group is absent).
  std::vector<std::string> members(const std::string& groupName) const;
  bool passwordMatches(const std::string& userName, const std::string& password) const;
  // Servers (serverKey form) whose certificates the custom call installed.
  std::set<std::string> trustedServers() const;
  std::size_t recordCount() const;

  // --- Faults ----------------------------------------------------------------
  // The `nth` next call of `operation` (1 = the next one) fails with `error`;
  // with `andLater`, every call from that one on fails.
  void failOperation(DirectoryOperation operation, std::size_t nth, Error error,
                     bool andLater = false);
  void clearFaults();
  // How many calls of `operation` were made (failed ones included).
  std::size_t callCount(DirectoryOperation operation) const;
  // Makes the server of `nodeName` unreachable (opening a node on it, and
  // every call on its open nodes, fails with -1 "Can't contact LDAP
  // server") or reachable again; open nodes then work again, as LDAP nodes
  // connect again.
  void setReachable(const std::string& nodeName, bool reachable);

  // The name as the directory compares it (see above).
  static std::string matchKey(const std::string& name);

  // Internal to the node and record implementations.
  struct Session;
  struct UserEntry {
    std::string name;
    std::vector<std::string> fullNames;
    std::string password;
  };
  struct GroupEntry {
    std::string name;
    std::optional<std::string> fullName;
    std::optional<std::string> xmlPlist;
    std::vector<std::string> members;  // user names as given
  };
  std::mutex& mutex() const { return mutex_; }
  // Counts the call and returns the error it must fail with, if any (also
  // when the session's server is unreachable). Call with mutex() held.
  std::optional<Error> enterLocked(DirectoryOperation operation, const Session* session);
  std::map<std::string, UserEntry>& usersLocked() { return users_; }
  std::map<std::string, GroupEntry>& groupsLocked() { return groups_; }
  void addTrustedServerLocked(std::string key) { trusted_.insert(std::move(key)); }
  bool isAdminLocked(const std::string& userKey) const { return userKey == matchKey(adminName_); }

 private:
  MemoryDirectory(std::string adminName, std::string adminPassword);

  struct Fault {
    DirectoryOperation operation;
    std::size_t atCall;  // the call count at which it fires
    Error error;
    bool andLater;
  };

  mutable std::mutex mutex_;
  std::string adminName_;
  std::string adminPassword_;
  std::map<std::string, UserEntry> users_;    // by matchKey
  std::map<std::string, GroupEntry> groups_;  // by matchKey
  std::set<std::string> trusted_;
  std::set<std::string> unreachable_;  // serverKey
  std::vector<Fault> faults_;
  std::map<DirectoryOperation, std::size_t> calls_;
};

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_MEMORY_DIRECTORY_H
