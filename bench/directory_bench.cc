// Reading a SAN's configuration from a private slapd: kolt's getVornConfig
// (open the node, set the SAN user's credentials, read and parse the record)
// against a raw libldap client doing the least a reader can (initialize,
// simple bind, search, take the attribute with ldap_get_attribute_ber). Each
// read uses a fresh connection, as a member does at every check. Both run
// against the same server in one process; the ratios ours / raw are printed
// at the end. A third read adds kolt's property-list parse to the raw read,
// to tell the client's cost from the parser's.
//
//   directory_bench [--benchmark_...]
#include <ldap.h>
#include <stdlib.h>

#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "fixtures/slapd.h"
#include "kolt/directory_records.h"
#include "kolt/env.h"
#include "kolt/plist.h"

namespace {

using kolt::Value;
using kolt::testing::Slapd;

// The configuration sizes measured.
constexpr std::int64_t kSizes[] = {2 * 1024, 100 * 1024, 2 * 1024 * 1024};

struct World {
  std::unique_ptr<Slapd> slapd;
  std::string root;
  std::unique_ptr<kolt::Env> env;
  std::map<std::int64_t, std::string> sanBySize;
  std::map<std::int64_t, std::size_t> storedBytes;
};
World* world = nullptr;

std::string secretFor(const std::string& san) {
  return "bench-secret-" + san;
}

std::string uuidFor(int i) {
  char text[40];
  std::snprintf(text, sizeof text, "6B29FC40-CA47-1067-B31D-%012X", 0xDD0106u + i);
  return text;
}

// A volume as a controller publishes it: its parsed configuration (globals
// and stripe groups with their disks), the file's date and its controllers.
// A negative disk count gives the smallest volume: a few settings and one
// stripe group of one disk.
Value makeVolume(int index, int disks) {
  const bool compact = disks < 0;
  Value globals = Value::dictionary();
  globals.set("fsBlockSize", Value::integer(16384));
  globals.set("journalSize", "16M");
  globals.set("allocationStrategy", "Round");
  if (compact) {
    Value group = Value::dictionary();
    group.set("name", "All");
    Value disk = Value::dictionary();
    disk.set("name", "vol" + std::to_string(index) + "_d0");
    disk.set("sectors", Value::integer(3907029168LL));
    group.set("disks", kolt::Array{disk});
    Value config = Value::dictionary();
    config.set("globals", std::move(globals));
    config.set("stripeGroups", kolt::Array{group});
    Value volume = Value::dictionary();
    volume.set("config", std::move(config));
    volume.set("mtime", Value::date(7.5e8 + index));
    volume.set("controllers", kolt::Array{Value(uuidFor(0))});
    return volume;
  }
  globals.set("bufferCacheSize", "64M");
  globals.set("inodeCacheSize", Value::integer(32768));
  globals.set("maxConnections", Value::integer(128));
  globals.set("quotas", Value::boolean(false));
  globals.set("fileLocks", Value::boolean(true));
  globals.set("globalSuperUser", Value::boolean(true));
  globals.set("windowsSecurity", Value::boolean(false));
  globals.set("threadPoolSize", Value::integer(256));
  globals.set("forcePerfectFit", Value::boolean(false));
  globals.set("unixDirectoryCreationModeOnWindows", Value::integer(0755));
  globals.set("debug", "0x0");
  Value groups = Value::array();
  for (int g = 0; g < 2; ++g) {
    Value group = Value::dictionary();
    group.set("name", g == 0 ? "MetadataAndJournal" : "Data" + std::to_string(index));
    group.set("status", "Up");
    group.set("metadata", Value::boolean(g == 0));
    group.set("journal", Value::boolean(g == 0));
    group.set("exclusive", Value::boolean(g == 0));
    group.set("stripeBreadth", Value::integer(g == 0 ? 256 : 1024));
    group.set("read", Value::boolean(true));
    group.set("write", Value::boolean(true));
    Value list = Value::array();
    const int count = g == 0 ? 1 : disks;
    for (int d = 0; d < count; ++d) {
      Value disk = Value::dictionary();
      disk.set("name",
               "vol" + std::to_string(index) + "_g" + std::to_string(g) + "_d" + std::to_string(d));
      disk.set("type", g == 0 ? "MetaDrive" : "DataDrive");
      disk.set("serial", "6001-" + std::to_string(100000 + index * 97 + d));
      disk.set("sectors", Value::integer(3907029168LL + d));
      disk.set("sectorSize", Value::integer(512));
      list.asArray()->push_back(std::move(disk));
    }
    group.set("disks", std::move(list));
    groups.asArray()->push_back(std::move(group));
  }
  Value config = Value::dictionary();
  config.set("globals", std::move(globals));
  config.set("stripeGroups", std::move(groups));
  Value volume = Value::dictionary();
  volume.set("config", std::move(config));
  volume.set("mtime", Value::date(7.5e8 + index));
  volume.set("controllers", kolt::Array{Value(uuidFor(0)), Value(uuidFor(1))});
  return volume;
}

std::size_t xmlSize(const Value& config) {
  return kolt::writeXmlPropertyList(config, nullptr).value_or("").size();
}

// A Vorn configuration of about `target` bytes of XML: globals of a SAN with
// two controllers, then volumes until the size is reached.
Value makeConfig(const std::string& san, std::size_t target) {
  Value config = kolt::newVornConfig();
  Value& globals = *config.find("globals");
  globals.set("sanName", san);
  globals.set("sharedSecret", secretFor(san));
  globals.set("sanState", "active");
  globals.set("metadataNetwork", "10.0.0.0/24");
  globals.set("fsports", "fsports 49152-65535");
  globals.set("certSetRevision", "0F1E2D3C-4B5A-6978-8796-A5B4C3D2E1F0");
  Value nameServers = Value::array();
  for (int c = 0; c < 2; ++c) {
    Value controller = Value::dictionary();
    controller.set("hostName", "mdc-" + std::to_string(c) + ".example.com");
    controller.set("IPAddress", "10.0.0." + std::to_string(5 + c));
    globals.find("controllers")->set(uuidFor(c), std::move(controller));
    Value server = Value::dictionary();
    server.set("addr", "10.0.0." + std::to_string(5 + c));
    server.set("uuid", uuidFor(c));
    nameServers.asArray()->push_back(std::move(server));
  }
  globals.set("fsnameservers", std::move(nameServers));
  globals.set("sanConfigURLs", kolt::Array{Value("ldap://10.0.0.5"), Value("ldap://10.0.0.6")});
  Value& volumes = *config.find("volumes");
  // Volumes of 24 disks (about 8 KB each) while they fit, then smaller ones.
  // Whole volumes are added on an estimate; only the last few are measured.
  std::size_t size = xmlSize(config);
  int i = 0;
  if (target > size) {
    Value probe = Value::dictionary();
    probe.set("Volume0", makeVolume(0, 24));
    const std::size_t perVolume = xmlSize(probe);
    for (; size + 3 * perVolume < target; ++i, size += perVolume) {
      volumes.set("Volume" + std::to_string(i), makeVolume(i, 24));
    }
  }
  for (int disks = 24; xmlSize(config) < target; ++i) {
    const std::string name = "Volume" + std::to_string(i);
    volumes.set(name, makeVolume(i, disks));
    while (xmlSize(config) > target + target / 4 && disks >= 0) {
      volumes.set(name, makeVolume(i, --disks));
    }
    if (xmlSize(config) > target + target / 4) {
      volumes.erase(name);
      break;
    }
  }
  return config;
}

void setUpWorld() {
  world = new World();
  std::string error;
  world->slapd = Slapd::start({}, &error);
  if (!world->slapd) {
    std::fprintf(stderr, "directory_bench: cannot start slapd: %s\n", error.c_str());
    std::exit(1);
  }
  char tmpl[] = "/tmp/kolt-bench-XXXXXX";
  world->root = ::mkdtemp(tmpl);
  world->env = kolt::newPosixEnv(world->root);
  kolt::ErrorSlot slot;
  auto admin = world->env->openDirectoryNode("/LDAPv3/" + world->slapd->ldapUrl(), &slot);
  if (!admin || !admin->setCredentials(kolt::kRecordTypeUsers, world->slapd->adminName(),
                                       world->slapd->adminPassword(), &slot)) {
    std::fprintf(stderr, "directory_bench: %s\n", slot ? slot->printed().c_str() : "no node");
    std::exit(1);
  }
  for (std::int64_t size : kSizes) {
    const std::string san = "Bench SAN " + std::to_string(size);
    const std::string secret = secretFor(san);
    Value config = makeConfig(san, static_cast<std::size_t>(size));
    if (kolt::createNewVornConfig(*admin, &san, &secret, &slot) != 0 ||
        kolt::saveVornConfig(*admin, config, &san, true, &slot) != 0) {
      std::fprintf(stderr, "directory_bench: storing %s: %s\n", san.c_str(),
                   slot ? slot->printed().c_str() : "failed");
      std::exit(1);
    }
    world->sanBySize[size] = san;
    world->storedBytes[size] = xmlSize(config);
  }
}

void tearDownWorld() {
  world->env.reset();
  world->slapd.reset();
  std::error_code ignored;
  std::filesystem::remove_all(world->root, ignored);
  delete world;
}

// One read through kolt: open the node, bind as the SAN's user, getVornConfig.
bool koltRead(std::int64_t size) {
  const std::string& san = world->sanBySize.at(size);
  kolt::ErrorSlot error;
  auto node = world->env->openDirectoryNode("/LDAPv3/" + world->slapd->ldapUrl(), &error);
  if (!node || !node->setCredentials(kolt::kRecordTypeUsers, kolt::ldapSanUserNameForName(san),
                                     secretFor(san), &error)) {
    return false;
  }
  std::optional<Value> config = kolt::getVornConfig(*node, &san, &error);
  benchmark::DoNotOptimize(config);
  return config.has_value();
}

// What the raw reads add to the least a reader does.
enum RawExtras {
  kBare = 0,
  kParse = 1,    // kolt's property-list parse of the value
  kRootDse = 2,  // a root DSE read before the bind, as a client told only
                 // the server's URL must do to learn the search base
};

// One raw read: initialize, simple bind, one-level search by name, the value
// taken in place with ldap_get_attribute_ber; plus `extras`.
bool rawRead(std::int64_t size, int extras) {
  const bool parse = (extras & kParse) != 0;
  const std::string& san = world->sanBySize.at(size);
  const std::string userDn = Slapd::userDn(kolt::ldapSanUserNameForName(san));
  const std::string secret = secretFor(san);
  const std::string container = std::string("cn=groups,") + Slapd::kBaseDn;
  const std::string filter = "(cn=" + kolt::ldapSanConfNameForName(san) + ")";
  const char* attrs[] = {"vornXMLPlist", nullptr};
  LDAP* ld = nullptr;
  const int version = LDAP_VERSION3;
  berval credentials{static_cast<ber_len_t>(secret.size()), const_cast<char*>(secret.data())};
  LDAPMessage* result = nullptr;
  auto readRootDse = [&] {
    if ((extras & kRootDse) == 0) return true;
    const char* contexts[] = {"namingContexts", nullptr};
    LDAPMessage* dse = nullptr;
    const int rc =
        ldap_search_ext_s(ld, "", LDAP_SCOPE_BASE, "(objectClass=*)", const_cast<char**>(contexts),
                          0, nullptr, nullptr, nullptr, 0, &dse);
    ldap_msgfree(dse);
    return rc == LDAP_SUCCESS;
  };
  bool ok = ldap_initialize(&ld, world->slapd->ldapUrl().c_str()) == LDAP_SUCCESS &&
            ldap_set_option(ld, LDAP_OPT_PROTOCOL_VERSION, &version) == LDAP_OPT_SUCCESS &&
            readRootDse() &&
            ldap_sasl_bind_s(ld, userDn.c_str(), LDAP_SASL_SIMPLE, &credentials, nullptr, nullptr,
                             nullptr) == LDAP_SUCCESS &&
            ldap_search_ext_s(ld, container.c_str(), LDAP_SCOPE_ONELEVEL, filter.c_str(),
                              const_cast<char**>(attrs), 0, nullptr, nullptr, nullptr, 1,
                              &result) == LDAP_SUCCESS;
  LDAPMessage* entry = ok ? ldap_first_entry(ld, result) : nullptr;
  BerElement* ber = nullptr;
  berval dn{0, nullptr}, attr{0, nullptr};
  BerVarray values = nullptr;
  ok = entry != nullptr && ldap_get_dn_ber(ld, entry, &ber, &dn) == LDAP_SUCCESS &&
       ldap_get_attribute_ber(ld, entry, ber, &attr, &values) == LDAP_SUCCESS &&
       values != nullptr && values[0].bv_val != nullptr &&
       values[0].bv_len == world->storedBytes.at(size);
  if (ok && parse) {
    auto config =
        kolt::parsePropertyList(std::string_view(values[0].bv_val, values[0].bv_len), nullptr);
    ok = config.has_value();
    benchmark::DoNotOptimize(config);
  }
  ber_memfree(values);
  ber_free(ber, 0);
  ldap_msgfree(result);
  if (ld != nullptr) ldap_unbind_ext_s(ld, nullptr, nullptr);
  return ok;
}

double median(std::vector<double> v) {
  if (v.empty()) return 0;
  std::sort(v.begin(), v.end());
  return v[v.size() / 2];
}

// The four reads in turn, each timed on its own with the wall clock (the
// server works in another process), rotating which goes first. On a shared
// machine the load drifts over seconds; paired reads see the same load, and
// medians ignore the stalls.
void BM_ReadConfiguration(benchmark::State& state) {
  const std::int64_t size = state.range(0);
  constexpr int kReads = 4;  // kolt, then raw with extras 0, 1 and 3
  const int rawExtras[kReads] = {0, kBare, kParse, kParse | kRootDse};
  std::vector<double> times[kReads];
  int turn = 0;
  for (auto _ : state) {
    for (int k = 0; k < kReads; ++k) {
      const int which = (turn + k) % kReads;
      const auto start = std::chrono::steady_clock::now();
      const bool ok = which == 0 ? koltRead(size) : rawRead(size, rawExtras[which]);
      times[which].push_back(
          std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - start)
              .count());
      if (!ok) state.SkipWithError(which == 0 ? "kolt read failed" : "raw read failed");
    }
    ++turn;
  }
  state.counters["kolt_us"] = median(times[0]);
  state.counters["raw_us"] = median(times[1]);
  state.counters["raw_parse_us"] = median(times[2]);
  state.counters["raw_dse_parse_us"] = median(times[3]);
  state.counters["bytes"] = static_cast<double>(world->storedBytes.at(size));
}
BENCHMARK(BM_ReadConfiguration)
    ->Arg(kSizes[0])
    ->Arg(kSizes[1])
    ->Arg(kSizes[2])
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// Prints as usual, then the ratios from each size's medians.
class RatioReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& run : runs) {
      if (run.error_occurred || run.run_type != Run::RT_Iteration) continue;
      rows_.push_back(run.counters);
    }
  }
  void printRatios() const {
    std::printf(
        "\ngetVornConfig (open node + bind as the SAN's user + read + parse) against raw\n"
        "libldap (initialize + simple bind + search + ldap_get_attribute_ber), a fresh\n"
        "connection each, same slapd, medians of paired runs (wall clock, microseconds).\n"
        "+parse: the raw read parsed by kolt's parser; +dse: the raw client also reads the\n"
        "root DSE first, as one told only the server's URL must.\n");
    std::printf("%10s %9s %9s %9s %13s %9s %12s %16s\n", "xml bytes", "kolt", "raw", "+parse",
                "+dse+parse", "kolt/raw", "kolt/+parse", "kolt/+dse+parse");
    for (const auto& c : rows_) {
      const double ours = c.at("kolt_us"), raw = c.at("raw_us"), rawParse = c.at("raw_parse_us"),
                   rawDse = c.at("raw_dse_parse_us");
      std::printf("%10.0f %9.1f %9.1f %9.1f %13.1f %8.2fx %11.2fx %15.2fx\n", c.at("bytes").value,
                  ours, raw, rawParse, rawDse, ours / raw, ours / rawParse, ours / rawDse);
    }
  }

 private:
  std::vector<benchmark::UserCounters> rows_;
};

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  setUpWorld();
  RatioReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  reporter.printRatios();
  tearDownWorld();
  return 0;
}
