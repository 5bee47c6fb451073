#include "platform/directory/ldap_directory.h"

#include <strings.h>

#include <list>
#include <memory>

#include "platform/directory/directory_error.h"
#include "platform/directory/new_record_values.h"
#include "platform/directory/ldap_connection.h"
#include "platform/directory/ldap_escape.h"
#include "platform/directory/server_certificates.h"
#include "platform/directory/trust_store.h"

namespace kolt {
namespace {

using Message = std::shared_ptr<LDAPMessage>;
using ValueViews = std::map<Attribute, std::vector<std::string_view>>;

constexpr const char* kUserClass = "inetOrgPerson";
constexpr const char* kGroupClass = "vornGroup";
constexpr const char* kPlistAttribute = "vornXMLPlist";

const char* nameAttribute(RecordType type) {
  return type == RecordType::kUsers ? "uid" : "cn";
}

// The LDAP attribute that holds `attribute` in a record of `type`.
const char* ldapAttribute(RecordType type, Attribute attribute) {
  switch (attribute) {
    case Attribute::kRecordName:
      return nameAttribute(type);
    case Attribute::kFullName:
      return type == RecordType::kUsers ? "cn" : "displayName";
    case Attribute::kXMLPlist:
      return kPlistAttribute;
  }
  return kPlistAttribute;
}

std::optional<Attribute> attributeFor(RecordType type, const berval& name) {
  const std::string text(name.bv_val, name.bv_len);
  for (Attribute a : {Attribute::kRecordName, Attribute::kFullName, Attribute::kXMLPlist}) {
    if (::strcasecmp(text.c_str(), ldapAttribute(type, a)) == 0) return a;
  }
  return std::nullopt;
}

// The entry's values, as views into the message (no copy: a configuration
// may be megabytes long).
bool readEntry(LDAP* ld, LDAPMessage* entry, RecordType type, ValueViews* out) {
  BerElement* ber = nullptr;
  berval dn{0, nullptr};
  if (ldap_get_dn_ber(ld, entry, &ber, &dn) != LDAP_SUCCESS) return false;
  berval attr{0, nullptr};
  BerVarray values = nullptr;
  bool ok = true;
  for (;;) {
    const int rc = ldap_get_attribute_ber(ld, entry, ber, &attr, &values);
    if (rc != LDAP_SUCCESS) {
      ok = false;
      break;
    }
    if (attr.bv_val == nullptr) break;
    const std::optional<Attribute> a = attributeFor(type, attr);
    // The record name is the DN's; a second cn of a group is not its name.
    if (a && *a != Attribute::kRecordName) {
      auto& list = (*out)[*a];
      for (int i = 0; values != nullptr && values[i].bv_val != nullptr; ++i) {
        list.emplace_back(values[i].bv_val, values[i].bv_len);
      }
    }
    ber_memfree(values);
    values = nullptr;
  }
  ber_memfree(values);
  ber_free(ber, 0);
  return ok;
}

std::string entryDn(LDAP* ld, LDAPMessage* entry) {
  char* dn = ldap_get_dn(ld, entry);
  std::string text = dn ? dn : "";
  ldap_memfree(dn);
  return text;
}

// LDAPMod arrays over caller-owned values.
class Modifications {
 public:
  // Values the caller keeps alive until the operation ends.
  void add(int op, const char* type, const std::vector<std::string>& values) {
    auto& bvs = values_.emplace_back();
    for (const std::string& v : values) {
      bvs.push_back(new berval{static_cast<ber_len_t>(v.size()), const_cast<char*>(v.data())});
    }
    bvs.push_back(nullptr);
    mods_.push_back(std::make_unique<LDAPMod>());
    LDAPMod& m = *mods_.back();
    m.mod_op = op | LDAP_MOD_BVALUES;
    m.mod_type = const_cast<char*>(type);
    m.mod_bvalues = bvs.data();
  }
  // Values kept here (small ones: classes, names).
  void add(int op, const char* type, std::vector<std::string>&& values) {
    add(op, type, kept_.emplace_back(std::move(values)));
  }
  LDAPMod** get() {
    pointers_.clear();
    for (auto& m : mods_) pointers_.push_back(m.get());
    pointers_.push_back(nullptr);
    return pointers_.data();
  }
  ~Modifications() {
    for (auto& list : values_) {
      for (berval* bv : list) delete bv;
    }
  }

