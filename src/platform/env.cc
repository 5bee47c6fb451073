// The current Env, and the one atomic writer built on the Env's primitives.
#include "kolt/env.h"

#include <atomic>
#include <cstdio>

namespace kolt {
namespace {

std::atomic<Env*> g_current{nullptr};

Env& defaultEnv() {
  static Env* env = newPosixEnv("/").release();  // lives as long as the process
  return *env;
}

std::string temporaryNameFor(Env& env, const std::string& path) {
  const auto r = env.randomUUID();
  char suffix[40];
  std::snprintf(suffix, sizeof suffix, ".kolt-tmp-%02x%02x%02x%02x%02x%02x%02x%02x", r[0], r[1],
                r[2], r[3], r[4], r[5], r[6], r[7]);
  return path + suffix;
}

}  // namespace

WritableFile::~WritableFile() = default;
Env::Env() = default;
Env::~Env() = default;

Env& currentEnv() {
  Env* env = g_current.load(std::memory_order_acquire);
  return env ? *env : defaultEnv();
}

Env* setCurrentEnv(Env* env) { return g_current.exchange(env, std::memory_order_acq_rel); }

std::string parentDirectory(const std::string& path) {
  const std::size_t slash = path.find_last_of('/');
  if (slash == std::string::npos) return ".";
  if (slash == 0) return "/";
  return path.substr(0, slash);
}

int writeFileAtomically(Env& env, const std::string& path, std::string_view contents, mode_t mode) {
  const std::string temporary = temporaryNameFor(env, path);
  std::unique_ptr<WritableFile> file;
  int rc = env.newWritableFile(temporary, mode, /*exclusive=*/true, &file);
  if (rc != 0) return rc;
  rc = file->append(contents);
  if (rc == 0) rc = file->sync();
  const int closeRc = file->close();
  if (rc == 0) rc = closeRc;
  if (rc == 0) rc = env.renameFile(temporary, path);
  if (rc != 0) {
    env.removeFile(temporary);
    return rc;
  }
  // The rename is durable only once the directory is synced.
  return env.syncDirectory(parentDirectory(path));
}

}  // namespace kolt
