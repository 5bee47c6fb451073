// PosixEnv's files: path mapping below the root, exact modes, dates,
// listings, link resolution and the job-signal registry.
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>
#include <filesystem>
#include <map>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "fixtures/sandbox.h"
#include "kolt/env.h"
#include "platform/env_wrapper.h"

namespace kolt {
namespace {

using testing::Sandbox;

class ScopedUmask {
 public:
  explicit ScopedUmask(mode_t mask) : previous_(::umask(mask)) {}
  ~ScopedUmask() { ::umask(previous_); }

 private:
  mode_t previous_;
};

TEST(PosixEnvPaths, SystemPathsMapBelowTheRootAndNeverEscapeIt) {
  Sandbox box;
  Env& env = box.env();
  const std::string& root = box.root();
  EXPECT_EQ(env.hostPath("/etc/fstab"), root + "/etc/fstab");
  EXPECT_EQ(env.hostPath("/Library/Preferences/Vorn/"), root + "/Library/Preferences/Vorn/");
  EXPECT_EQ(env.hostPath("/"), root);
  EXPECT_EQ(env.hostPath("/../../etc/passwd"), root + "/etc/passwd");
  EXPECT_EQ(env.hostPath("/Library/Preferences/Vorn/../../../../../x.cfgp"), root + "/x.cfgp");
  EXPECT_EQ(env.hostPath("//var/./run//a"), root + "/var/run/a");
  EXPECT_EQ(env.hostPath("relative/../../.."), root);

  // A file named through ".." lands inside the root, not beside it.
  const std::string outsideName = "kolt-escape-" + std::to_string(::getpid());
  ASSERT_EQ(writeFileAtomically(env, "/../../" + outsideName, "x", 0644), 0);
  EXPECT_TRUE(box.exists("/" + outsideName));
  EXPECT_FALSE(std::filesystem::exists(std::filesystem::path(root).parent_path() / outsideName));
}

TEST(PosixEnvPaths, TheMachinesOwnRootLeavesPathsAsTheyAre) {
  auto env = newPosixEnv("/");
  EXPECT_EQ(env->hostPath("/etc/fstab"), "/etc/fstab");
  EXPECT_EQ(newPosixEnv("")->hostPath("/var/run/x.pid"), "/var/run/x.pid");
  EXPECT_EQ(newPosixEnv("/tmp/r///")->hostPath("/etc/fstab"), "/tmp/r/etc/fstab");
}

TEST(PosixEnvPaths, AnEmbeddedNulIsRefusedInsteadOfNamingAShorterPath) {
  Sandbox box;
  box.writeFile("/etc/fstab", "real");
  const std::string withNul("/etc/fstab\0.cfgp", 16);
  std::string contents;
  EXPECT_EQ(box.env().readFile(withNul, &contents), EINVAL);
  EXPECT_EQ(writeFileAtomically(box.env(), withNul, "clobbered", 0644), EINVAL);
  EXPECT_EQ(box.env().removeFile(withNul), EINVAL);
  EXPECT_EQ(box.readFile("/etc/fstab"), "real");
}

TEST(PosixEnvFiles, ReadingSomethingThatIsNotARegularFileFailsAtOnce) {
  Sandbox box;
  // A FIFO at a document's path must not hang the reader.
  ASSERT_EQ(::mkfifo(box.hostPath("/etc/fifo").c_str(), 0644), 0);
  std::string contents;
  EXPECT_EQ(box.env().readFile("/etc/fifo", &contents), EINVAL);
  EXPECT_EQ(box.env().readFile("/etc", &contents), EISDIR);
  EXPECT_EQ(box.env().readFile("/etc/missing", &contents), ENOENT);
}

// Records the temporary file's mode at the moment the first byte arrives.
class ModeAtFirstAppend : public EnvWrapper {
 public:
  using EnvWrapper::EnvWrapper;
  struct Observation {
    std::string path;
    mode_t mode = 0;
    bool existedEmpty = false;
  };
  std::vector<Observation> seen;

  int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                      std::unique_ptr<WritableFile>* file) override {
    std::unique_ptr<WritableFile> inner;
    const int rc = EnvWrapper::newWritableFile(path, mode, exclusive, &inner);
    if (rc == 0) *file = std::make_unique<Watched>(this, path, std::move(inner));
    return rc;
  }

 private:
  class Watched : public WritableFile {
   public:
    Watched(ModeAtFirstAppend* env, std::string path, std::unique_ptr<WritableFile> inner)
        : env_(env), path_(std::move(path)), inner_(std::move(inner)) {}
    int append(std::string_view data) override {
      if (first_) {
        first_ = false;
        FileInfo info;
        EXPECT_EQ(env_->target()->fileInfo(path_, &info), 0);
        env_->seen.push_back({path_, info.mode, info.size == 0});
      }
      return inner_->append(data);
    }
    int sync() override { return inner_->sync(); }
    int close() override { return inner_->close(); }