 private:
  std::list<std::vector<std::string>> kept_;
  std::vector<std::vector<berval*>> values_;
  std::vector<std::unique_ptr<LDAPMod>> mods_;
  std::vector<LDAPMod*> pointers_;
};

class LdapRecord final : public DirectoryRecord {
 public:
  LdapRecord(std::shared_ptr<LdapConnection> connection, RecordType type, std::string dn,
             std::string name)
      : connection_(std::move(connection)),
        type_(type),
        dn_(std::move(dn)),
        name_(std::move(name)) {
    views_[Attribute::kRecordName] = {name_};
  }

  // Keeps `message` alive for views into it.
  void adopt(Message message, ValueViews views) {
    messages_.push_back(std::move(message));
    for (auto& [attribute, list] : views) {
      if (attribute != Attribute::kRecordName) views_[attribute] = std::move(list);
    }
  }
  void own(Attribute attribute, std::vector<std::string> values) {
    auto& stored = owned_[attribute];
    stored = std::move(values);
    views_[attribute].assign(stored.begin(), stored.end());
  }
  // Attributes the query fetched but the entry lacks have no values.
  void fetched(Attribute attribute) { views_.try_emplace(attribute); }

  const std::string& dn() const { return dn_; }
  const std::shared_ptr<LdapConnection>& connection() const { return connection_; }

  RecordType recordType() const override { return type_; }
  const std::string& recordName() const override { return name_; }

  std::optional<std::vector<std::string_view>> valuesForAttribute(Attribute attribute,
                                                                  ErrorSlot* error) override {
    if (auto it = views_.find(attribute); it != views_.end()) return it->second;
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) return failWithNothing(error, std::move(*e));
    LDAP* ld = connection_->handle();
    const char* attrs[] = {ldapAttribute(type_, attribute), nullptr};
    LDAPMessage* result = nullptr;
    timeval timeout{kLdapOperationTimeoutSeconds, 0};
    const int rc =
        ldap_search_ext_s(ld, dn_.c_str(), LDAP_SCOPE_BASE, "(objectClass=*)",
                          const_cast<char**>(attrs), 0, nullptr, nullptr, &timeout, 1, &result);
    Message message(result, ldap_msgfree);
    if (rc != LDAP_SUCCESS) return failWithNothing(error, connection_->error(rc));
    LDAPMessage* entry = ldap_first_entry(ld, result);
    ValueViews views;
    if (entry == nullptr) return failWithNothing(error, directoryError(LDAP_NO_SUCH_OBJECT));
    if (!readEntry(ld, entry, type_, &views))
      return failWithNothing(error, connection_->error(LDAP_DECODING_ERROR));
    adopt(std::move(message), std::move(views));
    fetched(attribute);
    return views_[attribute];
  }

  bool setValues(Attribute attribute, const std::vector<std::string>& values,
                 ErrorSlot* error) override {
    if (attribute == Attribute::kRecordName) {
      return failWithFalse(error,
                           directoryError(LDAP_NOT_SUPPORTED, "the record name cannot be changed"));
    }
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) return failWithFalse(error, std::move(*e));
    Modifications mods;
    mods.add(LDAP_MOD_REPLACE, ldapAttribute(type_, attribute), values);
    const int rc =
        ldap_modify_ext_s(connection_->handle(), dn_.c_str(), mods.get(), nullptr, nullptr);
    if (rc != LDAP_SUCCESS) return failWithFalse(error, connection_->error(rc));
    own(attribute, values);
    return true;
  }

  bool synchronize(ErrorSlot*) override { return true; }  // every change is stored at once

