// Cost of a member's change check that finds the published revision
// unchanged (the common case: every member checks, few checks find work),
// against the least any client must do to learn that revision: a raw libldap
// simple bind, one-level search and read of the same configuration record on
// a fresh connection. Configurations of 10, 100 and 1000 volumes on one
// private slapd; scripts/bench prints the ratios ours / raw.
//
// Both sides use a fresh connection per check, as a member does. The raw
// side knows the record's DN and base beforehand; the check finds the base
// in the server's root DSE, as every kolt node does, so a third line, the
// raw read with that exchange added, shows what the exchange costs.
#include <benchmark/benchmark.h>
#include <ldap.h>

#include <cstdio>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "fixtures/sandbox.h"
#include "fixtures/slapd.h"
#include "kolt/change_check.h"
#include "kolt/directory.h"
#include "kolt/directory_records.h"
#include "kolt/local_config.h"
#include "kolt/log.h"
#include "kolt/plist.h"

namespace {

using kolt::Value;

constexpr const char* kSecret = "bench-shared-secret";
constexpr int kSizes[] = {10, 100, 1000};

Value strings(std::initializer_list<const char*> items) {
  Value array = Value::array();
  for (const char* item : items) array.asArray()->emplace_back(item);
  return array;
}

std::string uuidFor(int a, int b) {
  char text[40];
  std::snprintf(text, sizeof text, "%08X-0000-4000-8000-%012X", a, b);
  return text;
}

// A volume's configuration of the size a real one has (about 4 KB of XML).
Value volumeConfig(int volume) {
  Value c;
  const std::string name = "Volume" + std::to_string(volume);
  c.set("fsName", name);
  c.set("fsUUID", uuidFor(volume, 1));
  c.set("fsBlockSize", Value::integer(4096));
  c.set("journalSize", "64M");
  c.set("bufferCacheSize", "256M");
  c.set("inodeCacheSize", Value::integer(131072));
  c.set("threadPoolSize", Value::integer(32 + volume % 96));
  c.set("maxConnections", Value::integer(128));
  c.set("allocationStrategy", "Round");
  c.set("fileLocks", Value::boolean(true));
  c.set("quotas", Value::boolean(volume % 2 == 1));
  c.set("enforceACLs", Value::boolean(true));
  c.set("unixIdMapping", "none");
  c.set("unixNobodyUidOnWindows", Value::integer(60001));
  c.set("inodeExpandMax", Value::integer(2048));
  c.set("metadataArchiveDays", Value::integer(30));
  c.set("fsCapacity", Value::integer((volume % 64 + 1) * 1099511627776ll));
  c.set("fsCreated", Value::date(600000000.0 + volume));
  c.set("fsDescription", "Shared storage for team " + std::to_string(volume % 17));
  c.set("restoreJournalDir", "/Library/Logs/Vorn/" + name);
  c.set("metadataRatio", Value::real(0.05 + (volume % 100) / 1000.0));
  Value groups = Value::array();
  for (int g = 0; g < 3; ++g) {
    Value sg;
    sg.set("name", g == 0 ? "MetadataAndJournal" : "Data" + std::to_string(g));
    sg.set("status", "up");
    sg.set("metadata", Value::boolean(g == 0));
    sg.set("journal", Value::boolean(g == 0));
    sg.set("stripeBreadth", Value::integer(g == 0 ? 16 : 256));
    sg.set("multiPathMethod", "Rotate");
    Value disks = Value::array();
    for (int d = 0; d < 4; ++d) {
      Value disk;
      disk.set("name",
               "LUN_" + std::to_string(volume) + "_" + std::to_string(g) + "_" + std::to_string(d));
      disk.set("type", g == 0 ? "MetaDataAndJournal" : "DataDisk");
      disk.set("serial", uuidFor(volume, g * 16 + d).substr(0, 18));
      disks.asArray()->push_back(std::move(disk));
    }
    sg.set("disks", std::move(disks));
    groups.asArray()->push_back(std::move(sg));
  }
  c.set("stripeGroups", std::move(groups));
  c.set("clientAccess", strings({"10.20.0.0/16", "10.30.0.0/16"}));
  return c;
}

Value sanConfiguration(const std::string& sanName, const std::string& url, int volumeCount) {
  Value globals;
  globals.set("revision", uuidFor(volumeCount, 0xABC));
  globals.set("certSetRevision", uuidFor(volumeCount, 0xCE5));
  globals.set("sanName", sanName);
  globals.set("sanUUID", uuidFor(volumeCount, 0x5A4));
  globals.set("sanState", "active");
  globals.set("sanConfigURLs", strings({url.c_str()}));
  globals.set("sanAuthMethod", "auth_secret");
  globals.set("sharedSecret", kSecret);
  globals.set("fsports", "fsmpm 49152\nfsm 49153-49999\n");
  globals.set("ownerName", "Storage Operations");
  globals.set("ownerEmail", "storage-admins@example.com");
  Value controllers;
  Value nameservers = Value::array();
  for (int i = 0; i < 4; ++i) {
    const std::string address = "10.20.0." + std::to_string(11 + i);
    Value entry;
    entry.set("hostName", "mdc" + std::to_string(i) + ".example.com");
    entry.set("IPAddress", address);
    controllers.set(uuidFor(0xC0, i), entry);
    Value ns;
    ns.set("addr", address);
    ns.set("uuid", uuidFor(0xC0, i));
    nameservers.asArray()->push_back(std::move(ns));
  }
  globals.set("controllers", std::move(controllers));
  globals.set("fsnameservers", std::move(nameservers));
  Value volumes;
  for (int v = 0; v < volumeCount; ++v) {
    Value entry;
    entry.set("config", volumeConfig(v));
    entry.set("mtime", Value::date(700000000.0 + v));
    Value hosts = Value::array();
    hosts.asArray()->emplace_back(uuidFor(0xC0, v % 4));
    entry.set("controllers", std::move(hosts));
    volumes.set("Volume" + std::to_string(v), std::move(entry));
  }
  Value config;
  config.set("globals", std::move(globals));
  config.set("volumes", std::move(volumes));
  return config;
}

// One SAN of `volumeCount` volumes and a member that applied its revision.
struct Case {
  int volumeCount = 0;
  std::string sanName;
  std::string userDn;
  std::string groupName;
  std::size_t xmlBytes = 0;
  std::unique_ptr<kolt::testing::Sandbox> member;
};

kolt::testing::Slapd* server = nullptr;
std::vector<Case>* cases = nullptr;

bool prepare(Case* c) {
  c->sanName = "Bench SAN " + std::to_string(c->volumeCount);
  c->userDn = kolt::testing::Slapd::userDn(kolt::ldapSanUserNameForName(c->sanName));
  c->groupName = kolt::ldapSanConfNameForName(c->sanName);
  c->member = std::make_unique<kolt::testing::Sandbox>();
  kolt::ScopedEnv use(&c->member->env());
  kolt::ErrorSlot error;
  auto node = kolt::currentEnv().openDirectoryNode("/LDAPv3/" + server->ldapUrl(), &error);
  if (!node || !node->setCredentials(kolt::kRecordTypeUsers, server->adminName(),
                                     server->adminPassword(), &error)) {
    std::fprintf(stderr, "admin bind: %s\n", error ? error->printed().c_str() : "?");
    return false;
  }
  const std::string secret = kSecret;
  Value config = sanConfiguration(c->sanName, server->ldapUrl(), c->volumeCount);
  c->xmlBytes = kolt::writeXmlPropertyList(config)->size();
  if (kolt::createNewVornConfig(*node, &c->sanName, &secret, &error) != 0 ||
      kolt::saveVornConfig(*node, config, &c->sanName, false, &error) != 0) {
    std::fprintf(stderr, "publish: %s\n", error ? error->printed().c_str() : "?");
    return false;
  }
  Value document;
  document.set("sanName", c->sanName);
  document.set("sanConfigURLs", strings({server->ldapUrl().c_str()}));
  document.set("role", "CLIENT");
  document.set("sanRevision", uuidFor(c->volumeCount, 0xABC));
  c->member->writeFile("/Library/Preferences/Vorn/.auth_secret", kSecret, 0600);
  return kolt::saveConfigPlist(document);
}

void changeCheckUnchanged(benchmark::State& state, Case* c) {
  kolt::ScopedEnv use(&c->member->env());
  for (auto _ : state) {
    std::uint32_t mask = 0;
    const int rc = kolt::checkSanConfigChange(&mask, nullptr);
    if (rc != 0 || mask != 0) {
      state.SkipWithError("the check did not find the revision unchanged");
      break;
    }
  }
  state.counters["xml_bytes"] = static_cast<double>(c->xmlBytes);
}

// Bind, search and read the record's value; returns its size, or -1.
// `withRootDse`: read the root DSE first.
long rawRead(const Case& c, bool withRootDse) {
  LDAP* ld = nullptr;
  if (ldap_initialize(&ld, server->ldapUrl().c_str()) != LDAP_SUCCESS) return -1;
  const int version = LDAP_VERSION3;
  ldap_set_option(ld, LDAP_OPT_PROTOCOL_VERSION, &version);
  berval password{std::strlen(kSecret), const_cast<char*>(kSecret)};
  long size = -1;
  LDAPMessage* result = nullptr;
  char attribute[] = "vornXMLPlist";
  char* attributes[] = {attribute, nullptr};
  const std::string base = std::string("cn=groups,") + kolt::testing::Slapd::kBaseDn;
  const std::string filter = "(&(objectClass=vornGroup)(cn=" + c.groupName + "))";
  if (withRootDse) {
    // What every kolt node does at opening: learn the search base.
    LDAPMessage* dse = nullptr;
    char namingContexts[] = "namingContexts";
    char* dseAttributes[] = {namingContexts, nullptr};
    ldap_search_ext_s(ld, "", LDAP_SCOPE_BASE, "(objectClass=*)", dseAttributes, 0, nullptr,
                      nullptr, nullptr, 0, &dse);
    ldap_msgfree(dse);
  }
  if (ldap_sasl_bind_s(ld, c.userDn.c_str(), LDAP_SASL_SIMPLE, &password, nullptr, nullptr,
                       nullptr) == LDAP_SUCCESS &&
      ldap_search_ext_s(ld, base.c_str(), LDAP_SCOPE_ONELEVEL, filter.c_str(), attributes, 0,
                        nullptr, nullptr, nullptr, 1, &result) == LDAP_SUCCESS) {
    if (LDAPMessage* entry = ldap_first_entry(ld, result)) {
      if (berval** values = ldap_get_values_len(ld, entry, attribute)) {
        if (values[0] != nullptr) size = static_cast<long>(values[0]->bv_len);
        ldap_value_free_len(values);
      }
    }
  }
  if (result != nullptr) ldap_msgfree(result);
  ldap_unbind_ext_s(ld, nullptr, nullptr);
  return size;
}

void rawLdapRead(benchmark::State& state, Case* c, bool withRootDse) {
  for (auto _ : state) {
    const long size = rawRead(*c, withRootDse);
    if (size <= 0) {
      state.SkipWithError("the raw read failed");
      break;
    }
    benchmark::DoNotOptimize(size);
  }
  state.counters["xml_bytes"] = static_cast<double>(c->xmlBytes);
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  // Lines are formatted as always, then dropped: this machine has no system
  // log daemon, and without one every line would cost a failed connection
  // to /dev/log, which a deployed member does not pay.
  kolt_set_log_handler([](int, const char*, void*) {}, nullptr);
  std::string error;
  std::unique_ptr<kolt::testing::Slapd> slapd = kolt::testing::Slapd::start({}, &error);
  if (!slapd) {
    std::fprintf(stderr, "slapd: %s\n", error.c_str());
    return 1;
  }
  server = slapd.get();
  std::vector<Case> all(std::size(kSizes));
  cases = &all;
  for (std::size_t i = 0; i < all.size(); ++i) {
    all[i].volumeCount = kSizes[i];
    if (!prepare(&all[i])) return 1;
  }
  for (Case& c : all) {
    const std::string size = std::to_string(c.volumeCount);
    benchmark::RegisterBenchmark(("change_check_unchanged/" + size).c_str(), changeCheckUnchanged,
                                 &c)
        ->UseRealTime()
        ->Unit(benchmark::kMillisecond);
    benchmark::RegisterBenchmark(("raw_ldap_read/" + size).c_str(), rawLdapRead, &c, false)
        ->UseRealTime()
        ->Unit(benchmark::kMillisecond);
    benchmark::RegisterBenchmark(("raw_ldap_read_with_root_dse/" + size).c_str(), rawLdapRead, &c,
                                 true)
        ->UseRealTime()
        ->Unit(benchmark::kMillisecond);
  }
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  all.clear();
  return 0;
}
