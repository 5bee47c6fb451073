// The platform seam. Everything kolt does to the host (files, processes, host
// identity, clock, services, directory sessions) goes through an Env, so that
// tests give every case its own sandbox root and inject faults.
//
// Paths given to an Env are the system's own fixed paths
// ("/Library/Preferences/Vorn/config.plist", "/var/run/...", "/etc/fstab");
// PosixEnv maps each of them below its root directory.
//
// File operations return 0 or a Linux errno value.
#ifndef KOLT_ENV_H
#define KOLT_ENV_H

#include <sys/types.h>

#include <array>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kolt/error.h"
#include "kolt/export.h"

namespace kolt {

class DirectoryNode;

// A file being written. Data reaches the file with append(); sync() makes what
// was appended durable; close() ends the file (it does not sync).
class KOLT_EXPORT WritableFile {
 public:
  virtual ~WritableFile();
  virtual int append(std::string_view data) = 0;
  virtual int sync() = 0;
  virtual int close() = 0;
};

// One entry of a directory listing.
struct DirectoryEntry {
  std::string name;           // the entry's own name, no directory part
  double modificationTime = 0;  // content modification date, seconds since 2001
  bool isDirectory = false;
};

// What a file is, when it exists.
struct FileInfo {
  bool isDirectory = false;
  mode_t mode = 0;               // permission bits
  std::uint64_t size = 0;
  double modificationTime = 0;   // seconds since 2001
};

// Where a child's standard stream goes.
struct StreamSpec {
  enum class Kind { kNull, kAppendToExistingFile, kPipe };
  Kind kind = Kind::kNull;
  std::string path;  // for kAppendToExistingFile: opened for writing, neither created nor truncated

  static StreamSpec null() { return {}; }
  static StreamSpec appendTo(std::string p) { return {Kind::kAppendToExistingFile, std::move(p)}; }
  static StreamSpec pipe() { return {Kind::kPipe, {}}; }
};

// A child process to start. The executable is a system path (mapped below the
// Env's root); arguments are passed as they are. Standard input is always the
// null device or a pipe fed with `input`.
struct ProcessSpec {
  std::string executable;
  std::vector<std::string> arguments;  // without argv[0]
  StreamSpec standardInput;            // kNull or kPipe (fed with `input`)
  std::string input;
  StreamSpec standardOutput;
  StreamSpec standardError;
};

// The outcome of a started process.
struct ProcessResult {
  pid_t pid = -1;
  int exitStatus = -1;      // when waited for: exit code, or 128 + signal
  std::string output;       // standard output, when it was a pipe and waited for
  std::string errorOutput;  // standard error, when it was a pipe and waited for
};

// One address of a network interface.
struct InterfaceAddress {
  std::string interfaceName;  // "en0", "lo", ...; empty when the entry has none
  int family = 0;             // AF_INET, AF_INET6, or another family
  std::string address;        // binary address: 4 bytes (IPv4) or 16 (IPv6); empty when none
};

// What a directory node learned about a server's search base when it opened
// (the server's root DSE), kept so that later nodes of the same server skip
// that exchange. Keys are a server's identity: "ldap://host:port" or
// "ldaps://host:port" (host in lower case), or "ldapi://" and the
// percent-encoded host path of the socket. The directory client fills it
// after reading a root DSE, reads it when it opens a node, and drops an entry
// when an operation fails in a way a wrong base explains (docs/directory.md).
// Thread-safe. Holds at most kMaxServers entries; storing one more forgets
// another.
class SearchBaseCache {
 public:
  static constexpr std::size_t kMaxServers = 64;

  struct Entry {
    std::vector<std::string> namingContexts;  // as the root DSE listed them
    std::string base;                          // the one chosen among them
  };

  // The entry for `server`, if any.
  std::optional<Entry> find(const std::string& server) const {
    std::lock_guard lock(mutex_);
    auto it = entries_.find(server);
    if (it == entries_.end()) return std::nullopt;
    return it->second;
  }
  void store(const std::string& server, Entry entry) {
    std::lock_guard lock(mutex_);
    if (entries_.size() >= kMaxServers && entries_.count(server) == 0) {
      entries_.erase(entries_.begin());
    }
    entries_[server] = std::move(entry);
  }
  void forget(const std::string& server) {
    std::lock_guard lock(mutex_);
    entries_.erase(server);
  }

 private:
  mutable std::mutex mutex_;
  std::map<std::string, Entry> entries_;
};

class KOLT_EXPORT Env {
 public:
  Env();
  virtual ~Env();
  Env(const Env&) = delete;
  Env& operator=(const Env&) = delete;