  bool changePassword(const std::optional<std::string>& oldPassword, const std::string& newPassword,
                      ErrorSlot* error) override {
    if (type_ != RecordType::kUsers) {
      return failWithFalse(error, directoryError(LDAP_NOT_SUPPORTED, "only users have passwords"));
    }
    // An empty new password would make the server generate one.
    if (newPassword.empty()) {
      return failWithFalse(error, directoryError(LDAP_PARAM_ERROR, "an empty password is refused"));
    }
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) return failWithFalse(error, std::move(*e));
    berval user{static_cast<ber_len_t>(dn_.size()), dn_.data()};
    berval next{static_cast<ber_len_t>(newPassword.size()), const_cast<char*>(newPassword.data())};
    berval old{0, nullptr};
    if (oldPassword)
      old = {static_cast<ber_len_t>(oldPassword->size()), const_cast<char*>(oldPassword->data())};
    berval generated{0, nullptr};
    const int rc = ldap_passwd_s(connection_->handle(), &user, oldPassword ? &old : nullptr, &next,
                                 &generated, nullptr, nullptr);
    ber_memfree(generated.bv_val);
    if (rc != LDAP_SUCCESS) return failWithFalse(error, connection_->error(rc));
    return true;
  }

  bool addMemberRecord(const DirectoryRecord& member, ErrorSlot* error) override {
    const auto* user = dynamic_cast<const LdapRecord*>(&member);
    if (type_ != RecordType::kGroups || user == nullptr || user->type_ != RecordType::kUsers) {
      return failWithFalse(error, directoryError(LDAP_PARAM_ERROR, "a group takes user records"));
    }
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) return failWithFalse(error, std::move(*e));
    Modifications mods;
    mods.add(LDAP_MOD_ADD, "member", {user->dn_});
    const int rc =
        ldap_modify_ext_s(connection_->handle(), dn_.c_str(), mods.get(), nullptr, nullptr);
    // Already a member: nothing to do.
    if (rc != LDAP_SUCCESS && rc != LDAP_TYPE_OR_VALUE_EXISTS) {
      return failWithFalse(error, connection_->error(rc));
    }
    return true;
  }

  bool deleteRecord(ErrorSlot* error) override {
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) return failWithFalse(error, std::move(*e));
    const int rc = ldap_delete_ext_s(connection_->handle(), dn_.c_str(), nullptr, nullptr);
    if (rc != LDAP_SUCCESS) return failWithFalse(error, connection_->error(rc));
    return true;
  }

 private:
  std::shared_ptr<LdapConnection> connection_;
  RecordType type_;
  std::string dn_;  // as the server returned it, or as we built it
  std::string name_;
  std::vector<Message> messages_;
  std::map<Attribute, std::vector<std::string>> owned_;
  ValueViews views_;
};

class LdapNode final : public DirectoryNode {
 public:
  LdapNode(std::string nodeName, std::shared_ptr<LdapConnection> connection)
      : nodeName_(std::move(nodeName)), connection_(std::move(connection)) {}

  const std::string& nodeName() const override { return nodeName_; }

