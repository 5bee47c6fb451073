// kolt's demo: a small Vorn SAN in sandbox roots, published through a private
// directory server.
//
// One metadata controller (mdc1) hosts two volumes; two clients (edit-01,
// edit-02) are members. Each machine has its own root directory standing for
// "/", with its own identity and files, and its own Env. The controller
// builds and publishes the SAN's configuration over the directory server's
// local ldapi socket; the clients trust the server's certificate, join with a
// new configuration document over ldaps://, and later apply what the
// controller republishes after an administrator's edit.
//
//   build/kolt_demo [--verbose]      --verbose also prints kolt's log lines
//
// Exits 0 when every step did what it should, 1 otherwise. Everything it
// starts is stopped and everything it creates is removed before it exits.
#include <signal.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <memory>
#include <mutex>
#include <stdexcept>

#include "demo_machine.h"
#include "demo_report.h"
#include "fixtures/log_capture.h"
#include "fixtures/slapd.h"
#include "kolt/build.h"
#include "kolt/change_check.h"
#include "kolt/controller_helpers.h"
#include "kolt/directory.h"
#include "kolt/directory_records.h"
#include "kolt/log.h"

namespace kolt::demo {
namespace {

constexpr const char* kSanName = "Post Production";
constexpr const char* kSanUUID = "5F1A3C2E-7B44-4E0B-9A51-2C8D0E6F4A10";
constexpr const char* kSecret = "kq7-Vb2r-Wm9x";
constexpr const char* kLocalNode = "ldapi://%2Fvar%2Frun%2Fldapi";

// --- kolt's log lines, shown with --verbose -----------------------------------

struct LogLines {
  std::mutex mutex;
  std::vector<std::string> lines;
};

void collectLogLine(int, const char* line, void* context) {
  auto* log = static_cast<LogLines*>(context);
  std::lock_guard<std::mutex> lock(log->mutex);
  log->lines.emplace_back(line);
}

// --- Interrupts: the demo stops between steps and cleans up ---------------------

volatile std::sig_atomic_t g_interrupted = 0;
void onSignal(int) {
  g_interrupted = 1;
}

// --- The volume sources the administrator writes --------------------------------

std::string projectsCfg(int maxConnections) {
  return "# Projects: the shared project volume.\n"
         "[Global]\n"
         "Volume              Projects\n"
         "FileLocks           yes\n"
         "InodeCacheSize      65536\n"
         "JournalSize         64M\n"
         "BlockSize           16K\n"
         "MaxConnections      " +
         std::to_string(maxConnections) +
         "\n\n"
         "[Disk Meta0]\nSectors 41943040\nSectorSize 512\n\n"
         "[Disk Data0]\nSectors 3906250000\nSectorSize 4096\n\n"
         "[StripeGroup MetaJournal]\nMetadata yes\nJournal yes\nExclusive yes\n"
         "StripeBreadth 64K\nNode Meta0 0\n\n"
         "[StripeGroup Data]\nStripeBreadth 1M\nNode Data0 0\n";
}

const char* kProjectsAuxdata =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
    "\t<key>mountPoint</key>\n\t<string>/Volumes/Projects</string>\n</dict>\n</plist>\n";

const char* kScratchCfgx =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<volumeConfig>\n  <global/>\n"
    "  <disk name=\"Scratch0\"><sectors>1953125000</sectors></disk>\n"
    "  <stripeGroup name=\"All\">\n    <metadata>yes</metadata>\n    <journal>yes</journal>\n"
    "    <node disk=\"Scratch0\" index=\"0\"/>\n  </stripeGroup>\n</volumeConfig>\n";

// --- Small readers of what the machines hold -------------------------------------

std::string text(const Value* v) {
  if (v == nullptr) return "(absent)";
  if (const std::string* s = v->asString()) return *s;
  return v->description();
}

std::string field(const std::optional<Value>& doc, std::string_view key) {
  return doc ? text(doc->find(key)) : "(no document)";
}

std::int64_t maxConnectionsOf(const Value& record) {
  const Value* v = record.find("volumes");
  for (const char* key : {"Projects", "config", "global", "maxConnections"}) {
    v = v ? v->find(key) : nullptr;
  }
  return v && v->asInteger() ? v->asInteger()->bits : -1;
}

// The fsmlist file as a list of names.
std::string fsmlistText(Machine& m) {
  std::optional<std::string> file = m.readFile("fsmlist");
  if (!file) return "(no fsmlist: hosts no volume)";
  std::vector<std::string> names;
  std::size_t start = 0;
  while (start < file->size()) {
    const std::size_t end = file->find('\n', start);
    const std::string line = file->substr(start, end - start);
    names.push_back(line.substr(0, line.find(' ')));
    if (end == std::string::npos) break;
    start = end + 1;
  }
  return joined(names) + "   (file: " + std::to_string(file->size()) + " bytes)";
}

std::string filesText(const FileChanges& changes) {
  std::string out = "wrote " + joined(changes.written);
  if (!changes.removed.empty()) out += "\nremoved " + joined(changes.removed);
  return out;
}

class Demo {
 public:
  explicit Demo(bool verbose) : verbose_(verbose) {}