   private:
    ModeAtFirstAppend* env_;
    std::string path_;
    std::unique_ptr<WritableFile> inner_;
    bool first_ = true;
  };
};

TEST(PosixEnvFiles, AtomicWriteCreatesTheTemporaryFileWithItsFinalModeBeforeAnyByte) {
  Sandbox box;
  ModeAtFirstAppend watcher(&box.env());
  const ScopedUmask loose(0);  // a umask that narrows nothing
  box.writeFile("/Library/Preferences/Vorn/.auth_secret", "old secret", 0644);
  ASSERT_EQ(writeFileAtomically(watcher, "/Library/Preferences/Vorn/.auth_secret", "s3cret", 0600),
            0);
  ASSERT_EQ(watcher.seen.size(), 1u);
  EXPECT_EQ(parentDirectory(watcher.seen[0].path), "/Library/Preferences/Vorn");
  EXPECT_NE(watcher.seen[0].path, "/Library/Preferences/Vorn/.auth_secret");
  EXPECT_EQ(watcher.seen[0].mode, 0600u);
  EXPECT_TRUE(watcher.seen[0].existedEmpty);
  // The secret replaces a wider file and takes its own mode with it.
  EXPECT_EQ(box.fileMode("/Library/Preferences/Vorn/.auth_secret"), 0600u);
  EXPECT_EQ(box.readFile("/Library/Preferences/Vorn/.auth_secret"), "s3cret");
}

TEST(PosixEnvFiles, ModesAreExactWhateverTheUmask) {
  Sandbox box;
  {
    const ScopedUmask strict(0077);
    ASSERT_EQ(writeFileAtomically(box.env(), "/Library/Preferences/Vorn/fsports", "p", 0644), 0);
    EXPECT_EQ(box.fileMode("/Library/Preferences/Vorn/fsports"), 0644u);
    ASSERT_EQ(box.env().createDirectories("/Library/Logs/Vorn/data", 0755), 0);
    EXPECT_EQ(box.fileMode("/Library/Logs/Vorn/data"), 0755u);
    EXPECT_EQ(box.fileMode("/Library/Logs/Vorn"), 0755u);
  }
  {
    const ScopedUmask none(0);
    ASSERT_EQ(writeFileAtomically(box.env(), "/Library/Preferences/Vorn/.auth_secret", "s", 0600),
              0);
    EXPECT_EQ(box.fileMode("/Library/Preferences/Vorn/.auth_secret"), 0600u);
  }
  ASSERT_EQ(box.env().setPermissions("/Library/Preferences/Vorn/fsports", 0640), 0);
  FileInfo info;
  ASSERT_EQ(box.env().fileInfo("/Library/Preferences/Vorn/fsports", &info), 0);
  EXPECT_EQ(info.mode, 0640u);
  EXPECT_FALSE(info.isDirectory);
  EXPECT_EQ(info.size, 1u);
}

TEST(PosixEnvFiles, CreateDirectoriesRefusesAFileInTheWay) {
  Sandbox box;
  box.writeFile("/var/db/file", "x");
  EXPECT_EQ(box.env().createDirectories("/var/db/file", 0755), ENOTDIR);
  EXPECT_NE(box.env().createDirectories("/var/db/file/sub", 0755), 0);
  EXPECT_EQ(box.env().createDirectories("/var/db/dir/", 0755), 0);
  EXPECT_EQ(box.env().createDirectories("/var/db/dir", 0755), 0);  // already there
}

TEST(PosixEnvFiles, ModificationTimesSetAndReadInWholeSecondsAndFractions) {
  Sandbox box;
  box.writeFile("/Library/Preferences/Vorn/a.cfg", "a");
  Env& env = box.env();
  FileInfo info;
  for (const double when : {700000000.0, 700000000.25, 0.0, -31622400.5, 4102444800.0}) {
    ASSERT_EQ(env.setModificationTime("/Library/Preferences/Vorn/a.cfg", when), 0) << when;
    ASSERT_EQ(env.fileInfo("/Library/Preferences/Vorn/a.cfg", &info), 0);
    if (when == std::floor(when)) {
      EXPECT_EQ(info.modificationTime, when);
    } else {
      EXPECT_NEAR(info.modificationTime, when, 1e-6);
    }
  }
  EXPECT_EQ(env.setModificationTime("/Library/Preferences/Vorn/a.cfg", NAN), EINVAL);
  EXPECT_EQ(env.setModificationTime("/Library/Preferences/Vorn/missing", 1.0), ENOENT);
}

TEST(PosixEnvFiles, ListingGivesNamesDatesAndKindsAndSurvivesADanglingLink) {
  Sandbox box;
  const std::string dir = "/Library/Preferences/Vorn";
  box.writeFile(dir + "/vol1.cfg", "1");
  box.writeFile(dir + "/vol2.cfgx", "2");
  box.makeDirectory(dir + "/sub");
  box.setModificationTime(dir + "/vol1.cfg", 600000000);
  box.setModificationTime(dir + "/vol2.cfgx", 600000123.5);
  ASSERT_EQ(::symlink("/nowhere/at/all", box.hostPath(dir + "/dangling").c_str()), 0);

  std::vector<DirectoryEntry> entries;
  ASSERT_EQ(box.env().listDirectory(dir, &entries), 0);
  std::map<std::string, DirectoryEntry> byName;
  for (const auto& e : entries) byName[e.name] = e;
  ASSERT_EQ(byName.size(), 4u);
  EXPECT_EQ(byName["vol1.cfg"].modificationTime, 600000000);
  EXPECT_NEAR(byName["vol2.cfgx"].modificationTime, 600000123.5, 1e-6);
  EXPECT_FALSE(byName["vol1.cfg"].isDirectory);
  EXPECT_TRUE(byName["sub"].isDirectory);
  EXPECT_TRUE(byName.count("dangling"));

  EXPECT_EQ(box.env().listDirectory("/no/such/dir", &entries), ENOENT);
  EXPECT_TRUE(entries.empty());
}

TEST(PosixEnvFiles, ResolvePathFollowsLinksAndRefusesOnesLeadingOutOfTheRoot) {
  Sandbox box;
  Env& env = box.env();
  box.writeFile("/Volumes/data/file", "x");
  ASSERT_EQ(::symlink("/Volumes/data", box.hostPath("/etc/absolute-inside").c_str()), 0);
  // An absolute link target is a host path: it names the host's /Volumes,
  // which lies outside the root.
  std::string resolved;
  EXPECT_EQ(env.resolvePath("/etc/absolute-inside", &resolved), ENOENT);

  ASSERT_EQ(::symlink("../Volumes/data", box.hostPath("/etc/relative").c_str()), 0);
  ASSERT_EQ(env.resolvePath("/etc/relative/file", &resolved), 0);
  EXPECT_EQ(resolved, "/Volumes/data/file");
  ASSERT_EQ(env.resolvePath("/", &resolved), 0);
  EXPECT_EQ(resolved, "/");

  ASSERT_EQ(::symlink("../../../../../../../../tmp", box.hostPath("/etc/climbing").c_str()), 0);
  EXPECT_EQ(env.resolvePath("/etc/climbing", &resolved), EXDEV);
  ASSERT_EQ(::symlink("/tmp", box.hostPath("/etc/outside").c_str()), 0);
  EXPECT_EQ(env.resolvePath("/etc/outside", &resolved), EXDEV);
  EXPECT_EQ(env.resolvePath("/etc/missing", &resolved), ENOENT);
}

TEST(PosixEnvServices, SignalJobReadsThePidFileAndRefusesWhatIsNotAPid) {
  Sandbox box;
  Env& env = box.env();
  const pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    ::pause();
    ::_exit(0);
  }
  box.writeFile("/var/run/com.orvat.vorn.test.pid", std::to_string(child) + "\n");
  ASSERT_EQ(env.signalJob("com.orvat.vorn.test", SIGTERM), 0);
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFSIGNALED(status));
  EXPECT_EQ(WTERMSIG(status), SIGTERM);

  EXPECT_EQ(env.signalJob("com.orvat.absent", SIGTERM), ENOENT);
  for (const char* text : {"", "0", "1", "-1", "12abc", " ", "99999999999999"}) {
    box.writeFile("/var/run/bad.pid", text);
    EXPECT_EQ(env.signalJob("bad", 0), ESRCH) << '"' << text << '"';
  }
  box.writeFile("/etc/evil.pid", std::to_string(::getpid()));
  for (const char* label : {"", "../../etc/evil", "a/b", ".hidden"}) {
    EXPECT_EQ(env.signalJob(label, 0), EINVAL) << label;
  }
}