  bool setCredentials(std::string_view recordType, const std::string& recordName,
                      const std::string& password, ErrorSlot* error) override {
    if (recordType != kRecordTypeUsers) {
      setError(error, directoryError(LDAP_PARAM_ERROR, "credentials are those of a user"));
      return false;
    }
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->setCredentials(recordName, password)) {
      setError(error, std::move(*e));
      return false;
    }
    return true;
  }

  std::optional<std::vector<std::unique_ptr<DirectoryRecord>>> queryRecords(
      RecordType type, const std::string& recordName, Attribute returnAttribute,
      std::size_t maxResults, ErrorSlot* error) override {
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) {
      setError(error, std::move(*e));
      return std::nullopt;
    }
    LDAP* ld = connection_->handle();
    const std::string filter = std::string("(&(objectClass=") +
                               (type == RecordType::kUsers ? kUserClass : kGroupClass) + ")(" +
                               nameAttribute(type) + "=" + escapeFilterValue(recordName) + "))";
    const char* attrs[] = {ldapAttribute(type, returnAttribute), nullptr};
    const int limit = maxResults > 0x7fffffff ? 0 : static_cast<int>(maxResults);
    Message message;
    auto search = [&] {
      LDAPMessage* result = nullptr;
      timeval timeout{kLdapOperationTimeoutSeconds, 0};
      const std::string container = connection_->container(type);
      const int rc = ldap_search_ext_s(ld, container.c_str(), LDAP_SCOPE_ONELEVEL, filter.c_str(),
                                       const_cast<char**>(attrs), 0, nullptr, nullptr, &timeout,
                                       limit, &result);
      message.reset(result, ldap_msgfree);
      return rc;
    };
    int rc = search();
    // A missing container may mean a base the server no longer has.
    if (LdapConnection::wrongBaseExplains(rc) && connection_->refreshStaleBase()) {
      ld = connection_->handle();
      rc = search();
    }
    LDAPMessage* result = message.get();
    std::vector<std::unique_ptr<DirectoryRecord>> records;
    // A container the session may not see holds nothing it may read.
    if (rc == LDAP_NO_SUCH_OBJECT) return records;
    if (rc == LDAP_SIZELIMIT_EXCEEDED) {
      setError(error, directoryError(rc, "more records match; partial results are refused"));
      return std::nullopt;
    }
    if (rc != LDAP_SUCCESS) {
      setError(error, connection_->error(rc));
      return std::nullopt;
    }
    for (LDAPMessage* e = ldap_first_entry(ld, result); e != nullptr; e = ldap_next_entry(ld, e)) {
      const std::string dn = entryDn(ld, e);
      ValueViews views;
      if (!readEntry(ld, e, type, &views)) {
        setError(error, connection_->error(LDAP_DECODING_ERROR));
        return std::nullopt;
      }
      auto record = std::make_unique<LdapRecord>(connection_, type, dn,
                                                 firstRdnValue(dn).value_or(recordName));
      record->adopt(message, std::move(views));
      record->fetched(returnAttribute);
      records.push_back(std::move(record));
    }
    return records;
  }

  std::unique_ptr<DirectoryRecord> createRecord(
      RecordType type, const std::string& recordName,
      const std::map<Attribute, std::vector<std::string>>& attributes, ErrorSlot* error) override {
    if (recordName.find_first_not_of(' ') == std::string::npos) {
      setError(error, directoryError(LDAP_INVALID_DN_SYNTAX, "empty record name"));
      return nullptr;
    }
    AttributeValues values;
    if (auto e = newRecordValues(type, recordName, attributes, &values)) {
      setError(error, std::move(*e));
      return nullptr;
    }
    LdapConnection::Use use(*connection_);
    if (auto e = connection_->ready()) {
      setError(error, std::move(*e));
      return nullptr;
    }
    Modifications mods;
    const std::vector<std::string> name{recordName};
    if (type == RecordType::kUsers) {
      mods.add(LDAP_MOD_ADD, "objectClass", {kUserClass});
      mods.add(LDAP_MOD_ADD, "uid", name);
      mods.add(LDAP_MOD_ADD, "sn", name);
    } else {
      mods.add(LDAP_MOD_ADD, "objectClass", {kGroupClass});
      mods.add(LDAP_MOD_ADD, "cn", name);
    }
    for (const auto& [attribute, list] : values) {
      mods.add(LDAP_MOD_ADD, ldapAttribute(type, attribute), list);
    }
    std::string dn = connection_->recordDn(type, recordName);
    int rc = ldap_add_ext_s(connection_->handle(), dn.c_str(), mods.get(), nullptr, nullptr);
    if (LdapConnection::wrongBaseExplains(rc)) {
      // A missing container may mean a base the server no longer has.
      Error first = connection_->error(rc);
      if (!connection_->refreshStaleBase()) {
        setError(error, std::move(first));
        return nullptr;
      }
      dn = connection_->recordDn(type, recordName);
      rc = ldap_add_ext_s(connection_->handle(), dn.c_str(), mods.get(), nullptr, nullptr);
    }
    if (rc != LDAP_SUCCESS) {
      setError(error, connection_->error(rc));
      return nullptr;
    }
    auto record = std::make_unique<LdapRecord>(connection_, type, dn, recordName);
    for (auto& [attribute, list] : values) record->own(attribute, list);
    return record;
  }

  bool customCall(int code, ErrorSlot* error) override {
    if (code != kCustomCallClientAddCACerts) {
      setError(error, directoryError(LDAP_NOT_SUPPORTED, "no such custom call"));
      return false;
    }
    LdapConnection::Use use(*connection_);
    std::vector<std::string> pems;
    std::optional<Error> e =
        fetchServerCaCertificates(connection_->address(), kLdapConnectTimeoutSeconds, &pems);
    if (!e) e = addTrustedCertificates(connection_->env(), pems);
    if (e) {
      setError(error, std::move(*e));
      return false;
    }
    return true;
  }

 private:
  std::string nodeName_;
  std::shared_ptr<LdapConnection> connection_;
};

}  // namespace

std::unique_ptr<DirectoryNode> openLdapNode(Env& env, const std::string& nodeName,
                                            ErrorSlot* error) {
  std::optional<NodeAddress> address = parseNodeName(nodeName);
  if (!address) {
    setError(error, directoryError(LDAP_PARAM_ERROR, "not a directory node name"));
    return nullptr;
  }
  // Opening connects, finds the search base (from the Env's cache, or the
  // root DSE) and, on ldapi, binds as the local superuser: a node that opens
  // is one whose server answered.
  const bool ldaps = address->scheme == LdapScheme::kLdaps;
  auto connection = std::make_shared<LdapConnection>(env, *address);
  {
    LdapConnection::Use use(*connection);
    if (auto e = connection->ready()) {
      // An ldaps server whose certificate is not trusted yet still answers a
      // handshake that does not verify it. Its node opens, so that the
      // custom call can trust it; every other operation fails with the TLS
      // error until then, and nothing is read from or sent to it.
      std::vector<std::string> presented;
      if (!ldaps || fetchServerCaCertificates(*address, kLdapConnectTimeoutSeconds, &presented)) {
        setError(error, std::move(*e));
        return nullptr;
      }
    }
  }
  return std::make_unique<LdapNode>(nodeName, std::move(connection));
}

}  // namespace kolt
