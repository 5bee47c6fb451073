// The controller-side build and the way from an edit to its application.
//
//   BM_BuildNothingChanged/<n>        a build on a controller hosting n volumes
//                                     (".cfgp" files, no source to convert)
//                                     whose record is current: nothing is
//                                     published. Against a private slapd over
//                                     the controller's ldapi socket.
//   BM_BuildNothingChangedMemory/<n>  the same against the in-memory directory:
//                                     the library's own share.
//   BM_EditToAppliedCheck/<n>         an administrator's edit of one volume's
//                                     ".cfg" on controller A, A's build (convert
//                                     and publish), then the check of member B
//                                     (a second controller hosting every
//                                     volume), until B's ".cfgp" holds the edit.
//
// scripts/bench (section "build") prints the times and the ratio of the
// 1000-volume build to the 100-volume build (target: under 10).
#include <benchmark/benchmark.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "fixtures/memory_directory_env.h"
#include "fixtures/sandbox.h"
#include "fixtures/slapd.h"
#include "kolt/build.h"
#include "kolt/change_check.h"
#include "kolt/controller_helpers.h"
#include "kolt/local_config.h"
#include "kolt/log.h"

namespace {

namespace fs = std::filesystem;
using kolt::Env;
using kolt::ScopedEnv;
using kolt::Value;
using kolt::testing::Sandbox;
using kolt::testing::Slapd;

const std::string kVorn = "/Library/Preferences/Vorn/";
const std::string kLocalNode = "ldapi://%2Fvar%2Frun%2Fldapi";
constexpr const char* kSecret = "bench-Secret-42";
constexpr double kSourceDate = 700000000;  // whole seconds

std::string readHostFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

std::string volumeName(int i) {
  char name[16];
  std::snprintf(name, sizeof name, "Vol%04d", i);
  return name;
}

// A source in the converter's text form; `connections` tells versions apart.
std::string cfgSource(int connections) {
  std::string text =
      readHostFile(fs::path(KOLT_SOURCE_DIR) / "tests/fixtures/volumes/Projects.cfg");
  const std::string key = "MaxConnections      128";
  text.replace(text.find(key), key.size(), "MaxConnections      " + std::to_string(connections));
  // The converter checks the Volume key against the name it is given.
  text.replace(text.find("Volume              Projects"), 28, "");
  return text;
}

// A machine root with its identity, its tools and a controller's files.
struct Host {
  Host(const std::string& uuid, const std::string& name, const std::string& address) {
    sandbox.setHardwareUUID(uuid);
    sandbox.setHostName(name);
    fs::copy_file(fs::path(KOLT_BINARY_DIR) / "pdcfgconvert",
                  sandbox.hostPath(std::string(kolt::testing::kToolDirectory) + "pdcfgconvert"));
    sandbox.installTool("qmadmin");
    Value doc;
    doc.set("role", "CONTROLLER");
    doc.set("sanName", "Bench SAN");
    doc.set("sanUUID", "8C1D2E3F-0000-4000-8000-00000000BE0C");
    doc.set("sanState", "active");
    doc.set("vornAddr", address);
    sandbox.writeFile(kVorn + "config.plist", *kolt::writeXmlPropertyList(doc));
    sandbox.writeFile(kVorn + ".auth_secret", kSecret, 0600);
    sandbox.writeFile(kVorn + "fsports", "MinPort 2000\n");
    sandbox.writeFile(kVorn + "fsnameservers", address + "\n");
  }
  // `n` hosted volumes, each with a ".cfgp" converted from the sample.
  void hostVolumes(int n, const std::string& cfgp) {
    std::string fsmlist;
    for (int i = 0; i < n; ++i) {
      fsmlist += volumeName(i) + " . 0\n";
      sandbox.writeFile(kVorn + volumeName(i) + ".cfgp", cfgp);
      sandbox.setModificationTime(kVorn + volumeName(i) + ".cfgp", kSourceDate);
    }
    sandbox.writeFile(kVorn + "fsmlist", fsmlist);
  }
  Sandbox sandbox;
};

// The sample converted once, as a ".cfgp" holds it.
const std::string& sampleCfgp() {
  static const std::string text = [] {
    Sandbox scratch;
    fs::copy_file(fs::path(KOLT_BINARY_DIR) / "pdcfgconvert",
                  scratch.hostPath(std::string(kolt::testing::kToolDirectory) + "pdcfgconvert"));
    scratch.writeFile(kVorn + "S.cfg", cfgSource(128));
    kolt::ProcessSpec spec;
    spec.executable = std::string(kolt::testing::kToolDirectory) + "pdcfgconvert";
    spec.arguments = {"-n", "S", "-F", "plist", "/Library/Preferences/Vorn//S.cfg"};
    spec.standardOutput = kolt::StreamSpec::pipe();
    kolt::ProcessResult result;
    if (scratch.env().runProcess(spec, true, &result) != 0 || result.exitStatus != 0) {
      throw std::runtime_error("pdcfgconvert failed on the sample");
    }
    return result.output;
  }();
  return text;
}

int build(const std::string& node, const std::string* user = nullptr,
          const std::string* password = nullptr) {
  kolt::ErrorSlot error;
  const int rc = kolt::buildSanConfig(&node, user, password, &error);
  if (rc != 0) throw std::runtime_error("build failed: " + (error ? error->printed() : ""));
  return rc;
}

std::string revision(Host& host) {
  ScopedEnv use(&host.sandbox.env());
  return *kolt::loadConfigPlist()->findString("sanRevision");
}

// Every world lives for the whole run (Google Benchmark calls a benchmark
// several times while it settles its iteration count) and is destroyed newest
// first, since each root restores the Env that was current before it.
struct World {
  virtual ~World() = default;
};

std::vector<std::unique_ptr<World>>& worlds() {
  static std::vector<std::unique_ptr<World>> all;
  return all;
}

template <typename T>
T& keep(std::unique_ptr<T> world) {
  T& kept = *world;
  worlds().push_back(std::move(world));
  return kept;
}

// A controller with n volumes whose record is published and current, against
// slapd (over its ldapi socket) or the in-memory directory.
struct BuildWorld : World {
  BuildWorld(int n, bool memory)
      : controller("A0A0A0A0-1111-4222-8333-444444444444", "ctrl-a", "10.1.2.3") {
    controller.hostVolumes(n, sampleCfgp());
    if (memory) {
      memoryEnv = std::make_unique<kolt::testing::MemoryDirectoryEnv>(
          &controller.sandbox.env(), kolt::MemoryDirectory::create());
      env = memoryEnv.get();
    } else {
      kolt::testing::SlapdOptions options;
      options.ldapiSocketPath = controller.sandbox.hostPath("/var/run/ldapi");
      std::string error;
      slapd = Slapd::start(options, &error);
      if (!slapd) throw std::runtime_error("slapd: " + error);
      env = &controller.sandbox.env();
    }
    ScopedEnv use(env);
    build(kLocalNode);
    published = revision(controller);
  }
  Host controller;
  std::unique_ptr<Slapd> slapd;
  std::unique_ptr<kolt::testing::MemoryDirectoryEnv> memoryEnv;
  Env* env = nullptr;
  std::string published;
};

BuildWorld& world(int n, bool memory) {
  static std::map<std::pair<int, bool>, BuildWorld*> byKey;
  BuildWorld*& w = byKey[{n, memory}];
  if (w == nullptr) w = &keep(std::make_unique<BuildWorld>(n, memory));
  return *w;
}

void runNothingChanged(benchmark::State& state, bool memory) {
  BuildWorld& w = world(static_cast<int>(state.range(0)), memory);
  ScopedEnv use(w.env);
  for (auto _ : state) build(kLocalNode);
  if (revision(w.controller) != w.published) state.SkipWithError("a build published");
  state.counters["volumes"] = static_cast<double>(state.range(0));
}

void BM_BuildNothingChanged(benchmark::State& state) {
  runNothingChanged(state, false);
}
void BM_BuildNothingChangedMemory(benchmark::State& state) {
  runNothingChanged(state, true);
}

// Controller A and member B (a second controller, so it hosts every volume)
// on one slapd; A edits Vol0000's ".cfg".
struct EditWorld : World {
  explicit EditWorld(int n)
      : a("A0A0A0A0-1111-4222-8333-444444444444", "ctrl-a", "10.1.2.3"),
        b("B0B0B0B0-1111-4222-8333-444444444444", "ctrl-b", "10.1.2.4") {
    a.hostVolumes(n, sampleCfgp());
    kolt::testing::SlapdOptions options;
    options.ldapiSocketPath = a.sandbox.hostPath("/var/run/ldapi");
    std::string error;
    slapd = Slapd::start(options, &error);
    if (!slapd) throw std::runtime_error("slapd: " + error);
    for (Host* h : {&a, &b}) {
      Value doc = *kolt::parsePropertyList(*h->sandbox.readFile(kVorn + "config.plist"));
      doc.set("sanConfigURLs", Value(kolt::Array{Value(slapd->ldapUrl())}));
      h->sandbox.writeFile(kVorn + "config.plist", *kolt::writeXmlPropertyList(doc));
    }
    b.sandbox.writeFile(kVorn + "fsnameservers", "10.1.2.3\n10.1.2.4\n");
    {
      ScopedEnv use(&a.sandbox.env());
      build(kLocalNode);
    }
    {
      // B joins: a new controller takes every volume and writes its files.
      ScopedEnv use(&b.sandbox.env());
      const std::string admin = slapd->adminName(), password = slapd->adminPassword();
      build(slapd->ldapUrl(), &admin, &password);
      b.sandbox.waitForToolCalls(static_cast<std::size_t>(n));
    }
    {
      ScopedEnv use(&a.sandbox.env());
      std::uint32_t mask = 0;
      kolt::checkSanConfigChange(&mask, nullptr);
    }
  }
  Host a;
  Host b;
  std::unique_ptr<Slapd> slapd;
  int edits = 0;
};

EditWorld& editWorld(int n) {
  static std::map<int, EditWorld*> byN;
  EditWorld*& w = byN[n];
  if (w == nullptr) w = &keep(std::make_unique<EditWorld>(n));
  return *w;
}

void BM_EditToAppliedCheck(benchmark::State& state) {
  EditWorld& w = editWorld(static_cast<int>(state.range(0)));
  const std::string volume = volumeName(0);
  for (auto _ : state) {
    const int connections = 200 + (++w.edits);
    state.PauseTiming();
    const std::string source = cfgSource(connections);
    state.ResumeTiming();
    {
      ScopedEnv use(&w.a.sandbox.env());
      // The record keeps whole seconds: each edit is a second later.
      w.a.sandbox.writeFile(kVorn + volume + ".cfg", source);
      w.a.sandbox.setModificationTime(kVorn + volume + ".cfg", kSourceDate + w.edits);
      build(kLocalNode);
    }
    std::uint32_t mask = 0;
    {
      ScopedEnv use(&w.b.sandbox.env());
      if (kolt::checkSanConfigChange(&mask, nullptr) != 0 || mask != kolt::kChangeApplied) {
        state.SkipWithError("the member's check did not apply the edit");
        break;
      }
    }
    state.PauseTiming();
    const std::string applied = w.b.sandbox.readFile(kVorn + volume + ".cfgp").value_or("");
    if (applied.find("<integer>" + std::to_string(connections) + "</integer>") ==
        std::string::npos) {
      state.SkipWithError("the member's .cfgp does not hold the edit");
      break;
    }
    state.ResumeTiming();
  }
  state.counters["volumes"] = static_cast<double>(state.range(0));
}

void discardLogLine(int, const char*, void*) {}

}  // namespace

BENCHMARK(BM_BuildNothingChanged)->Arg(10)->Arg(100)->Arg(1000)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_BuildNothingChangedMemory)
    ->Arg(10)
    ->Arg(100)
    ->Arg(1000)
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_EditToAppliedCheck)->Arg(2)->Arg(100)->Unit(benchmark::kMillisecond);

int main(int argc, char** argv) {
  // The build logs the whole record; an embedding daemon routes its lines,
  // the benchmark drops them (they are still formatted).
  kolt_set_log_handler(discardLogLine, nullptr);
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  int status = 0;
  try {
    benchmark::RunSpecifiedBenchmarks();
  } catch (const std::exception& e) {
    std::fprintf(stderr, "build_bench: %s\n", e.what());
    status = 1;
  }
  benchmark::Shutdown();
  while (!worlds().empty()) worlds().pop_back();
  kolt::setCurrentEnv(nullptr);
  return status;
}
