// One simulated machine of the demo: its own root directory (standing for
// "/"), its own identity (hardware UUID, host name, network interfaces), its
// own PosixEnv, and the SAN's tools as stand-ins: the real pdcfgconvert and
// recording stand-ins for qmadmin and vornctl.
#ifndef KOLT_EXAMPLES_DEMO_MACHINE_H
#define KOLT_EXAMPLES_DEMO_MACHINE_H

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "fixtures/sandbox.h"
#include "kolt/plist.h"
#include "platform/env_wrapper.h"

namespace kolt::demo {

inline const std::string kVornDirectory = "/Library/Preferences/Vorn/";
inline const std::string kTrustDirectory = "/var/db/kolt/trust/";

// A file as the demo compares it between two moments.
struct FileState {
  std::string content;
  double modificationTime = 0;
  friend bool operator==(const FileState&, const FileState&) = default;
};
// Watched files by system path.
using Snapshot = std::map<std::string, FileState>;

// The files a step wrote (created or changed) and removed, by name.
struct FileChanges {
  std::vector<std::string> written;
  std::vector<std::string> removed;
};
FileChanges compareSnapshots(const Snapshot& before, const Snapshot& after);

// The machine's Env: its PosixEnv, with the interfaces the demo gives it.
class MachineEnv : public EnvWrapper {
 public:
  MachineEnv(Env* posix, std::vector<InterfaceAddress> interfaces)
      : EnvWrapper(posix), interfaces_(std::move(interfaces)) {}
  int interfaceAddresses(std::vector<InterfaceAddress>* addresses) override {
    *addresses = interfaces_;
    return 0;
  }

 private:
  std::vector<InterfaceAddress> interfaces_;
};

class Machine {
 public:
  // `address`: the machine's IPv4 address on the metadata network (en0).
  Machine(std::string name, std::string uuid, const std::string& address);

  const std::string& name() const { return name_; }
  const std::string& uuid() const { return uuid_; }
  const std::string& root() const { return sandbox_.root(); }
  Env& env() { return env_; }

  // Files of "/Library/Preferences/Vorn/" by name.
  void writeFile(const std::string& name, const std::string& text, mode_t mode = 0644);
  std::optional<std::string> readFile(const std::string& name) const;
  bool exists(const std::string& name) const;
  std::optional<mode_t> fileMode(const std::string& name) const;
  std::optional<double> modificationTime(const std::string& name) const;
  void setModificationTime(const std::string& name, double secondsSince2001);

  // The local configuration document as it is on disk.
  std::optional<Value> localDocument();
  // "/Library/Preferences/Vorn/" and the trust store.
  Snapshot snapshot() const;
  // The stand-in tools' runs recorded since the last call, as command lines.
  std::vector<std::string> newToolRuns();
  // Waits (at most 10 seconds) until `count` runs more than newToolRuns()
  // has returned were recorded: the tools are started without waiting.
  void waitForToolRuns(std::size_t count);

 private:
  std::string name_;
  std::string uuid_;
  testing::Sandbox sandbox_;
  MachineEnv env_;
  std::size_t toolRunsSeen_ = 0;
};

// The dotted-quad address as an interface entry.
InterfaceAddress ipv4Interface(const std::string& interfaceName, const std::string& address);

}  // namespace kolt::demo

#endif  // KOLT_EXAMPLES_DEMO_MACHINE_H