  int run();

 private:
  // --- Directory access ---------------------------------------------------------
  // The record as the directory's superuser sees it (over mdc1's socket).
  std::optional<Value> publishedRecord() {
    ScopedEnv use(&mdc1_.env());
    ErrorSlot error;
    std::unique_ptr<DirectoryNode> node =
        currentEnv().openDirectoryNode(std::string("/LDAPv3/") + kLocalNode, &error);
    const std::string name = kSanName;
    return node ? getVornConfig(*node, &name, &error) : std::nullopt;
  }
  std::string revisionOf(const std::optional<Value>& record) {
    return record ? buildRevisionStringFromConfig(*record).value_or("(none)") : "(no record)";
  }
  // The server's change stamp of the configuration group: it moves with
  // every write to the entry, and only then.
  std::string entryCSN() {
    std::string out;
    slapd_->search(
        {"-b", testing::Slapd::groupDn(ldapSanConfNameForName(kSanName)), "-s", "base", "entryCSN"},
        &out);
    const std::size_t at = out.find("entryCSN: ");
    if (at == std::string::npos) return "(no entry)";
    return out.substr(at + 10, out.find('\n', at) - at - 10);
  }

  // The demo's name of the machine with this UUID.
  std::string machineName(const std::string& uuid) {
    for (Machine* m : {&mdc1_, &edit1_, &edit2_}) {
      if (m->uuid() == uuid) return m->name();
    }
    return uuid;
  }

 public:
  // The directories the demo created: the machines' roots and the server's.
  std::vector<std::string> temporaryDirectories() const {
    std::vector<std::string> dirs = {mdc1_.root(), edit1_.root(), edit2_.root()};
    if (slapd_) dirs.push_back(slapd_->directory());
    return dirs;
  }

 private:
  // --- Steps --------------------------------------------------------------------
  bool startDirectory();
  void prepareController();
  void build(const std::string& title, bool firstBuild, bool expectPublish);
  void trustCertificates();
  void join(Machine& client);
  void editVolume();
  void checkApplies(Machine& client, const std::string& expectedRevision);
  void checkChangesNothing();
  void stopDirectory();

  void endStep() {
    if (verbose_) {
      std::lock_guard<std::mutex> lock(log_.mutex);
      for (const std::string& l : log_.lines) report_.line("log", l);
    }
    {
      std::lock_guard<std::mutex> lock(log_.mutex);
      log_.lines.clear();
    }
    report_.endStep();
    if (g_interrupted) throw std::runtime_error("interrupted");
  }

  // Declared in this order so that the server stops before the controller's
  // root (which holds its socket) is removed, and each root restores the Env
  // that was current before it.
  Machine mdc1_{"mdc1", "4C0F5A6B-1D2E-4F30-8A41-52B6C7D8E901", "10.0.5.11"};
  Machine edit1_{"edit-01", "9E8D7C6B-5A49-4382-A716-0F1E2D3C4B5A", "10.0.5.21"};
  Machine edit2_{"edit-02", "1A2B3C4D-5E6F-4A1B-8C2D-3E4F5A6B7C8D", "10.0.5.22"};
  std::unique_ptr<testing::Slapd> slapd_;

