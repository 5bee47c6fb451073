#include "platform/directory/memory_directory.h"

#include <ldap.h>

#include <algorithm>
#include <utility>

#include "platform/directory/directory_error.h"
#include "platform/directory/new_record_values.h"
#include "platform/directory/node_address.h"

namespace kolt {

struct MemoryDirectory::Session {
  enum class Identity { kAnonymous, kSuperuser, kUser };
  NodeAddress address;
  std::string nodeName;
  Identity identity = Identity::kAnonymous;
  std::string userKey;  // matchKey of the bound user
};

namespace {

using Session = MemoryDirectory::Session;

bool canWrite(MemoryDirectory& dir, const Session& s) {
  return s.identity == Session::Identity::kSuperuser ||
         (s.identity == Session::Identity::kUser && dir.isAdminLocked(s.userKey));
}

bool canReadGroup(MemoryDirectory& dir, const Session& s, const MemoryDirectory::GroupEntry& g) {
  if (canWrite(dir, s)) return true;
  if (s.identity != Session::Identity::kUser) return false;
  return std::any_of(g.members.begin(), g.members.end(), [&](const std::string& m) {
    return MemoryDirectory::matchKey(m) == s.userKey;
  });
}

// The values a stored entry holds for `attribute`; nothing when the record
// type cannot hold it.
std::optional<std::vector<std::string>> entryValues(RecordType type, const void* entry,
                                                    Attribute attribute) {
  if (type == RecordType::kUsers) {
    const auto& u = *static_cast<const MemoryDirectory::UserEntry*>(entry);
    switch (attribute) {
      case Attribute::kRecordName:
        return std::vector<std::string>{u.name};
      case Attribute::kFullName:
        return u.fullNames;
      case Attribute::kXMLPlist:
        return std::vector<std::string>{};
    }
  }
  const auto& g = *static_cast<const MemoryDirectory::GroupEntry*>(entry);
  std::vector<std::string> out;
  switch (attribute) {
    case Attribute::kRecordName:
      out.push_back(g.name);
      break;
    case Attribute::kFullName:
      if (g.fullName) out.push_back(*g.fullName);
      break;
    case Attribute::kXMLPlist:
      if (g.xmlPlist) out.push_back(*g.xmlPlist);
      break;
  }
  return out;
}

// Checks values written to `attribute` of a `type` record like the LDAP
// schema does: 65 for an attribute the class does not allow or a missing
// mandatory one, 19 for several values of a single-valued one.
std::optional<Error> checkValues(RecordType type, Attribute attribute,
                                 const std::vector<std::string>& values) {
  if (attribute == Attribute::kRecordName) {
    return directoryError(LDAP_NOT_SUPPORTED, "the record name cannot be changed");
  }
  if (type == RecordType::kUsers && attribute == Attribute::kXMLPlist && !values.empty()) {
    return directoryError(LDAP_OBJECT_CLASS_VIOLATION, "attribute not allowed");
  }
  if (type == RecordType::kUsers && attribute == Attribute::kFullName && values.empty()) {
    return directoryError(LDAP_OBJECT_CLASS_VIOLATION, "object class requires the full name");
  }
  if (type == RecordType::kGroups && values.size() > 1) {
    return directoryError(LDAP_CONSTRAINT_VIOLATION, "attribute is single-valued");
  }
  return std::nullopt;
}

class MemoryRecord final : public DirectoryRecord {
 public:
  MemoryRecord(std::shared_ptr<MemoryDirectory> dir, std::shared_ptr<Session> session,
               RecordType type, std::string name)
      : dir_(std::move(dir)), session_(std::move(session)), type_(type), name_(std::move(name)) {}

  void cache(Attribute attribute, std::vector<std::string> values) {
    cache_[attribute] = std::move(values);
  }

  RecordType recordType() const override { return type_; }
  const std::string& recordName() const override { return name_; }

  std::optional<std::vector<std::string_view>> valuesForAttribute(Attribute attribute,
                                                                  ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kReadValues, session_.get())) {
      return failWithNothing(error, std::move(*e));
    }
    auto cached = cache_.find(attribute);
    if (cached == cache_.end()) {
      const void* entry = readableEntryLocked();
      if (entry == nullptr) return failWithNothing(error, directoryError(LDAP_NO_SUCH_OBJECT));
      cached = cache_.emplace(attribute, *entryValues(type_, entry, attribute)).first;
    }
    return std::vector<std::string_view>(cached->second.begin(), cached->second.end());
  }

