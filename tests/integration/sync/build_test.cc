// The build end to end on a private slapd: a controller publishes over its
// ldapi socket, a second controller joins over ldap:// with the directory
// administrator, and members apply what was published with their check.
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "config/hosted_volume_list.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "fixtures/slapd.h"
#include "kolt/build.h"
#include "kolt/change_check.h"
#include "kolt/directory_records.h"
#include "kolt/local_config.h"

namespace kolt::testing {
namespace {

namespace fs = std::filesystem;

constexpr const char* kUUIDA = "A0A0A0A0-1111-4222-8333-444444444444";
constexpr const char* kUUIDB = "B0B0B0B0-1111-4222-8333-444444444444";
constexpr const char* kUUIDClient = "C0C0C0C0-1111-4222-8333-444444444444";
constexpr const char* kSanName = "Edit Bay SAN";
constexpr const char* kSanUUID = "8C1D2E3F-0000-4000-8000-00000000A11C";
constexpr const char* kSecret = "Sh4red-Secret-9f2k";
const std::string kVorn = "/Library/Preferences/Vorn/";

std::string sample(const std::string& name) {
  std::ifstream in(fs::path(KOLT_SOURCE_DIR) / "tests/fixtures/volumes" / name, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

// One machine: its own root, identity and tools.
struct Machine {
  Machine(const char* uuid, const char* host) {
    sandbox.setHardwareUUID(uuid);
    sandbox.setHostName(host);
    fs::copy_file(fs::path(KOLT_BINARY_DIR) / "pdcfgconvert",
                  sandbox.hostPath(std::string(kToolDirectory) + "pdcfgconvert"));
    sandbox.installTool("qmadmin");
    sandbox.installTool("vornctl");
  }
  void write(const std::string& name, const std::string& text, mode_t mode = 0644) {
    sandbox.writeFile(kVorn + name, text, mode);
  }
  void writeLocal(const Value& doc) { write("config.plist", *writeXmlPropertyList(doc)); }
  Value local() {
    ScopedEnv use(&sandbox.env());
    return *loadConfigPlist();
  }
  Sandbox sandbox;
};

Value controllerDocument(const std::string& address, const std::string& url) {
  Value doc;
  doc.set("role", "CONTROLLER");
  doc.set("sanName", kSanName);
  doc.set("sanUUID", kSanUUID);
  doc.set("sanState", "initializing");
  doc.set("vornAddr", address);
  doc.set("sanConfigURLs", Value(Array{Value(url)}));
  doc.set("sanAuthMethod", "auth_secret");
  return doc;
}

class BuildOnSlapdTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string error;
    SlapdOptions options;
    options.ldapiSocketPath = a_.sandbox.hostPath("/var/run/ldapi");
    slapd_ = Slapd::start(options, &error);
    ASSERT_NE(slapd_, nullptr) << error;

    a_.writeLocal(controllerDocument("10.1.2.3", slapd_->ldapUrl()));
    a_.write(".auth_secret", kSecret, 0600);
    a_.write("fsports", "MinPort 2000\n");
    a_.write("fsnameservers", "10.1.2.3\n");
    a_.write("fsmlist", "Projects . 0\nScratch . 0\n");
    a_.write("Projects.cfg", sample("Projects.cfg"));
    a_.write("Projects-auxdata.plist", sample("Projects-auxdata.plist"));
    a_.write("Scratch.cfgx", sample("Scratch.cfgx"));
  }

  int buildOnA() {
    ScopedEnv use(&a_.sandbox.env());
    const std::string node = "ldapi://%2Fvar%2Frun%2Fldapi";
    ErrorSlot error;
    const int rc = buildSanConfig(&node, nullptr, nullptr, &error);
    EXPECT_EQ(rc, 0) << (error ? error->printed() : "");
    return rc;
  }
  int buildOnB() {
    ScopedEnv use(&b_.sandbox.env());
    const std::string node = slapd_->ldapUrl(), admin = slapd_->adminName(),
                      password = slapd_->adminPassword();
    ErrorSlot error;
    const int rc = buildSanConfig(&node, &admin, &password, &error);
    EXPECT_EQ(rc, 0) << (error ? error->printed() : "");
    return rc;
  }
  // The record as the directory holds it, read over ldapi as the superuser.
  Value published() {
    ScopedEnv use(&a_.sandbox.env());
    ErrorSlot error;
    auto node = currentEnv().openDirectoryNode("/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi", &error);
    const std::string name = kSanName;
    std::optional<Value> record = node ? getVornConfig(*node, &name, &error) : std::nullopt;
    EXPECT_TRUE(record) << (error ? error->printed() : "");
    return record.value_or(Value());
  }
  int check(Machine& m, Value* newConfig, std::uint32_t* mask) {
    ScopedEnv use(&m.sandbox.env());
    return checkSanConfigChange(mask, newConfig);
  }

  // The member's hosted volumes equal the published ones: one ".cfgp" per
  // volume that names it, with the published configuration and date, and an
  // fsmlist of exactly those.
  void expectVolumesAsPublished(Machine& m, const char* uuid, const Value& record) {
    std::string fsmlist;
    for (const auto& [name, entry] : *record.find("volumes")->asDictionary()) {
      bool hosted = false;
      for (const Value& c : *entry.findArray("controllers")) hosted |= *c.asString() == uuid;
      const std::string path = kVorn + name + ".cfgp";
      if (!hosted) {
        EXPECT_FALSE(m.sandbox.exists(path)) << name;
        continue;
      }
      fsmlist += name + " . 0\n";
      std::optional<std::string> text = m.sandbox.readFile(path);
      ASSERT_TRUE(text) << name;
      EXPECT_TRUE(*parsePropertyList(*text) == *entry.find("config")) << name;
      EXPECT_EQ(std::floor(*m.sandbox.modificationTime(path)),
                entry.find("mtime")->asDate()->seconds)
          << name;
    }
    EXPECT_EQ(m.sandbox.readFile(kFsmlistPath).value_or(""), fsmlist);
  }

  // Declared before the server, which is stopped first.
  Machine a_{kUUIDA, "ctrl-a"};
  Machine b_{kUUIDB, "ctrl-b"};
  Machine client_{kUUIDClient, "edit-01"};
  std::unique_ptr<Slapd> slapd_;
  LogCapture logs_;
};

TEST_F(BuildOnSlapdTest, ControllerPublishesAndAMemberAppliesExactlyThat) {
  ASSERT_EQ(buildOnA(), 0);
  const Value record = published();
  const Value& g = *record.find("globals");
  EXPECT_EQ(*g.findString("sanName"), kSanName);
  EXPECT_EQ(*g.findString("revision"), *a_.local().findString("sanRevision"));
  EXPECT_EQ(*a_.local().findString("sanState"), "active");
  ASSERT_NE(record.find("volumes")->find("Projects"), nullptr);
  ASSERT_NE(record.find("volumes")->find("Scratch"), nullptr);
  EXPECT_NE(record.find("volumes")->find("Projects")->find("config")->find("auxData"), nullptr);
  EXPECT_FALSE(a_.sandbox.exists(kVorn + "Projects.cfg"));
  EXPECT_FALSE(a_.sandbox.exists(kVorn + "Scratch.cfgx"));

  // A second build with nothing changed publishes nothing.
  ASSERT_EQ(buildOnA(), 0);
  EXPECT_EQ(*published().find("globals")->findString("revision"), *g.findString("revision"));

  // A client joins with a new document naming the directory.
  Value join;
  join.set("sanName", kSanName);
  join.set("sanConfigURLs", Value(Array{Value(slapd_->ldapUrl())}));
  join.set("sharedSecret", kSecret);
  std::uint32_t mask = 0;
  ASSERT_EQ(check(client_, &join, &mask), 0);
  EXPECT_EQ(mask, kChangeNewConfig | kChangeApplied | kChangeRole);
  const Value clientDoc = client_.local();
  EXPECT_EQ(*clientDoc.findString("role"), "CLIENT");
  EXPECT_EQ(*clientDoc.findString("sanRevision"), *g.findString("revision"));
  EXPECT_EQ(clientDoc.find("sharedSecret"), nullptr);
  EXPECT_EQ(client_.sandbox.readFile(kVorn + ".auth_secret"), kSecret);
  EXPECT_EQ(client_.sandbox.fileMode(kVorn + ".auth_secret"), 0600u);
  EXPECT_EQ(client_.sandbox.readFile(kVorn + "fsnameservers"), "10.1.2.3\n");
  EXPECT_EQ(client_.sandbox.readFile(kVorn + "fsports"), "MinPort 2000\n");
  expectVolumesAsPublished(client_, kUUIDClient, record);
  // The volume update asks qmadmin to start each volume missing from fsmlist.
  EXPECT_EQ(client_.sandbox.waitForToolCalls(2).size(), 2u);

  // The controller's own check finds its revision and changes nothing.
  mask = 0;
  ASSERT_EQ(check(a_, nullptr, &mask), 0);
  EXPECT_EQ(mask, 0u);
  expectVolumesAsPublished(a_, kUUIDA, record);
}

TEST_F(BuildOnSlapdTest, SecondControllerJoinsAndBothAreListedEverywhere) {
  ASSERT_EQ(buildOnA(), 0);
  const std::string firstCertSet = *published().find("globals")->findString("certSetRevision");

  b_.writeLocal(controllerDocument("10.1.2.4", slapd_->ldapUrl()));
  b_.write(".auth_secret", kSecret, 0600);
  b_.write("fsports", "MinPort 2000\n");
  b_.write("fsnameservers", "10.1.2.3\n10.1.2.4\n");
  ASSERT_EQ(buildOnB(), 0);

  const Value record = published();
  const Value& g = *record.find("globals");
  const Value* controllers = g.find("controllers");
  ASSERT_NE(controllers, nullptr);
  EXPECT_EQ(controllers->asDictionary()->size(), 2u);
  EXPECT_EQ(*controllers->find(kUUIDA)->findString("IPAddress"), "10.1.2.3");
  EXPECT_EQ(*controllers->find(kUUIDA)->findString("hostName"), "ctrl-a");
  EXPECT_EQ(*controllers->find(kUUIDB)->findString("IPAddress"), "10.1.2.4");
  EXPECT_EQ(*controllers->find(kUUIDB)->findString("hostName"), "ctrl-b");
  const Array& servers = *g.findArray("fsnameservers");
  ASSERT_EQ(servers.size(), 2u);
  EXPECT_EQ(*servers[0].findString("addr"), "10.1.2.3");
  EXPECT_EQ(*servers[0].findString("uuid"), kUUIDA);
  EXPECT_EQ(*servers[1].findString("addr"), "10.1.2.4");
  EXPECT_EQ(*servers[1].findString("uuid"), kUUIDB);
  EXPECT_NE(*g.findString("certSetRevision"), firstCertSet);
  // B joined every volume and wrote their files.
  expectVolumesAsPublished(b_, kUUIDB, record);
  EXPECT_EQ(b_.sandbox.waitForToolCalls(2).size(), 2u);  // qmadmin start, twice

  // A's check applies B's publication; its volume files are already current.
  std::uint32_t mask = 0;
  ASSERT_EQ(check(a_, nullptr, &mask), 0);
  EXPECT_EQ(mask, kChangeApplied);
  expectVolumesAsPublished(a_, kUUIDA, record);
  EXPECT_EQ(*a_.local().findString("sanRevision"), *g.findString("revision"));
  EXPECT_EQ(a_.sandbox.readFile(kVorn + "fsnameservers"), "10.1.2.3\n10.1.2.4\n");

  // A rebuild on A keeps B: nothing to publish.
  ASSERT_EQ(buildOnA(), 0);
  EXPECT_EQ(*published().find("globals")->findString("revision"), *g.findString("revision"));
}

}  // namespace
}  // namespace kolt::testing