TEST(PosixEnvIdentity, HardwareUUIDComesFromTheRootsProductUUIDThenMachineId) {
  Sandbox box;
  std::array<std::uint8_t, 16> uuid{};
  EXPECT_EQ(box.env().hardwareUUID(&uuid), ENOENT);
  box.writeFile("/etc/machine-id", "00112233445566778899aabbccddeeff\n");
  ASSERT_EQ(box.env().hardwareUUID(&uuid), 0);
  EXPECT_EQ(uuid[0], 0x00);
  EXPECT_EQ(uuid[15], 0xff);
  box.setHardwareUUID("4C4C4544-0042-3510-8052-B3C04F4E3232");
  ASSERT_EQ(box.env().hardwareUUID(&uuid), 0);
  EXPECT_EQ(uuid[0], 0x4c);
  EXPECT_EQ(uuid[15], 0x32);
  box.setHardwareUUID("not a uuid");
  ASSERT_EQ(box.env().hardwareUUID(&uuid), 0);  // falls back to machine-id
  EXPECT_EQ(uuid[0], 0x00);
  box.setHostName("mdc-1.example\n");
  std::string name;
  ASSERT_EQ(box.env().hostName(&name), 0);
  EXPECT_EQ(name, "mdc-1.example");
}

}  // namespace
}  // namespace kolt