  bool setValues(Attribute attribute, const std::vector<std::string>& values,
                 ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kSetValues, session_.get())) {
      return failWithFalse(error, std::move(*e));
    }
    if (auto e = checkValues(type_, attribute, values)) return failWithFalse(error, std::move(*e));
    if (auto e = writableLocked()) return failWithFalse(error, std::move(*e));
    const std::string key = MemoryDirectory::matchKey(name_);
    if (type_ == RecordType::kUsers) {
      dir_->usersLocked().at(key).fullNames = values;
    } else {
      auto& g = dir_->groupsLocked().at(key);
      std::optional<std::string> value;
      if (!values.empty()) value = values[0];
      (attribute == Attribute::kFullName ? g.fullName : g.xmlPlist) = std::move(value);
    }
    cache_[attribute] = values;
    return true;
  }

  bool synchronize(ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kSynchronize, session_.get())) {
      return failWithFalse(error, std::move(*e));
    }
    return true;  // every change is stored at once
  }

  bool changePassword(const std::optional<std::string>& oldPassword, const std::string& newPassword,
                      ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kChangePassword, session_.get())) {
      return failWithFalse(error, std::move(*e));
    }
    if (type_ != RecordType::kUsers) {
      return failWithFalse(error, directoryError(LDAP_NOT_SUPPORTED, "only users have passwords"));
    }
    if (newPassword.empty()) {
      return failWithFalse(error, directoryError(LDAP_PARAM_ERROR, "an empty password is refused"));
    }
    if (auto e = writableLocked()) return failWithFalse(error, std::move(*e));
    auto& user = dir_->usersLocked().at(MemoryDirectory::matchKey(name_));
    if (oldPassword && *oldPassword != user.password) {
      return failWithFalse(error, directoryError(LDAP_UNWILLING_TO_PERFORM, "old password mismatch"));
    }
    user.password = newPassword;
    return true;
  }

  bool addMemberRecord(const DirectoryRecord& member, ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kAddMember, session_.get())) {
      return failWithFalse(error, std::move(*e));
    }
    const auto* user = dynamic_cast<const MemoryRecord*>(&member);
    if (type_ != RecordType::kGroups || user == nullptr || user->type_ != RecordType::kUsers ||
        user->dir_ != dir_) {
      return failWithFalse(error, directoryError(LDAP_PARAM_ERROR, "a group takes user records"));
    }
    if (auto e = writableLocked()) return failWithFalse(error, std::move(*e));
    auto& members = dir_->groupsLocked().at(MemoryDirectory::matchKey(name_)).members;
    const std::string key = MemoryDirectory::matchKey(user->name_);
    const bool present = std::any_of(members.begin(), members.end(), [&](const std::string& m) {
      return MemoryDirectory::matchKey(m) == key;
    });
    if (!present) members.push_back(user->name_);
    return true;
  }

  bool deleteRecord(ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kDeleteRecord, session_.get())) {
      return failWithFalse(error, std::move(*e));
    }
    if (auto e = writableLocked()) return failWithFalse(error, std::move(*e));
    const std::string key = MemoryDirectory::matchKey(name_);
    if (type_ == RecordType::kUsers) {
      dir_->usersLocked().erase(key);
    } else {
      dir_->groupsLocked().erase(key);
    }
    return true;
  }

 private:

  // The stored entry when the session may read it, else null.
  const void* readableEntryLocked() {
    const std::string key = MemoryDirectory::matchKey(name_);
    if (type_ == RecordType::kUsers) {
      auto it = dir_->usersLocked().find(key);
      if (it == dir_->usersLocked().end() || !canWrite(*dir_, *session_)) return nullptr;
      return &it->second;
    }
    auto it = dir_->groupsLocked().find(key);
    if (it == dir_->groupsLocked().end() || !canReadGroup(*dir_, *session_, it->second)) {
      return nullptr;
    }
    return &it->second;
  }

  // Why the session may not write the record, if it may not.
  std::optional<Error> writableLocked() {
    const bool readable = readableEntryLocked() != nullptr;
    if (session_->identity == Session::Identity::kAnonymous) {
      return directoryError(LDAP_STRONG_AUTH_REQUIRED, "modifications require authentication");
    }
    if (!canWrite(*dir_, *session_)) {
      return directoryError(LDAP_INSUFFICIENT_ACCESS, "no write access");
    }
    if (!readable) return directoryError(LDAP_NO_SUCH_OBJECT);
    return std::nullopt;
  }

  std::shared_ptr<MemoryDirectory> dir_;
  std::shared_ptr<Session> session_;
  RecordType type_;
  std::string name_;
  std::map<Attribute, std::vector<std::string>> cache_;
};

