// Env wrappers shared by the volume tests: one that records the processes it
// is asked to start instead of starting them, and one that records the mode
// each new file has before its first byte is written.
#ifndef KOLT_TESTS_UNIT_VOLUMES_VOLUME_TEST_ENVS_H
#define KOLT_TESTS_UNIT_VOLUMES_VOLUME_TEST_ENVS_H

#include <map>
#include <string>
#include <vector>

#include "platform/env_wrapper.h"

namespace kolt::testing {

struct StartedProcess {
  ProcessSpec spec;
  bool waited = false;
};

class ProcessRecordingEnv : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) override {
    started.push_back({spec, wait});
    result->pid = 4242;
    return 0;
  }
  std::vector<std::string> startedCommands() const {
    std::vector<std::string> commands;
    for (const StartedProcess& p : started) {
      commands.push_back(p.spec.arguments.size() == 2 ? p.spec.arguments[1] : "?");
    }
    return commands;
  }
  std::vector<StartedProcess> started;
};

class CreationModeEnv : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                      std::unique_ptr<WritableFile>* file) override {
    const int rc = EnvWrapper::newWritableFile(path, mode, exclusive, file);
    FileInfo info;
    if (rc == 0 && fileInfo(path, &info) == 0) modesAtCreation[path] = info.mode;
    return rc;
  }
  int setPermissions(const std::string& path, mode_t mode) override {
    permissionChanges.push_back(path);
    return EnvWrapper::setPermissions(path, mode);
  }
  std::map<std::string, mode_t> modesAtCreation;  // temporary path -> mode
  std::vector<std::string> permissionChanges;
};

}  // namespace kolt::testing

#endif  // KOLT_TESTS_UNIT_VOLUMES_VOLUME_TEST_ENVS_H
