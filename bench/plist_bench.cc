// Throughput of the property-list codec on the documents kolt handles: a
// local configuration document and SAN configurations of 10, 100 and 1000
// volumes. scripts/bench runs this beside Python's plistlib on the same
// files and prints the ratios.
//
//   plist_bench --generate DIR     write DIR/<name>.xml for every document
//   plist_bench --plist_dir=DIR    measure on DIR's files (and on
//                                  DIR/<name>.binary where plistlib wrote one)
//
// Without --plist_dir it generates the documents in memory and measures the
// XML codec only. Besides time, "tree_per_xml_byte" counts the heap that a
// parsed tree holds per byte of its XML (mallinfo2 before and after).
#include <benchmark/benchmark.h>
#include <malloc.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "kolt/error.h"
#include "kolt/plist.h"

namespace {

using kolt::Value;

// Deterministic pseudo-random numbers so every run measures the same bytes.
class Rng {
 public:
  explicit Rng(std::uint64_t seed) : state_(seed * 0x9E3779B97F4A7C15ull + 1) {}
  std::uint64_t next() {
    state_ ^= state_ << 13;
    state_ ^= state_ >> 7;
    state_ ^= state_ << 17;
    return state_;
  }
  std::int64_t below(std::int64_t n) { return static_cast<std::int64_t>(next() % n); }
  std::string uuid() {
    static const char kHex[] = "0123456789ABCDEF";
    std::string s;
    for (int i = 0; i < 32; ++i) {
      if (i == 8 || i == 12 || i == 16 || i == 20) s += '-';
      s += kHex[next() & 15];
    }
    return s;
  }
  std::string address() {
    return "10." + std::to_string(below(256)) + "." + std::to_string(below(256)) + "." +
           std::to_string(1 + below(254));
  }