class MemoryNode final : public DirectoryNode {
 public:
  MemoryNode(std::shared_ptr<MemoryDirectory> dir, std::shared_ptr<Session> session)
      : dir_(std::move(dir)), session_(std::move(session)) {}

  const std::string& nodeName() const override { return session_->nodeName; }

  bool setCredentials(std::string_view recordType, const std::string& recordName,
                      const std::string& password, ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kSetCredentials, session_.get())) {
      setError(error, std::move(*e));
      return false;
    }
    // A failed bind leaves the session anonymous, as on an LDAP connection.
    session_->identity = Session::Identity::kAnonymous;
    session_->userKey.clear();
    if (recordType != kRecordTypeUsers) {
      setError(error, directoryError(LDAP_PARAM_ERROR, "credentials are those of a user"));
      return false;
    }
    const std::string key = MemoryDirectory::matchKey(recordName);
    auto it = dir_->usersLocked().find(key);
    // An empty password would be an unauthenticated bind: refused.
    if (password.empty() || it == dir_->usersLocked().end() || it->second.password != password) {
      setError(error, directoryError(LDAP_INVALID_CREDENTIALS));
      return false;
    }
    session_->identity = Session::Identity::kUser;
    session_->userKey = key;
    return true;
  }

  std::optional<std::vector<std::unique_ptr<DirectoryRecord>>> queryRecords(
      RecordType type, const std::string& recordName, Attribute returnAttribute,
      std::size_t /*maxResults*/, ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kQuery, session_.get())) {
      setError(error, std::move(*e));
      return std::nullopt;
    }
    // Names are unique under matching, so at most one record matches and
    // the result is never partial.
    std::vector<std::unique_ptr<DirectoryRecord>> results;
    const std::string key = MemoryDirectory::matchKey(recordName);
    const void* entry = nullptr;
    std::string storedName;
    if (type == RecordType::kUsers) {
      auto it = dir_->usersLocked().find(key);
      if (it != dir_->usersLocked().end() && canWrite(*dir_, *session_)) {
        entry = &it->second;
        storedName = it->second.name;
      }
    } else {
      auto it = dir_->groupsLocked().find(key);
      if (it != dir_->groupsLocked().end() && canReadGroup(*dir_, *session_, it->second)) {
        entry = &it->second;
        storedName = it->second.name;
      }
    }
    if (entry != nullptr) {
      auto record = std::make_unique<MemoryRecord>(dir_, session_, type, storedName);
      record->cache(returnAttribute, *entryValues(type, entry, returnAttribute));
      results.push_back(std::move(record));
    }
    return results;
  }

  std::unique_ptr<DirectoryRecord> createRecord(
      RecordType type, const std::string& recordName,
      const std::map<Attribute, std::vector<std::string>>& attributes, ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kCreateRecord, session_.get())) {
      setError(error, std::move(*e));
      return nullptr;
    }
    if (session_->identity == Session::Identity::kAnonymous) {
      setError(error,
               directoryError(LDAP_STRONG_AUTH_REQUIRED, "modifications require authentication"));
      return nullptr;
    }
    if (!canWrite(*dir_, *session_)) {
      setError(error, directoryError(LDAP_INSUFFICIENT_ACCESS, "no write access to parent"));
      return nullptr;
    }
    if (MemoryDirectory::matchKey(recordName).empty()) {
      setError(error, directoryError(LDAP_INVALID_DN_SYNTAX, "empty record name"));
      return nullptr;
    }
    AttributeValues values;
    if (auto e = newRecordValues(type, recordName, attributes, &values)) {
      setError(error, std::move(*e));
      return nullptr;
    }
    for (const auto& [attribute, list] : values) {
      if (auto e = checkValues(type, attribute, list)) {
        setError(error, std::move(*e));
        return nullptr;
      }
    }
    const std::string key = MemoryDirectory::matchKey(recordName);
    if (type == RecordType::kUsers) {
      if (dir_->usersLocked().count(key) != 0) {
        setError(error, directoryError(LDAP_ALREADY_EXISTS));
        return nullptr;
      }
      dir_->usersLocked()[key] =
          MemoryDirectory::UserEntry{recordName, values[Attribute::kFullName], {}};
    } else {
      if (dir_->groupsLocked().count(key) != 0) {
        setError(error, directoryError(LDAP_ALREADY_EXISTS));
        return nullptr;
      }
      MemoryDirectory::GroupEntry g{recordName, std::nullopt, std::nullopt, {}};
      if (values.count(Attribute::kFullName)) g.fullName = values[Attribute::kFullName][0];
      if (values.count(Attribute::kXMLPlist)) g.xmlPlist = values[Attribute::kXMLPlist][0];
      dir_->groupsLocked()[key] = std::move(g);
    }
    auto record = std::make_unique<MemoryRecord>(dir_, session_, type, recordName);
    record->cache(Attribute::kRecordName, {recordName});
    for (auto& [attribute, list] : values) record->cache(attribute, list);
    return record;
  }

  bool customCall(int code, ErrorSlot* error) override {
    std::lock_guard lock(dir_->mutex());
    if (auto e = dir_->enterLocked(DirectoryOperation::kCustomCall, session_.get())) {
      setError(error, std::move(*e));
      return false;
    }
    if (code != kCustomCallClientAddCACerts || session_->address.scheme == LdapScheme::kLdapi) {
      setError(error, directoryError(LDAP_NOT_SUPPORTED, "no such custom call on this node"));
      return false;
    }
    dir_->addTrustedServerLocked(serverKey(session_->address));
    return true;
  }

 private:
  std::shared_ptr<MemoryDirectory> dir_;
  std::shared_ptr<Session> session_;
};

}  // namespace