  // --- Files and directories (paths are system paths) -----------------------
  virtual int readFile(const std::string& path, std::string* contents) = 0;
  // Creates (or truncates) the file with `mode` already set, for writing.
  // `exclusive`: fail with EEXIST when the file exists.
  virtual int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                              std::unique_ptr<WritableFile>* file) = 0;
  virtual int renameFile(const std::string& from, const std::string& to) = 0;
  virtual int removeFile(const std::string& path) = 0;
  // fsync of a directory, making renames and removals in it durable.
  virtual int syncDirectory(const std::string& path) = 0;
  virtual int fileInfo(const std::string& path, FileInfo* info) = 0;
  virtual int listDirectory(const std::string& path, std::vector<DirectoryEntry>* entries) = 0;
  virtual int setModificationTime(const std::string& path, double secondsSince2001) = 0;
  virtual int setPermissions(const std::string& path, mode_t mode) = 0;
  // Creates the directory and its missing parents.
  virtual int createDirectories(const std::string& path, mode_t mode) = 0;
  // Resolves symbolic links; the result is again a system path.
  virtual int resolvePath(const std::string& path, std::string* resolved) = 0;
  // The host path that `path` maps to (for diagnostics, sockets and tools).
  virtual std::string hostPath(const std::string& path) const = 0;

  // --- Processes ---------------------------------------------------------------
  // Starts the process; when `wait`, waits for its end and collects its exit
  // status and piped output (input and both outputs are served together, so
  // no size deadlocks). Returns 0 or an errno value: the start failed, an exec
  // failure included. The child gets the caller's environment plus
  // KOLT_ROOT=<root> and no descriptor but its three standard streams.
  // Without `wait` the child is detached (it never becomes the caller's
  // zombie), `result->pid` names it, piped output goes to the null device and
  // piped input must fit in a pipe (E2BIG otherwise).
  virtual int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) = 0;

  // --- Host and process identity -----------------------------------------------
  // The hardware UUID (16 bytes). Returns 0 or an errno value; on failure the
  // output is left unfilled.
  virtual int hardwareUUID(std::array<std::uint8_t, 16>* uuid) = 0;
  virtual int hostName(std::string* name) = 0;
  virtual int interfaceAddresses(std::vector<InterfaceAddress>* addresses) = 0;
  virtual pid_t processId() = 0;

  // --- Clock, randomness, waiting ------------------------------------------------
  // Seconds since 2001-01-01T00:00:00Z.
  virtual double now() = 0;
  virtual std::array<std::uint8_t, 16> randomUUID() = 0;
  virtual void sleepSeconds(double seconds) = 0;

  // --- Services --------------------------------------------------------------------
  // Sends `signal` to the job with `label` (its PID from the service registry,
  // "/var/run/<label>.pid"). Returns 0 or an errno value.
  virtual int signalJob(const std::string& label, int signal) = 0;

  // --- Directory ---------------------------------------------------------------------
  // Opens the directory node named `nodeName` ("/LDAPv3/<url or host>") in the
  // default session. Null with `error` on failure.
  virtual std::unique_ptr<DirectoryNode> openDirectoryNode(const std::string& nodeName,
                                                           ErrorSlot* error) = 0;

  // --- The host-UUID cache ---------------------------------------------------------
  // The cache belongs to the Env: with the process's default Env it is
  // process-wide; a test or demo that simulates several machines in one
  // process gives each machine its own Env and so its own identity.
  std::once_flag& hostUUIDOnce() { return hostUUIDOnce_; }
  std::string& hostUUIDCache() { return hostUUIDCache_; }

  // --- The search-base cache -------------------------------------------------------
  // Belongs to the Env like the host-UUID cache: process-wide with the
  // default Env, one per simulated machine otherwise. An EnvWrapper has its
  // own, unused: its nodes are opened by (and cached in) its target.
  SearchBaseCache& searchBaseCache() { return searchBaseCache_; }

 private:
  std::once_flag hostUUIDOnce_;
  std::string hostUUIDCache_;
  SearchBaseCache searchBaseCache_;
};

// The Env that the library's operations use. Initially a PosixEnv rooted at
// "/". Thread-safe to read; set it before calling into kolt.
KOLT_EXPORT Env& currentEnv();
// Makes `env` (not owned; must outlive its use) the current Env; null restores
// the default. Returns the previous one.
KOLT_EXPORT Env* setCurrentEnv(Env* env);

// Sets the current Env for a scope (tests, the demo).
class ScopedEnv {
 public:
  explicit ScopedEnv(Env* env) : previous_(setCurrentEnv(env)) {}
  ~ScopedEnv() { setCurrentEnv(previous_); }
  ScopedEnv(const ScopedEnv&) = delete;
  ScopedEnv& operator=(const ScopedEnv&) = delete;

 private:
  Env* previous_;
};

// Replaces `path` whole and durably: writes a temporary file in the same
// directory created with `mode`, syncs it, renames it over `path` and syncs the
// directory. On any failure the temporary file is removed and `path` is left as
// it was. Returns 0 or an errno value. The one atomic writer of kolt.
KOLT_EXPORT int writeFileAtomically(Env& env, const std::string& path, std::string_view contents,
                                    mode_t mode);

// A PosixEnv: the real host, with every system path mapped below `root`
// ("/" for the machine itself). Directory nodes are opened over LDAP.
KOLT_EXPORT std::unique_ptr<Env> newPosixEnv(std::string root);

// Directory part of a system path ("/a/b/c" -> "/a/b"; "/a" -> "/").
KOLT_EXPORT std::string parentDirectory(const std::string& path);

}  // namespace kolt

#endif  // KOLT_ENV_H