 private:
  std::uint64_t state_;
};

Value strings(std::initializer_list<std::string> items) {
  Value a = Value::array();
  for (const std::string& s : items) a.asArray()->push_back(Value(s));
  return a;
}

Value localDocument() {
  Rng r(1);
  Value doc = Value::dictionary();
  doc.set("sanName", "Production SAN");
  doc.set("sanUUID", r.uuid());
  doc.set("sanState", "active");
  doc.set("role", "CONTROLLER");
  doc.set("vornAddr", "10.20.0.11");
  doc.set("sanConfigURLs",
          strings({"ldap://10.20.0.11", "ldap://10.20.0.12", "ldap://10.20.0.13"}));
  doc.set("sanAuthMethod", "auth_secret");
  Value ipMap = Value::dictionary();
  for (int i = 0; i < 4; ++i) {
    ipMap.set("10.20.0." + std::to_string(11 + i), "mdc" + std::to_string(i + 1) + ".example.com");
  }
  doc.set("controllerIPMap", ipMap);
  doc.set("sanRevision", r.uuid());
  doc.set("certSetRevision", r.uuid());
  Value notifications = Value::dictionary();
  notifications.set("enabled", Value::boolean(true));
  notifications.set("recipients", strings({"storage-admins@example.com", "oncall@example.com"}));
  notifications.set("events", strings({"volumeFailover", "controllerDown", "diskFull",
                                       "licenseExpiring", "quotaExceeded"}));
  notifications.set("smtpServer", "smtp.example.com");
  notifications.set("smtpPort", Value::integer(587));
  doc.set("notifications", notifications);
  doc.set("ownerName", "Storage Operations");
  doc.set("ownerEmail", "storage-admins@example.com");
  doc.set("desiredSearchPolicy", Value::integer(1));
  doc.set("migratedVersion", Value::integer(2));
  doc.set("enableQuerixServer", Value::boolean(false));
  doc.set("querixServerVolumeList", strings({"Projects", "Archive", "Scratch"}));
  return doc;
}

// A volume's configuration: about 60 keys, among them arrays of small
// dictionaries (stripe groups with their disks, disk types).
Value volumeConfig(Rng& r, int volume) {
  Value c = Value::dictionary();
  const std::string name = "Volume" + std::to_string(volume);
  c.set("fsName", name);
  c.set("fsBlockSize", Value::integer(4096));
  c.set("journalSize", "64M");
  c.set("bufferCacheSize", "256M");
  c.set("inodeCacheSize", Value::integer(131072));
  c.set("threadPoolSize", Value::integer(32 + r.below(96)));
  c.set("maxConnections", Value::integer(128));
  c.set("allocationStrategy", "Round");
  c.set("fileLocks", Value::boolean(true));
  c.set("quotas", Value::boolean(r.below(2) == 1));
  c.set("windowsSecurity", Value::boolean(false));
  c.set("enforceACLs", Value::boolean(true));
  c.set("caseInsensitive", Value::boolean(false));
  c.set("globalSuperUser", Value::boolean(true));
  c.set("unixIdMapping", "none");
  c.set("unixNobodyUidOnWindows", Value::integer(60001));
  c.set("unixNobodyGidOnWindows", Value::integer(60001));
  c.set("unixFileCreationModeOnWindows", Value::integer(0644));
  c.set("unixDirectoryCreationModeOnWindows", Value::integer(0755));
  c.set("inodeExpandMin", Value::integer(8));
  c.set("inodeExpandInc", Value::integer(4));
  c.set("inodeExpandMax", Value::integer(2048));
  c.set("reservedSpace", Value::boolean(true));
  c.set("stripeAlignSize", Value::integer(0));
  c.set("metadataArchive", Value::boolean(true));
  c.set("metadataArchiveDays", Value::integer(30));
  c.set("auditLogging", Value::boolean(false));
  c.set("eventFiles", Value::boolean(true));
  c.set("fsCapacity", Value::integer((r.below(64) + 1) * 1099511627776ll));
  c.set("fsCreated", Value::date(600000000.0 + static_cast<double>(r.below(100000000))));
  c.set("fsUUID", r.uuid());
  c.set("fsDescription", "Shared storage for team " + std::to_string(volume % 17));
  c.set("debugLevel", "0x0");
  c.set("ioHangLimitSecs", Value::integer(180));
  c.set("forcePerfectFit", Value::boolean(false));
  c.set("opHangLimitSecs", Value::integer(180));
  c.set("haFsType", "HaUnmanaged");
  c.set("trimOnClose", Value::integer(0));
  c.set("restoreJournal", Value::boolean(false));
  c.set("restoreJournalDir", "/Library/Logs/Vorn/" + name);
  c.set("restoreJournalMaxHours", Value::integer(0));
  c.set("restoreJournalMaxMB", Value::integer(0));
  c.set("storageManager", Value::boolean(false));
  c.set("namedStreams", Value::boolean(true));
  c.set("fileLockResyncTimeOut", Value::integer(20));
  c.set("maxLogSize", "10M");
  c.set("maxLogs", Value::integer(4));
  c.set("affinityPreference", Value::boolean(false));
  c.set("useL2BufferCache", Value::boolean(true));
  c.set("renameTracking", Value::boolean(false));
  c.set("metadataRatio", Value::real(0.05 + static_cast<double>(r.below(100)) / 1000.0));
  Value types = Value::array();
  for (int t = 0; t < 2; ++t) {
    Value dt = Value::dictionary();
    dt.set("name", t == 0 ? "MetaDataAndJournal" : "DataDisk");
    dt.set("sectors", Value::integer(t == 0 ? 2097152 : 1953525168));
    dt.set("sectorSize", Value::integer(512));
    types.asArray()->push_back(dt);
  }
  c.set("diskTypes", types);
  Value groups = Value::array();
  for (int g = 0; g < 3; ++g) {
    Value sg = Value::dictionary();
    sg.set("name", g == 0 ? "MetadataAndJournal" : "Data" + std::to_string(g));
    sg.set("status", "up");
    sg.set("metadata", Value::boolean(g == 0));
    sg.set("journal", Value::boolean(g == 0));
    sg.set("read", Value::boolean(true));
    sg.set("write", Value::boolean(true));
    sg.set("stripeBreadth", Value::integer(g == 0 ? 16 : 256));
    sg.set("multiPathMethod", "Rotate");
    Value disks = Value::array();
    for (int d = 0; d < 4; ++d) {
      Value disk = Value::dictionary();
      disk.set("name",
               "LUN_" + std::to_string(volume) + "_" + std::to_string(g) + "_" + std::to_string(d));
      disk.set("type", g == 0 ? "MetaDataAndJournal" : "DataDisk");
      disk.set("serial", r.uuid().substr(0, 18));
      disks.asArray()->push_back(disk);
    }
    sg.set("disks", disks);
    groups.asArray()->push_back(sg);
  }
  c.set("stripeGroups", groups);
  c.set("affinities", strings({"fast", "archive"}));
  c.set("clientAccess", strings({"10.20.0.0/16", "10.30.0.0/16"}));
  return c;
}

Value sanConfiguration(int volumes) {
  Rng r(static_cast<std::uint64_t>(volumes) + 7);
  std::vector<std::string> controllers;
  for (int i = 0; i < 8; ++i) controllers.push_back(r.uuid());
  Value globals = Value::dictionary();
  globals.set("revision", r.uuid());
  globals.set("certSetRevision", r.uuid());
  globals.set("sanName", "Production SAN");
  globals.set("sanUUID", r.uuid());
  globals.set("sanState", "active");
  globals.set("sanConfigURLs", strings({"ldap://10.20.0.11", "ldap://10.20.0.12"}));
  globals.set("sanAuthMethod", "auth_secret");
  globals.set("sanJoinURL", "https://mdc1.example.com:311/join");
  globals.set("sharedSecret", "s3cr3t-" + r.uuid());
  globals.set("fsports", "# ports\nfsmpm 49152\nfsm 49153-49999\n");
  globals.set("ownerName", "Storage Operations");
  globals.set("ownerEmail", "storage-admins@example.com");
  globals.set("desiredSearchPolicy", Value::integer(1));
  Value notifications = Value::dictionary();
  notifications.set("enabled", Value::boolean(true));
  notifications.set("recipients", strings({"storage-admins@example.com"}));
  globals.set("notifications", notifications);
  globals.set("aliasControllers", strings({r.uuid()}));
  globals.set("primaryZombie", controllers[0]);
  globals.set("licenseSerial", "VRN-" + r.uuid().substr(0, 13));
  globals.set("maxClients", Value::integer(512));
  globals.set("createdBy", "kolt bench");
  Value table = Value::dictionary();
  Value nameServers = Value::array();
  for (int i = 0; i < 8; ++i) {
    Value entry = Value::dictionary();
    entry.set("hostName", "mdc" + std::to_string(i + 1) + ".example.com");
    entry.set("IPAddress", "10.20.0." + std::to_string(11 + i));
    table.set(controllers[static_cast<std::size_t>(i)], entry);
    Value ns = Value::dictionary();
    ns.set("addr", "10.20.0." + std::to_string(11 + i));
    ns.set("uuid", controllers[static_cast<std::size_t>(i)]);
    nameServers.asArray()->push_back(ns);
  }
  globals.set("controllers", table);
  globals.set("fsnameservers", nameServers);

  Value vols = Value::dictionary();
  for (int v = 0; v < volumes; ++v) {
    Value entry = Value::dictionary();
    entry.set("config", volumeConfig(r, v));
    entry.set("mtime", Value::date(700000000.0 + static_cast<double>(r.below(50000000))));
    entry.set("controllers", strings({controllers[static_cast<std::size_t>(v % 8)],
                                      controllers[static_cast<std::size_t>((v + 1) % 8)]}));
    vols.set("Volume" + std::to_string(v), entry);
  }
  Value doc = Value::dictionary();
  doc.set("globals", globals);
  doc.set("volumes", vols);
  return doc;
}

struct Document {
  std::string name;
  std::string xml;
  std::string binary;  // written by plistlib, when present
};

std::vector<Document> generate() {
  std::vector<Document> docs;
  docs.push_back({"local", *kolt::writeXmlPropertyList(localDocument()), ""});
  for (int n : {10, 100, 1000}) {
    docs.push_back(
        {"san" + std::to_string(n), *kolt::writeXmlPropertyList(sanConfiguration(n)), ""});
  }
  return docs;
}

std::string readFile(const std::filesystem::path& p) {
  std::ifstream in(p, std::ios::binary);
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

std::size_t heapInUse() {
  const struct mallinfo2 m = mallinfo2();
  return m.uordblks + m.hblkhd;
}

void parseXml(benchmark::State& state, const Document* doc) {
  for (auto _ : state) {
    std::optional<Value> v = kolt::parsePropertyList(doc->xml);
    if (!v) state.SkipWithError("parse failed");
    benchmark::DoNotOptimize(v);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * doc->xml.size()));
  // The heap the tree holds, per byte of XML.
  const std::size_t before = heapInUse();
  std::optional<Value> held = kolt::parsePropertyList(doc->xml);
  const std::size_t after = heapInUse();
  state.counters["xml_bytes"] = static_cast<double>(doc->xml.size());
  state.counters["tree_per_xml_byte"] =
      static_cast<double>(after - before) / static_cast<double>(doc->xml.size());
}

void writeXml(benchmark::State& state, const Document* doc) {
  const Value value = *kolt::parsePropertyList(doc->xml);
  for (auto _ : state) {
    std::optional<std::string> xml = kolt::writeXmlPropertyList(value);
    benchmark::DoNotOptimize(xml);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * doc->xml.size()));
}

