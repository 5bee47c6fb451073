// An Env that forwards every call to a target Env, so that a test (or a
// fault-injecting Env) overrides only the calls it cares about.
//
// The wrapper has its own host-UUID cache (the cache belongs to the Env that
// is current), but asks the target for the hardware UUID.
#ifndef KOLT_PLATFORM_ENV_WRAPPER_H
#define KOLT_PLATFORM_ENV_WRAPPER_H

#include "kolt/directory.h"
#include "kolt/env.h"

namespace kolt {

class EnvWrapper : public Env {
 public:
  // `target` is not owned and must outlive the wrapper.
  explicit EnvWrapper(Env* target) : target_(target) {}
  Env* target() const { return target_; }

  int readFile(const std::string& path, std::string* contents) override {
    return target_->readFile(path, contents);
  }
  int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                      std::unique_ptr<WritableFile>* file) override {
    return target_->newWritableFile(path, mode, exclusive, file);
  }
  int renameFile(const std::string& from, const std::string& to) override {
    return target_->renameFile(from, to);
  }
  int removeFile(const std::string& path) override { return target_->removeFile(path); }
  int syncDirectory(const std::string& path) override { return target_->syncDirectory(path); }
  int fileInfo(const std::string& path, FileInfo* info) override {
    return target_->fileInfo(path, info);
  }
  int listDirectory(const std::string& path, std::vector<DirectoryEntry>* entries) override {
    return target_->listDirectory(path, entries);
  }
  int setModificationTime(const std::string& path, double secondsSince2001) override {
    return target_->setModificationTime(path, secondsSince2001);
  }
  int setPermissions(const std::string& path, mode_t mode) override {
    return target_->setPermissions(path, mode);
  }
  int createDirectories(const std::string& path, mode_t mode) override {
    return target_->createDirectories(path, mode);
  }
  int resolvePath(const std::string& path, std::string* resolved) override {
    return target_->resolvePath(path, resolved);
  }
  std::string hostPath(const std::string& path) const override { return target_->hostPath(path); }

  int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) override {
    return target_->runProcess(spec, wait, result);
  }

  int hardwareUUID(std::array<std::uint8_t, 16>* uuid) override {
    return target_->hardwareUUID(uuid);
  }
  int hostName(std::string* name) override { return target_->hostName(name); }
  int interfaceAddresses(std::vector<InterfaceAddress>* addresses) override {
    return target_->interfaceAddresses(addresses);
  }
  pid_t processId() override { return target_->processId(); }

  double now() override { return target_->now(); }
  std::array<std::uint8_t, 16> randomUUID() override { return target_->randomUUID(); }
  void sleepSeconds(double seconds) override { target_->sleepSeconds(seconds); }

  int signalJob(const std::string& label, int signal) override {
    return target_->signalJob(label, signal);
  }

  std::unique_ptr<DirectoryNode> openDirectoryNode(const std::string& nodeName,
                                                   ErrorSlot* error) override {
    return target_->openDirectoryNode(nodeName, error);
  }

 private:
  Env* target_;
};

}  // namespace kolt

#endif  // KOLT_PLATFORM_ENV_WRAPPER_H
