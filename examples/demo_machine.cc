#include "demo_machine.h"

#include <arpa/inet.h>
#include <sys/socket.h>

#include <filesystem>
#include <stdexcept>

#include "kolt/local_config.h"

namespace kolt::demo {
namespace fs = std::filesystem;

InterfaceAddress ipv4Interface(const std::string& interfaceName, const std::string& address) {
  struct in_addr a;
  if (::inet_pton(AF_INET, address.c_str(), &a) != 1) {
    throw std::runtime_error("not an IPv4 address: " + address);
  }
  return {interfaceName, AF_INET, std::string(reinterpret_cast<const char*>(&a), 4)};
}

Machine::Machine(std::string name, std::string uuid, const std::string& address)
    : name_(std::move(name)),
      uuid_(std::move(uuid)),
      env_(&sandbox_.env(), {ipv4Interface("lo", "127.0.0.1"), ipv4Interface("en0", address)}) {
  sandbox_.setHardwareUUID(uuid_);
  sandbox_.setHostName(name_);
  const std::string tools = testing::kToolDirectory;
  fs::copy_file(fs::path(KOLT_BINARY_DIR) / "pdcfgconvert",
                sandbox_.hostPath(tools + "pdcfgconvert"));
  sandbox_.installTool("qmadmin");
  sandbox_.installTool("vornctl");
}

void Machine::writeFile(const std::string& name, const std::string& text, mode_t mode) {
  sandbox_.writeFile(kVornDirectory + name, text, mode);
}

std::optional<std::string> Machine::readFile(const std::string& name) const {
  return sandbox_.readFile(kVornDirectory + name);
}

bool Machine::exists(const std::string& name) const {
  return sandbox_.exists(kVornDirectory + name);
}

std::optional<mode_t> Machine::fileMode(const std::string& name) const {
  return sandbox_.fileMode(kVornDirectory + name);
}

std::optional<double> Machine::modificationTime(const std::string& name) const {
  return sandbox_.modificationTime(kVornDirectory + name);
}

void Machine::setModificationTime(const std::string& name, double secondsSince2001) {
  sandbox_.setModificationTime(kVornDirectory + name, secondsSince2001);
}

std::optional<Value> Machine::localDocument() {
  ScopedEnv use(&env_);
  return loadConfigPlist();
}

Snapshot Machine::snapshot() const {
  Snapshot files;
  for (const std::string& directory : {kVornDirectory, kTrustDirectory}) {
    for (const std::string& name : sandbox_.listNames(directory)) {
      const std::string path = directory + name;
      if (fs::is_directory(sandbox_.hostPath(path))) continue;
      files[path] = {sandbox_.readFile(path).value_or(""),
                     sandbox_.modificationTime(path).value_or(0)};
    }
  }
  return files;
}

std::vector<std::string> Machine::newToolRuns() {
  std::vector<testing::ToolCall> calls = sandbox_.toolCalls();
  std::vector<std::string> runs;
  for (std::size_t i = toolRunsSeen_; i < calls.size(); ++i) {
    std::string line = calls[i].name;
    for (const std::string& argument : calls[i].arguments) {
      line += argument.find(' ') == std::string::npos ? " " + argument : " '" + argument + "'";
    }
    runs.push_back(line);
  }
  toolRunsSeen_ = calls.size();
  return runs;
}

void Machine::waitForToolRuns(std::size_t count) {
  sandbox_.waitForToolCalls(toolRunsSeen_ + count, std::chrono::seconds(10));
}

FileChanges compareSnapshots(const Snapshot& before, const Snapshot& after) {
  FileChanges changes;
  auto shortName = [](const std::string& path) {
    return path.rfind(kVornDirectory, 0) == 0 ? path.substr(kVornDirectory.size()) : path;
  };
  for (const auto& [path, state] : after) {
    auto old = before.find(path);
    if (old == before.end() || !(old->second == state)) changes.written.push_back(shortName(path));
  }
  for (const auto& [path, state] : before) {
    if (after.count(path) == 0) changes.removed.push_back(shortName(path));
  }
  return changes;
}

}  // namespace kolt::demo