  bool verbose_;
  Report report_;
  LogLines log_;
  std::string publishedRevision_;
};

bool Demo::startDirectory() {
  report_.step("", "start a private directory server (OpenLDAP slapd)");
  testing::SlapdOptions options;
  // The controller's local directory socket is its "/var/run/ldapi".
  options.ldapiSocketPath = mdc1_.env().hostPath("/var/run/ldapi");
  std::string error;
  report_.took(timed([&] { slapd_ = testing::Slapd::start(options, &error); }));
  report_.check(slapd_ != nullptr, "slapd to start: " + error);
  if (!slapd_) {
    endStep();
    return false;
  }
  report_.line("server", "pid " + std::to_string(slapd_->pid()) + ", base " +
                             testing::Slapd::kBaseDn + ", administrator " + slapd_->adminName());
  report_.line("listens on", slapd_->ldapUrl() + ", " + slapd_->ldapsUrl() + "\nldapi socket " +
                                 slapd_->ldapiSocketPath());
  report_.line("machines", "mdc1     controller  " + mdc1_.uuid() + "  root " + mdc1_.root() +
                               "\nedit-01  client      " + edit1_.uuid() + "  root " +
                               edit1_.root() + "\nedit-02  client      " + edit2_.uuid() +
                               "  root " + edit2_.root());
  endStep();
  return true;
}

void Demo::prepareController() {
  report_.step("mdc1", "the administrator sets up a new controller");
  Value doc;
  doc.set("role", "CONTROLLER");
  doc.set("sanName", kSanName);
  doc.set("sanUUID", kSanUUID);
  doc.set("sanState", "initializing");
  doc.set("metadataNetwork", "10.0.5.0/24");
  doc.set("sanConfigURLs", Value(Array{Value(slapd_->ldapsUrl())}));
  doc.set("sanAuthMethod", "auth_secret");
  doc.set("ownerName", "Post Production IT");
  doc.set("ownerEmail", "san-admin@example.com");
  mdc1_.writeFile("config.plist", *writeXmlPropertyList(doc));
  mdc1_.writeFile(".auth_secret", kSecret, 0600);
  mdc1_.writeFile("fsports", "MinPort 49152\nMaxPort 49407\n");
  mdc1_.writeFile("fsnameservers", "10.0.5.11\n");
  mdc1_.writeFile("fsmlist", "Projects . 0\nScratch . 0\n");
  // The volume sources were written an hour ago.
  const double anHourAgo = std::floor(mdc1_.env().now()) - 3600;
  mdc1_.writeFile("Projects.cfg", projectsCfg(128));
  mdc1_.writeFile("Projects-auxdata.plist", kProjectsAuxdata);
  mdc1_.writeFile("Scratch.cfgx", kScratchCfgx);
  for (const char* name : {"Projects.cfg", "Projects-auxdata.plist", "Scratch.cfgx"}) {
    mdc1_.setModificationTime(name, anHourAgo);
  }
  report_.line("config.plist", "role CONTROLLER, SAN \"" + std::string(kSanName) +
                                   "\", sanState initializing,\nmetadataNetwork 10.0.5.0/24 "
                                   "(no vornAddr yet), sanConfigURLs " +
                                   slapd_->ldapsUrl());
  report_.line("side files",
               ".auth_secret (the SAN's shared secret, mode 0600), fsports, "
               "fsnameservers 10.0.5.11");
  report_.line("volumes", "Projects.cfg + Projects-auxdata.plist, Scratch.cfgx (dated " +
                              dateText(anHourAgo) + ")\nfsmlist hosts Projects, Scratch");
  report_.line("interfaces", "lo 127.0.0.1, en0 10.0.5.11");
  endStep();
}

void Demo::build(const std::string& title, bool firstBuild, bool expectPublish) {
  report_.step("mdc1", title);
  const std::optional<Value> before = publishedRecord();
  const std::string csnBefore = entryCSN();
  const Snapshot filesBefore = mdc1_.snapshot();
  const std::optional<Value> docBefore = mdc1_.localDocument();

  int rc = -1;
  ErrorSlot error;
  std::string stderrText;
  {
    ScopedEnv use(&mdc1_.env());
    testing::StderrCapture stderrCapture;
    report_.took(timed([&] {
      const std::string node = kLocalNode;
      rc = buildSanConfig(&node, nullptr, nullptr, &error);
    }));
    stderrText = stderrCapture.finish();
  }
  const std::optional<Value> after = publishedRecord();
  const std::optional<Value> doc = mdc1_.localDocument();
  const FileChanges files = compareSnapshots(filesBefore, mdc1_.snapshot());
  const std::string revision = revisionOf(after);
  const std::string csnAfter = entryCSN();

  report_.line("call", std::string("buildSanConfig(\"") + kLocalNode + "\", no user, no password)");
  report_.line("result", rc == 0 ? "0 (success)" : std::to_string(rc) + " " + error->printed());
  report_.check(rc == 0, "the build to succeed");
  if (!stderrText.empty()) {
    report_.line("stderr", stderrText.substr(0, stderrText.find_last_not_of('\n') + 1));
  }
  if (firstBuild) {
    report_.line("address", "vornAddr " + field(doc, "vornAddr") +
                                " (the en0 address inside metadataNetwork, which is now removed)");
    report_.check(field(doc, "vornAddr") == "10.0.5.11" && doc->find("metadataNetwork") == nullptr,
                  "vornAddr 10.0.5.11 derived from metadataNetwork");
    report_.line("state", field(docBefore, "sanState") + " -> " + field(doc, "sanState"));
    report_.check(field(doc, "sanState") == "active", "sanState to become active");
  }
  if (expectPublish) {
    report_.line("directory", (before ? "republished: revision " + revisionOf(before) + "\n  -> "
                                      : "created the SAN's records; published revision ") +
                                  revision + "  (entryCSN " + csnAfter + ")");
    report_.check(revision != revisionOf(before) && csnAfter != csnBefore,
                  "a fresh revision to be published");
  } else {
    report_.line("directory",
                 "nothing published: revision " + revision + " and entryCSN unchanged");
    report_.check(revision == revisionOf(before) && csnAfter == csnBefore,
                  "no write to the directory");
  }
  report_.line("sanRevision", field(doc, "sanRevision") + " (stored in config.plist)");
  report_.check(field(doc, "sanRevision") == revision,
                "sanRevision to equal the published revision");
  std::vector<std::string> converted;
  for (const auto& [source, output] :
       {std::pair<std::string, std::string>{"Projects.cfg", "Projects.cfgp"},
        {"Scratch.cfgx", "Scratch.cfgp"}}) {
    if (std::find(files.removed.begin(), files.removed.end(), source) != files.removed.end()) {
      converted.push_back(source + " -> " + output + " (pdcfgconvert, dated as its source)");
    }
  }
  report_.line("converted", joined(converted, "\n"));
  report_.line("files", filesText(files));
  report_.line("fsmlist", fsmlistText(mdc1_));
  report_.line("role", field(doc, "role"));
  if (after) {
    const Value& g = *after->find("globals");
    std::vector<std::string> controllers;
    for (const auto& [uuid, entry] : *g.find("controllers")->asDictionary()) {
      controllers.push_back(text(entry.find("hostName")) + " " + text(entry.find("IPAddress")) +
                            " (" + uuid.substr(0, 8) + "...)");
    }
    report_.line("controllers", joined(controllers));
    std::vector<std::string> volumes;
    for (const auto& [name, entry] : *after->find("volumes")->asDictionary()) {
      const Value* mtime = entry.find("mtime");
      std::vector<std::string> hosts;
      if (const Array* list = entry.findArray("controllers")) {
        for (const Value& uuid : *list) hosts.push_back(machineName(text(&uuid)));
      }
      volumes.push_back(name + "  mtime " +
                        (mtime && mtime->asDate() ? dateText(mtime->asDate()->seconds) : "?") +
                        "  hosted by " + joined(hosts));
    }
    report_.line("volumes", joined(volumes, "\n"));
    report_.line("Projects", "maxConnections " + std::to_string(maxConnectionsOf(*after)));
    report_.check(
        after->find("volumes")->find("Projects") && after->find("volumes")->find("Scratch"),
        "both volumes to be published");
  }
  const std::vector<std::string> sources = {"Projects.cfg", "Projects-auxdata.plist",
                                            "Scratch.cfgx"};
  for (const std::string& source : sources) {
    report_.check(!mdc1_.exists(source), source + " to be converted and removed");
  }
  report_.check(mdc1_.exists("Projects.cfgp") && mdc1_.exists("Scratch.cfgp"),
                "Projects.cfgp and Scratch.cfgp to exist");
  publishedRevision_ = revision;
  endStep();
}

void Demo::trustCertificates() {
  report_.step("edit-01, edit-02", "trust the directory server's certificate");
  std::vector<FileChanges> changes;
  report_.took(timed([&] {
    for (Machine* m : {&edit1_, &edit2_}) {
      const Snapshot before = m->snapshot();
      ScopedEnv use(&m->env());
      loadControllerCerts(slapd_->ldapsUrl());
      changes.push_back(compareSnapshots(before, m->snapshot()));
    }
  }));
  report_.line("call", "loadControllerCerts(\"" + slapd_->ldapsUrl() + "\") on each client");
  report_.line("edit-01", filesText(changes[0]));
  report_.line("edit-02", filesText(changes[1]));
  report_.check(changes[0].written.size() == 1 && changes[1].written.size() == 1,
                "one certificate in each client's trust store");
  endStep();
}

void Demo::join(Machine& client) {
  report_.step(client.name(), "join the SAN with a new configuration document");
  Value newConfig;
  newConfig.set("sanName", kSanName);
  newConfig.set("sanConfigURLs", Value(Array{Value(slapd_->ldapsUrl())}));
  newConfig.set("sharedSecret", kSecret);
  const Snapshot before = client.snapshot();
  std::uint32_t mask = 0;
  int rc = -1;
  {
    ScopedEnv use(&client.env());
    report_.took(timed([&] { rc = checkSanConfigChange(&mask, &newConfig); }));
  }
  const std::optional<Value> doc = client.localDocument();
  const FileChanges files = compareSnapshots(before, client.snapshot());

  report_.line("call", "checkSanConfigChange(mask, {sanName, sanConfigURLs " + slapd_->ldapsUrl() +
                           ", sharedSecret})");
  report_.line("result", std::to_string(rc) + (rc == 0 ? " (success)" : ""));
  report_.check(rc == 0, "the join to succeed");
  report_.line("mask", maskText(mask));
  report_.check(mask == (kChangeNewConfig | kChangeApplied | kChangeRole), "mask 0x43");
  report_.line("role", field(doc, "role"));
  report_.check(field(doc, "role") == "CLIENT", "role CLIENT");
  report_.line("sanRevision", field(doc, "sanRevision"));
  report_.check(field(doc, "sanRevision") == publishedRevision_, "the published revision applied");
  report_.line("files", filesText(files));
  char mode[8];
  std::snprintf(mode, sizeof mode, "%04o",
                static_cast<unsigned>(client.fileMode(".auth_secret").value_or(0)));
  report_.line(".auth_secret", std::string("mode ") + mode + "; config.plist keeps no secret");
  report_.check(client.readFile(".auth_secret") == std::string(kSecret) &&
                    client.fileMode(".auth_secret") == 0600u && doc &&
                    doc->find("sharedSecret") == nullptr,
                "the secret only in .auth_secret, mode 0600");
  std::string servers = client.readFile("fsnameservers").value_or("(none)");
  while (!servers.empty() && servers.back() == '\n') servers.pop_back();
  report_.line("fsnameservers", servers + "  (from the published name servers)");
  report_.check(client.readFile("fsnameservers") == std::string("10.0.5.11\n"),
                "fsnameservers 10.0.5.11");
  std::vector<std::string> map;
  if (const Dictionary* entries = doc ? doc->findDictionary("controllerIPMap") : nullptr) {
    for (const auto& [address, host] : *entries) map.push_back(address + " -> " + text(&host));
  }
  report_.line("controllers",
               "controllerIPMap " + joined(map) + " (from the published controllers)");
  report_.line("fsmlist", fsmlistText(client));
  client.waitForToolRuns(2);
  report_.line("tools started", joined(client.newToolRuns(), "\n") +
                                    "\n(every published volume not in this machine's fsmlist)");
  endStep();
}

void Demo::editVolume() {
  report_.step("mdc1", "the administrator edits Projects.cfg: MaxConnections 128 -> 256");
  mdc1_.writeFile("Projects.cfg", projectsCfg(256));
  report_.line("wrote", "Projects.cfg, dated " + dateText(*mdc1_.modificationTime("Projects.cfg")) +
                            " (Projects.cfgp is dated " +
                            dateText(*mdc1_.modificationTime("Projects.cfgp")) + ")");
  endStep();
}

void Demo::checkApplies(Machine& client, const std::string& expectedRevision) {
  report_.step(client.name(), "check for a change: applies the new revision");
  const Snapshot before = client.snapshot();
  const std::string revisionBefore = field(client.localDocument(), "sanRevision");
  std::uint32_t mask = 0;
  int rc = -1;
  {
    ScopedEnv use(&client.env());
    report_.took(timed([&] { rc = checkSanConfigChange(&mask, nullptr); }));
  }
  const std::optional<Value> doc = client.localDocument();
  const FileChanges files = compareSnapshots(before, client.snapshot());
  report_.line("call", "checkSanConfigChange(mask, no document)");
  report_.line("result", std::to_string(rc) + (rc == 0 ? " (success)" : ""));
  report_.check(rc == 0, "the check to succeed");
  report_.line("mask", maskText(mask));
  report_.check(mask == kChangeApplied, "mask 0x01");
  report_.line("sanRevision", revisionBefore + "\n  -> " + field(doc, "sanRevision"));
  report_.check(field(doc, "sanRevision") == expectedRevision, "the new revision applied");
  report_.line("role", field(doc, "role") + " (unchanged)");
  report_.line("files", filesText(files));
  report_.check(files.written == std::vector<std::string>{"config.plist"} && files.removed.empty(),
                "only config.plist rewritten");
  report_.line("fsmlist", fsmlistText(client));
  client.waitForToolRuns(2);
  report_.line("tools started", joined(client.newToolRuns(), "\n") +
                                    "\n(every published volume not in this machine's fsmlist)");
  endStep();
}

void Demo::checkChangesNothing() {
  report_.step("all", "check again: nothing has changed, nothing is written");
  std::chrono::steady_clock::duration total{};
  for (Machine* m : {&mdc1_, &edit1_, &edit2_}) {
    const Snapshot before = m->snapshot();
    std::uint32_t mask = 0xff;
    int rc = -1;
    {
      ScopedEnv use(&m->env());
      total += timed([&] { rc = checkSanConfigChange(&mask, nullptr); });
    }
    const FileChanges files = compareSnapshots(before, m->snapshot());
    report_.line(m->name(),
                 "result " + std::to_string(rc) + ", mask " + maskText(mask) + ", files " +
                     (files.written.empty() && files.removed.empty() ? std::string("untouched")
                                                                     : filesText(files)));
    report_.check(rc == 0 && mask == 0 && files.written.empty() && files.removed.empty(),
                  m->name() + " to change nothing");
    report_.check(m->newToolRuns().empty(), m->name() + " to start no tool");
  }
  report_.took(total);
  endStep();
}

void Demo::stopDirectory() {
  report_.step("", "stop the directory server");
  const pid_t pid = slapd_->pid();
  bool stopped = false;
  report_.took(timed([&] { stopped = slapd_->stop(); }));
  const bool gone = ::kill(pid, 0) != 0 && errno == ESRCH;
  report_.line("slapd",
               "pid " + std::to_string(pid) + (gone ? " has exited" : " is still running"));
  report_.check(stopped && gone, "slapd to have exited");
  endStep();
}

int Demo::run() {
  kolt_set_log_handler(collectLogLine, &log_);
  std::printf(
      "kolt demo: a small Vorn SAN in sandbox roots, published through a private "
      "directory server\n");
  try {
    if (startDirectory()) {
      prepareController();
      build("first build: buildSanConfig over the local ldapi socket", true, true);
      build("build again with nothing changed", false, false);
      trustCertificates();
      join(edit1_);
      join(edit2_);
      editVolume();
      build("build after the edit: converts and republishes", false, true);
      const std::string revision = publishedRevision_;
      const std::optional<Value> record = publishedRecord();
      report_.check(record && maxConnectionsOf(*record) == 256,
                    "Projects maxConnections 256 published");
      checkApplies(edit1_, revision);
      checkApplies(edit2_, revision);
      checkChangesNothing();
      stopDirectory();
    }
  } catch (const std::exception& e) {
    report_.check(false, std::string("the demo to run to its end: ") + e.what());
    report_.endStep();
  }
  if (slapd_ && slapd_->running()) slapd_->stop();
  kolt_set_log_handler(nullptr, nullptr);

  std::printf("\n%d steps, %d checks: %s\n", report_.steps(), report_.checks(),
              report_.failures() == 0 ? "every step did what it should"
                                      : (std::to_string(report_.failures()) + " FAILED").c_str());
  return report_.failures() == 0 ? 0 : 1;
}

}  // namespace
}  // namespace kolt::demo

int main(int argc, char** argv) {
  const bool verbose = argc > 1 && std::strcmp(argv[1], "--verbose") == 0;
  for (int sig : {SIGINT, SIGTERM, SIGHUP}) std::signal(sig, kolt::demo::onSignal);
  int status = 1;
  std::vector<std::string> temporary;
  try {
    auto demo = std::make_unique<kolt::demo::Demo>(verbose);
    status = demo->run();
    temporary = demo->temporaryDirectories();
  } catch (const std::exception& e) {
    std::fprintf(stderr, "kolt demo: %s\n", e.what());
    return 1;
  }
  // The demo is gone: its roots and the server's directory must be too.
  int left = 0;
  for (const std::string& dir : temporary) {
    std::error_code ignored;
    if (std::filesystem::exists(dir, ignored)) {
      std::printf("left behind: %s\n", dir.c_str());
      ++left;
    }
  }
  std::printf("Removed %zu temporary directories; slapd stopped; nothing left running.\n",
              temporary.size() - left);
  return left == 0 ? status : 1;
}
