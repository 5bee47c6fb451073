// One controller for the build tests: a sandbox root with its local document
// and side files, fake host name and interfaces, the real converter and a
// recording qmadmin, and an in-memory directory reached as the local
// superuser over ldapi.
#ifndef KOLT_TESTS_UNIT_SYNC_BUILD_WORLD_H
#define KOLT_TESTS_UNIT_SYNC_BUILD_WORLD_H

#include <netinet/in.h>
#include <sys/socket.h>

#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "fixtures/fault_env.h"
#include "fixtures/memory_directory_env.h"
#include "fixtures/sandbox.h"
#include "kolt/build.h"
#include "kolt/directory_records.h"
#include "kolt/local_config.h"

// Its own namespace: the change-check tests, linked into the same binary,
// have constants of the same names.
namespace kolt::testing::build_world {

inline constexpr const char* kOurUUID = "5A5A5A5A-1111-4222-8333-444444444444";
inline constexpr const char* kOtherUUID = "0B0B0B0B-1111-4222-8333-444444444444";
inline constexpr const char* kSanName = "Media SAN";
inline constexpr const char* kSanUUID = "8C1D2E3F-0000-4000-8000-00000000A11C";
inline constexpr const char* kSecret = "Sh4red-Secret-9f2k";
inline constexpr const char* kLocalNode = "ldapi://%2Fvar%2Frun%2Fldapi";
inline const std::string kVornDir = "/Library/Preferences/Vorn/";

inline InterfaceAddress ipv4(const std::string& name, std::uint8_t a, std::uint8_t b,
                             std::uint8_t c, std::uint8_t d) {
  return {name, AF_INET,
          std::string{static_cast<char>(a), static_cast<char>(b), static_cast<char>(c),
                      static_cast<char>(d)}};
}

inline InterfaceAddress ipv6(const std::string& name, std::initializer_list<std::uint8_t> bytes) {
  std::string address(16, '\0');
  std::size_t i = 0;
  for (std::uint8_t b : bytes) address[i++] = static_cast<char>(b);
  return {name, AF_INET6, address};
}

// A local document of an initializing controller at 10.1.2.3.
inline Value controllerDocument() {
  Value doc;
  doc.set("role", "CONTROLLER");
  doc.set("sanName", kSanName);
  doc.set("sanUUID", kSanUUID);
  doc.set("sanState", "initializing");
  doc.set("vornAddr", "10.1.2.3");
  doc.set("sanConfigURLs", Value(Array{Value("ldap://10.1.2.3")}));
  doc.set("sanAuthMethod", "auth_secret");
  doc.set("ownerName", "Storage Team");
  doc.set("ownerEmail", "storage@example.com");
  return doc;
}

struct BuildWorld {
  explicit BuildWorld(std::shared_ptr<MemoryDirectory> shared = MemoryDirectory::create())
      : faults(&sandbox.env()), directory(shared), env(&faults, shared), scoped(&env) {
    sandbox.setHardwareUUID(kOurUUID);
    faults.fakeHostName("ctrl-a");
    faults.fakeInterfaceAddresses({ipv4("lo", 127, 0, 0, 1), ipv4("en0", 10, 1, 2, 3)});
    std::filesystem::copy_file(std::filesystem::path(KOLT_BINARY_DIR) / "pdcfgconvert",
                               sandbox.hostPath(std::string(kToolDirectory) + "pdcfgconvert"));
    sandbox.installTool("qmadmin");
    writeLocal(controllerDocument());
    sandbox.writeFile(kVornDir + ".auth_secret", kSecret, 0600);
    sandbox.writeFile(kVornDir + "fsports", "MinPort 2000\n");
    sandbox.writeFile(kVornDir + "fsnameservers", "10.1.2.3\n");
  }

  void writeLocal(const Value& doc) {
    sandbox.writeFile(kVornDir + "config.plist", *writeXmlPropertyList(doc));
  }
  Value local() { return *loadConfigPlist(); }
  std::optional<std::string> localBytes() { return sandbox.readFile(kVornDir + "config.plist"); }

  std::optional<std::string> publishedBytes() {
    return directory->xmlPlist(ldapSanConfNameForName(kSanName));
  }
  std::optional<Value> published() {
    std::optional<std::string> xml = publishedBytes();
    if (!xml) return std::nullopt;
    return parsePropertyList(*xml);
  }
  const Value& globals() {
    cached = published().value_or(Value());
    return *cached.find("globals");
  }
  std::string revision() {
    const Value& g = globals();
    return g.findString("revision") ? *g.findString("revision") : "";
  }

  // Stores `record` as the SAN's configuration, as a controller would have.
  void seedRecord(const Value& record) {
    directory->addUser(ldapSanUserNameForName(kSanName), kSecret);
    directory->addGroup(ldapSanConfNameForName(kSanName), std::nullopt,
                        *writeXmlPropertyList(record), {ldapSanUserNameForName(kSanName)});
  }

  int build(ErrorSlot* error = nullptr, const std::string& node = kLocalNode) {
    return buildSanConfig(&node, nullptr, nullptr, error);
  }

  // Directory calls that change something.
  std::size_t directoryWrites() const {
    std::size_t n = 0;
    for (DirectoryOperation op :
         {DirectoryOperation::kCreateRecord, DirectoryOperation::kSetValues,
          DirectoryOperation::kChangePassword, DirectoryOperation::kAddMember,
          DirectoryOperation::kDeleteRecord}) {
      n += directory->callCount(op);
    }
    return n;
  }

  Sandbox sandbox;
  FaultEnv faults;
  std::shared_ptr<MemoryDirectory> directory;
  MemoryDirectoryEnv env;
  ScopedEnv scoped;
  Value cached;
};

}  // namespace kolt::testing::build_world

#endif  // KOLT_TESTS_UNIT_SYNC_BUILD_WORLD_H