void readBinary(benchmark::State& state, const Document* doc) {
  for (auto _ : state) {
    std::optional<Value> v = kolt::parsePropertyList(doc->binary);
    if (!v) state.SkipWithError("parse failed");
    benchmark::DoNotOptimize(v);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * doc->binary.size()));
}

}  // namespace

int main(int argc, char** argv) {
  std::string dir;
  std::vector<char*> rest;
  for (int i = 0; i < argc; ++i) {
    if (std::strcmp(argv[i], "--generate") == 0 && i + 1 < argc) {
      const std::filesystem::path out = argv[i + 1];
      std::filesystem::create_directories(out);
      for (const Document& d : generate()) {
        std::ofstream(out / (d.name + ".xml"), std::ios::binary) << d.xml;
        std::printf("%s.xml %zu bytes\n", d.name.c_str(), d.xml.size());
      }
      return 0;
    }
    if (std::strncmp(argv[i], "--plist_dir=", 12) == 0) {
      dir = argv[i] + 12;
    } else {
      rest.push_back(argv[i]);
    }
  }

  static std::vector<Document> docs;
  if (dir.empty()) {
    docs = generate();
  } else {
    for (const char* name : {"local", "san10", "san100", "san1000"}) {
      Document d{name, readFile(std::filesystem::path(dir) / (std::string(name) + ".xml")), ""};
      const std::filesystem::path binary = std::filesystem::path(dir) / (d.name + ".binary");
      if (std::filesystem::exists(binary)) d.binary = readFile(binary);
      if (!d.xml.empty()) docs.push_back(std::move(d));
    }
  }
  for (const Document& d : docs) {
    benchmark::RegisterBenchmark(("xml_parse/" + d.name).c_str(), parseXml, &d);
    benchmark::RegisterBenchmark(("xml_write/" + d.name).c_str(), writeXml, &d);
    if (!d.binary.empty()) {
      benchmark::RegisterBenchmark(("binary_read/" + d.name).c_str(), readBinary, &d);
    }
  }
  int count = static_cast<int>(rest.size());
  benchmark::Initialize(&count, rest.data());
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