MemoryDirectory::MemoryDirectory(std::string adminName, std::string adminPassword)
    : adminName_(std::move(adminName)), adminPassword_(std::move(adminPassword)) {
  users_[matchKey(adminName_)] = UserEntry{adminName_, {adminName_}, adminPassword_};
}

std::shared_ptr<MemoryDirectory> MemoryDirectory::create(std::string adminName,
                                                         std::string adminPassword) {
  return std::shared_ptr<MemoryDirectory>(
      new MemoryDirectory(std::move(adminName), std::move(adminPassword)));
}

std::string MemoryDirectory::matchKey(const std::string& name) {
  std::string key;
  bool pendingBlank = false;
  for (char c : name) {
    if (c == ' ') {
      pendingBlank = !key.empty();
      continue;
    }
    if (pendingBlank) key += ' ';
    pendingBlank = false;
    key += (c >= 'A' && c <= 'Z') ? static_cast<char>(c - 'A' + 'a') : c;
  }
  return key;
}

std::unique_ptr<DirectoryNode> MemoryDirectory::openNode(const std::string& nodeName,
                                                         ErrorSlot* error) {
  std::optional<NodeAddress> address = parseNodeName(nodeName);
  std::lock_guard lock(mutex_);
  auto session = std::make_shared<Session>();
  session->nodeName = nodeName;
  if (address) session->address = *address;
  // Like the LDAP client, opening contacts the server: an unreachable one
  // fails here.
  if (auto e = enterLocked(DirectoryOperation::kOpenNode, address ? session.get() : nullptr)) {
    setError(error, std::move(*e));
    return nullptr;
  }
  if (!address) {
    setError(error, directoryError(LDAP_PARAM_ERROR, "not a directory node name"));
    return nullptr;
  }
  if (address->scheme == LdapScheme::kLdapi) session->identity = Session::Identity::kSuperuser;
  return std::make_unique<MemoryNode>(shared_from_this(), std::move(session));
}

