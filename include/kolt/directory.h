// The directory service: nodes, credentials, record queries, record creation,
// attribute values, passwords, group membership and deletion.
//
// kolt publishes the SAN's configuration in a directory. On Linux the node is
// an LDAP server (see docs/directory.md for the mapping); an in-memory
// directory with the same behaviour serves fault-injection tests. Every
// operation that fails returns null / nothing / false and stores an error of
// the directory's domain (kDirectoryErrorDomain; codes are LDAP result codes)
// in the error slot when one is given. Callers pass those errors on unchanged.
#ifndef KOLT_DIRECTORY_H
#define KOLT_DIRECTORY_H

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kolt/error.h"
#include "kolt/export.h"

namespace kolt {

// Record types.
enum class RecordType {
  kUsers,   // "dsRecTypeStandard:Users": an LDAP inetOrgPerson under cn=users
  kGroups,  // "dsRecTypeStandard:Groups": our group class under cn=groups
};

// The record type name that credentials are set with.
inline constexpr std::string_view kRecordTypeUsers = "dsRecTypeStandard:Users";

// Attribute types that kolt reads and writes.
enum class Attribute {
  kRecordName,  // the record's name (uid / cn)
  kFullName,    // the record's full name (cn of a user / displayName of a group)
  kXMLPlist,    // the configuration text, stored byte for byte
};

// The custom call that installs a node's server certificates as trusted.
inline constexpr int kCustomCallClientAddCACerts = 98000;

class KOLT_EXPORT DirectoryRecord {
 public:
  virtual ~DirectoryRecord();

  virtual RecordType recordType() const = 0;
  virtual const std::string& recordName() const = 0;

  // The values of `attribute` as the record holds them (fetched by the query
  // or set since). The views stay valid until the record is changed or
  // destroyed. An attribute without values gives an empty vector.
  virtual std::optional<std::vector<std::string_view>> valuesForAttribute(Attribute attribute,
                                                                           ErrorSlot* error) = 0;
  // Replaces the attribute's values in the directory.
  virtual bool setValues(Attribute attribute, const std::vector<std::string>& values,
                         ErrorSlot* error) = 0;
  // Stores pending changes (a no-op when every change was stored at once).
  virtual bool synchronize(ErrorSlot* error) = 0;
  // Sets a user's password, without the old one when it is absent.
  virtual bool changePassword(const std::optional<std::string>& oldPassword,
                              const std::string& newPassword, ErrorSlot* error) = 0;
  // Makes `member` (a user record of the same node) a member of this group.
  virtual bool addMemberRecord(const DirectoryRecord& member, ErrorSlot* error) = 0;
  // Removes the record from the directory.
  virtual bool deleteRecord(ErrorSlot* error) = 0;
};

class KOLT_EXPORT DirectoryNode {
 public:
  virtual ~DirectoryNode();

  // The node's name as opened ("/LDAPv3/...").
  virtual const std::string& nodeName() const = 0;

  // Authenticates as the user record `recordName` (record type
  // "dsRecTypeStandard:Users"); later operations carry that user's rights.
  virtual bool setCredentials(std::string_view recordType, const std::string& recordName,
                              const std::string& password, ErrorSlot* error) = 0;

  // Records of `type` whose record name equals `recordName` exactly, with
  // `returnAttribute` fetched, at most `maxResults`, partial results refused.
  virtual std::optional<std::vector<std::unique_ptr<DirectoryRecord>>> queryRecords(
      RecordType type, const std::string& recordName, Attribute returnAttribute,
      std::size_t maxResults, ErrorSlot* error) = 0;

  // Creates a record with the given attributes (each an array of values).
  virtual std::unique_ptr<DirectoryRecord> createRecord(
      RecordType type, const std::string& recordName,
      const std::map<Attribute, std::vector<std::string>>& attributes, ErrorSlot* error) = 0;

  // A custom call without data (kCustomCallClientAddCACerts).
  virtual bool customCall(int code, ErrorSlot* error) = 0;
};

}  // namespace kolt

#endif  // KOLT_DIRECTORY_H