std::optional<Error> MemoryDirectory::enterLocked(DirectoryOperation operation,
                                                  const Session* session) {
  const std::size_t call = ++calls_[operation];
  for (const Fault& f : faults_) {
    if (f.operation == operation && (call == f.atCall || (f.andLater && call > f.atCall))) {
      return f.error;
    }
  }
  if (session != nullptr && unreachable_.count(serverKey(session->address)) != 0) {
    return directoryError(LDAP_SERVER_DOWN);
  }
  return std::nullopt;
}

bool MemoryDirectory::addUser(const std::string& name, const std::string& password,
                              std::optional<std::string> fullName) {
  std::lock_guard lock(mutex_);
  const std::string key = matchKey(name);
  if (key.empty() || users_.count(key) != 0) return false;
  users_[key] = UserEntry{name, {fullName.value_or(name)}, password};
  return true;
}

bool MemoryDirectory::addGroup(const std::string& name, std::optional<std::string> fullName,
                               std::optional<std::string> xmlPlist,
                               const std::vector<std::string>& members) {
  std::lock_guard lock(mutex_);
  const std::string key = matchKey(name);
  if (key.empty() || groups_.count(key) != 0) return false;
  groups_[key] = GroupEntry{name, std::move(fullName), std::move(xmlPlist), members};
  return true;
}

bool MemoryDirectory::hasRecord(RecordType type, const std::string& name) const {
  std::lock_guard lock(mutex_);
  return type == RecordType::kUsers ? users_.count(matchKey(name)) != 0
                                    : groups_.count(matchKey(name)) != 0;
}

std::optional<std::string> MemoryDirectory::xmlPlist(const std::string& groupName) const {
  std::lock_guard lock(mutex_);
  auto it = groups_.find(matchKey(groupName));
  if (it == groups_.end()) return std::nullopt;
  return it->second.xmlPlist;
}

std::optional<std::string> MemoryDirectory::fullName(RecordType type,
                                                     const std::string& name) const {
  std::lock_guard lock(mutex_);
  if (type == RecordType::kUsers) {
    auto it = users_.find(matchKey(name));
    if (it == users_.end() || it->second.fullNames.empty()) return std::nullopt;
    return it->second.fullNames[0];
  }
  auto it = groups_.find(matchKey(name));
  if (it == groups_.end()) return std::nullopt;
  return it->second.fullName;
}

std::vector<std::string> MemoryDirectory::members(const std::string& groupName) const {
  std::lock_guard lock(mutex_);
  auto it = groups_.find(matchKey(groupName));
  if (it == groups_.end()) return {};
  return it->second.members;
}

bool MemoryDirectory::passwordMatches(const std::string& userName,
                                      const std::string& password) const {
  std::lock_guard lock(mutex_);
  auto it = users_.find(matchKey(userName));
  return it != users_.end() && it->second.password == password;
}

std::set<std::string> MemoryDirectory::trustedServers() const {
  std::lock_guard lock(mutex_);
  return trusted_;
}

std::size_t MemoryDirectory::recordCount() const {
  std::lock_guard lock(mutex_);
  return users_.size() + groups_.size();
}

void MemoryDirectory::failOperation(DirectoryOperation operation, std::size_t nth, Error error,
                                    bool andLater) {
  std::lock_guard lock(mutex_);
  faults_.push_back(Fault{operation, calls_[operation] + std::max<std::size_t>(nth, 1),
                          std::move(error), andLater});
}

void MemoryDirectory::clearFaults() {
  std::lock_guard lock(mutex_);
  faults_.clear();
}

std::size_t MemoryDirectory::callCount(DirectoryOperation operation) const {
  std::lock_guard lock(mutex_);
  auto it = calls_.find(operation);
  return it == calls_.end() ? 0 : it->second;
}

void MemoryDirectory::setReachable(const std::string& nodeName, bool reachable) {
  std::optional<NodeAddress> address = parseNodeName(nodeName);
  if (!address) return;
  std::lock_guard lock(mutex_);
  if (reachable) {
    unreachable_.erase(serverKey(*address));
  } else {
    unreachable_.insert(serverKey(*address));
  }
}

}  // namespace kolt
