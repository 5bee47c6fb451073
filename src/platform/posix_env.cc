// PosixEnv: the real host, with every system path mapped below a root.
#include <dirent.h>
#include <fcntl.h>
#include <ifaddrs.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>
#include <uuid/uuid.h>

#include <cctype>
#include <cerrno>
#include <climits>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "kolt/env.h"
#include "platform/directory/ldap_directory.h"
#include "plist/calendar.h"

extern char** environ;

namespace kolt {
namespace {

double timespecTo2001(const struct timespec& ts) {
  return static_cast<double>(ts.tv_sec - calendar::kUnixEpochTo2001) + ts.tv_nsec / 1e9;
}

class PosixWritableFile final : public WritableFile {
 public:
  explicit PosixWritableFile(int fd) : fd_(fd) {}
  ~PosixWritableFile() override {
    if (fd_ >= 0) ::close(fd_);
  }
  int append(std::string_view data) override {
    const char* p = data.data();
    std::size_t left = data.size();
    while (left > 0) {
      const ssize_t n = ::write(fd_, p, left);
      if (n < 0) {
        if (errno == EINTR) continue;
        return errno;
      }
      p += n;
      left -= static_cast<std::size_t>(n);
    }
    return 0;
  }
  int sync() override { return ::fsync(fd_) == 0 ? 0 : errno; }
  int close() override {
    if (fd_ < 0) return 0;
    const int rc = ::close(fd_);
    fd_ = -1;
    return rc == 0 ? 0 : errno;
  }

 private:
  int fd_;
};

// Reads a whole descriptor.
int readAll(int fd, std::string* out) {
  char buf[65536];
  for (;;) {
    const ssize_t n = ::read(fd, buf, sizeof buf);
    if (n < 0) {
      if (errno == EINTR) continue;
      return errno;
    }
    if (n == 0) return 0;
    out->append(buf, static_cast<std::size_t>(n));
  }
}

bool parseHexUUID(std::string_view text, std::array<std::uint8_t, 16>* out) {
  std::string hex;
  for (char c : text) {
    if (c == '-' || c == '\n' || c == ' ') continue;
    if (!std::isxdigit(static_cast<unsigned char>(c))) return false;
    hex += c;
  }
  if (hex.size() != 32) return false;
  for (std::size_t i = 0; i < 16; ++i) {
    (*out)[i] = static_cast<std::uint8_t>(std::stoi(hex.substr(i * 2, 2), nullptr, 16));
  }
  return true;
}

class PosixEnv final : public Env {
 public:
  explicit PosixEnv(std::string root) : root_(normaliseRoot(std::move(root))) {}

  std::string hostPath(const std::string& path) const override {
    if (root_ == "/") return path;
    if (!path.empty() && path[0] == '/') return root_ + path;
    return root_ + "/" + path;
  }

  int readFile(const std::string& path, std::string* contents) override {
    const int fd = ::open(hostPath(path).c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return errno;
    contents->clear();
    const int rc = readAll(fd, contents);
    ::close(fd);
    return rc;
  }

  int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                      std::unique_ptr<WritableFile>* file) override {
    const int flags = O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | (exclusive ? O_EXCL : 0);
    const int fd = ::open(hostPath(path).c_str(), flags, mode & 07777);
    if (fd < 0) return errno;
    // The umask may have narrowed the mode; set it exactly before any byte
    // is written, so a secret is never readable by others.
    if (::fchmod(fd, mode & 07777) != 0) {
      const int e = errno;
      ::close(fd);
      return e;
    }
    *file = std::make_unique<PosixWritableFile>(fd);
    return 0;
  }

  int renameFile(const std::string& from, const std::string& to) override {
    return ::rename(hostPath(from).c_str(), hostPath(to).c_str()) == 0 ? 0 : errno;
  }

  int removeFile(const std::string& path) override {
    return ::unlink(hostPath(path).c_str()) == 0 ? 0 : errno;
  }

  int syncDirectory(const std::string& path) override {
    const int fd = ::open(hostPath(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) return errno;
    const int rc = ::fsync(fd) == 0 ? 0 : errno;
    ::close(fd);
    return rc;
  }

  int fileInfo(const std::string& path, FileInfo* info) override {
    struct stat st;
    if (::stat(hostPath(path).c_str(), &st) != 0) return errno;
    info->isDirectory = S_ISDIR(st.st_mode);
    info->mode = st.st_mode & 07777;
    info->size = static_cast<std::uint64_t>(st.st_size);
    info->modificationTime = timespecTo2001(st.st_mtim);
    return 0;
  }

  int listDirectory(const std::string& path, std::vector<DirectoryEntry>* entries) override {
    entries->clear();
    const std::string dirPath = hostPath(path);
    DIR* dir = ::opendir(dirPath.c_str());
    if (dir == nullptr) return errno;
    int rc = 0;
    for (;;) {
      errno = 0;
      struct dirent* d = ::readdir(dir);
      if (d == nullptr) {
        rc = errno;
        break;
      }
      if (std::strcmp(d->d_name, ".") == 0 || std::strcmp(d->d_name, "..") == 0) continue;
      struct stat st;
      if (::fstatat(::dirfd(dir), d->d_name, &st, 0) != 0) {
        rc = errno;
        break;
      }
      entries->push_back({d->d_name, timespecTo2001(st.st_mtim), S_ISDIR(st.st_mode)});
    }
    ::closedir(dir);
    return rc;
  }

  int setModificationTime(const std::string& path, double secondsSince2001) override {
    const double unixTime = secondsSince2001 + static_cast<double>(calendar::kUnixEpochTo2001);
    const double whole = std::floor(unixTime);
    struct timespec times[2];
    times[0].tv_sec = 0;
    times[0].tv_nsec = UTIME_OMIT;
    times[1].tv_sec = static_cast<time_t>(whole);
    times[1].tv_nsec = static_cast<long>(std::lround((unixTime - whole) * 1e9));
    if (times[1].tv_nsec >= 1000000000L) {
      times[1].tv_sec += 1;
      times[1].tv_nsec -= 1000000000L;
    }
    return ::utimensat(AT_FDCWD, hostPath(path).c_str(), times, 0) == 0 ? 0 : errno;
  }

  int setPermissions(const std::string& path, mode_t mode) override {
    return ::chmod(hostPath(path).c_str(), mode & 07777) == 0 ? 0 : errno;
  }

  int createDirectories(const std::string& path, mode_t mode) override {
    const std::string full = hostPath(path);
    std::string partial;
    std::size_t pos = 0;
    while (pos <= full.size()) {
      const std::size_t slash = full.find('/', pos);
      const std::size_t end = slash == std::string::npos ? full.size() : slash;
      partial = full.substr(0, end);
      pos = end + 1;
      if (partial.empty()) continue;
      if (::mkdir(partial.c_str(), mode) != 0 && errno != EEXIST) return errno;
      if (slash == std::string::npos) break;
    }
    struct stat st;
    if (::stat(full.c_str(), &st) != 0) return errno;
    return S_ISDIR(st.st_mode) ? 0 : ENOTDIR;
  }

  int resolvePath(const std::string& path, std::string* resolved) override {
    char buf[PATH_MAX];
    if (::realpath(hostPath(path).c_str(), buf) == nullptr) return errno;
    std::string host(buf);
    if (root_ == "/") {
      *resolved = host;
      return 0;
    }
    char rootBuf[PATH_MAX];
    if (::realpath(root_.c_str(), rootBuf) == nullptr) return errno;
    const std::string realRoot(rootBuf);
    if (host == realRoot) {
      *resolved = "/";
    } else if (host.compare(0, realRoot.size() + 1, realRoot + "/") == 0) {
      *resolved = host.substr(realRoot.size());
    } else {
      return EXDEV;  // the link leads out of the root
    }
    if (!path.empty() && path.back() == '/' && resolved->back() != '/') *resolved += '/';
    return 0;
  }

  int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) override {
    return startChild(spec, wait, result);
  }

  int hardwareUUID(std::array<std::uint8_t, 16>* uuid) override {
    std::string text;
    if (readFile("/sys/class/dmi/id/product_uuid", &text) == 0 && parseHexUUID(text, uuid)) return 0;
    if (readFile("/etc/machine-id", &text) == 0 && parseHexUUID(text, uuid)) return 0;
    return ENOENT;
  }

  int hostName(std::string* name) override {
    // A sandbox root may name its machine in /etc/hostname.
    std::string text;
    if (root_ != "/" && readFile("/etc/hostname", &text) == 0) {
      const std::size_t end = text.find_first_of("\r\n");
      text = text.substr(0, end);
      if (!text.empty()) {
        *name = text;
        return 0;
      }
    }
    char buf[256];
    if (::gethostname(buf, sizeof buf) != 0) return errno;
    buf[sizeof buf - 1] = '\0';
    *name = buf;
    return 0;
  }

  int interfaceAddresses(std::vector<InterfaceAddress>* addresses) override {
    addresses->clear();
    struct ifaddrs* list = nullptr;
    if (::getifaddrs(&list) != 0) return errno;
    for (struct ifaddrs* p = list; p != nullptr; p = p->ifa_next) {
      InterfaceAddress a;
      if (p->ifa_name) a.interfaceName = p->ifa_name;
      if (p->ifa_addr) {
        a.family = p->ifa_addr->sa_family;
        if (a.family == AF_INET) {
          const auto* sin = reinterpret_cast<const sockaddr_in*>(p->ifa_addr);
          a.address.assign(reinterpret_cast<const char*>(&sin->sin_addr), 4);
        } else if (a.family == AF_INET6) {
          const auto* sin6 = reinterpret_cast<const sockaddr_in6*>(p->ifa_addr);
          a.address.assign(reinterpret_cast<const char*>(&sin6->sin6_addr), 16);
        }
      }
      addresses->push_back(std::move(a));
    }
    ::freeifaddrs(list);
    return 0;
  }

  pid_t processId() override { return ::getpid(); }

  double now() override {
    struct timespec ts;
    ::clock_gettime(CLOCK_REALTIME, &ts);
    return timespecTo2001(ts);
  }

  std::array<std::uint8_t, 16> randomUUID() override {
    uuid_t u;
    uuid_generate_random(u);
    std::array<std::uint8_t, 16> out;
    std::memcpy(out.data(), u, 16);
    return out;
  }

  void sleepSeconds(double seconds) override {
    if (!(seconds > 0)) return;
    struct timespec ts;
    ts.tv_sec = static_cast<time_t>(seconds);
    ts.tv_nsec = static_cast<long>((seconds - static_cast<double>(ts.tv_sec)) * 1e9);
    while (::nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
  }

  int signalJob(const std::string& label, int signal) override {
    std::string text;
    const int rc = readFile("/var/run/" + label + ".pid", &text);
    if (rc != 0) return rc;
    char* end = nullptr;
    errno = 0;
    const long pid = std::strtol(text.c_str(), &end, 10);
    if (errno != 0 || end == text.c_str() || pid <= 1 || pid > INT_MAX) return ESRCH;
    return ::kill(static_cast<pid_t>(pid), signal) == 0 ? 0 : errno;
  }

  std::unique_ptr<DirectoryNode> openDirectoryNode(const std::string& nodeName,
                                                   ErrorSlot* error) override {
    return openLdapNode(*this, nodeName, error);
  }

 private:
  static std::string normaliseRoot(std::string root) {
    if (root.empty()) return "/";
    while (root.size() > 1 && root.back() == '/') root.pop_back();
    return root;
  }

  // Opens the descriptor a child's stream uses; -1 for a pipe.
  int openStream(const StreamSpec& s, bool forInput) {
    if (s.kind == StreamSpec::Kind::kAppendToExistingFile) {
      const int fd = ::open(hostPath(s.path).c_str(), O_WRONLY | O_APPEND | O_CLOEXEC);
      if (fd >= 0) return fd;
    }
    if (s.kind == StreamSpec::Kind::kPipe) return -1;
    return ::open("/dev/null", (forInput ? O_RDONLY : O_WRONLY) | O_CLOEXEC);
  }

  // Starts the child. A child that is not waited for is started through an
  // intermediate process that exits at once, so it never lingers as a zombie
  // of the caller.
  int startChild(const ProcessSpec& spec, bool wait, ProcessResult* result) {
    const std::string executable = hostPath(spec.executable);
    std::vector<std::string> argStrings;
    argStrings.push_back(spec.executable);
    argStrings.insert(argStrings.end(), spec.arguments.begin(), spec.arguments.end());
    std::vector<char*> argv;
    for (auto& a : argStrings) argv.push_back(a.data());
    argv.push_back(nullptr);
    // Children learn the sandbox root, so stand-in tools can map system paths.
    std::vector<std::string> envStrings;
    for (char** e = environ; e && *e; ++e) {
      if (std::strncmp(*e, "KOLT_ROOT=", 10) != 0) envStrings.emplace_back(*e);
    }
    envStrings.push_back("KOLT_ROOT=" + root_);
    std::vector<char*> envp;
    for (auto& e : envStrings) envp.push_back(e.data());
    envp.push_back(nullptr);

    int inFd = openStream(spec.standardInput, true);
    int outFd = openStream(spec.standardOutput, false);
    int errFd = openStream(spec.standardError, false);
    int inPipe[2] = {-1, -1}, outPipe[2] = {-1, -1}, errPipe[2] = {-1, -1}, pidPipe[2] = {-1, -1};
    auto closeAll = [&] {
      for (int fd : {inFd, outFd, errFd, inPipe[0], inPipe[1], outPipe[0], outPipe[1], errPipe[0],
                     errPipe[1], pidPipe[0], pidPipe[1]}) {
        if (fd >= 0) ::close(fd);
      }
    };
    bool ok = true;
    if (inFd < 0) ok = ok && ::pipe2(inPipe, O_CLOEXEC) == 0;
    if (outFd < 0) ok = ok && ::pipe2(outPipe, O_CLOEXEC) == 0;
    if (errFd < 0) ok = ok && ::pipe2(errPipe, O_CLOEXEC) == 0;
    ok = ok && ::pipe2(pidPipe, O_CLOEXEC) == 0;
    if (!ok) {
      const int e = errno;
      closeAll();
      return e;
    }
    const int childIn = inFd >= 0 ? inFd : inPipe[0];
    const int childOut = outFd >= 0 ? outFd : outPipe[1];
    const int childErr = errFd >= 0 ? errFd : errPipe[1];

    const pid_t pid = ::fork();
    if (pid < 0) {
      const int e = errno;
      closeAll();
      return e;
    }
    if (pid == 0) {
      // Only async-signal-safe calls from here on.
      if (!wait) {
        const pid_t grandchild = ::fork();
        if (grandchild != 0) {
          const int report = grandchild > 0 ? grandchild : -errno;
          (void)!::write(pidPipe[1], &report, sizeof report);
          ::_exit(0);
        }
      }
      ::dup2(childIn, 0);
      ::dup2(childOut, 1);
      ::dup2(childErr, 2);
      ::execve(executable.c_str(), argv.data(), envp.data());
      const int report = -errno;
      (void)!::write(pidPipe[1], &report, sizeof report);
      ::_exit(127);
    }
    // Parent: keep only our ends.
    for (int* fd : {&inFd, &outFd, &errFd, &inPipe[0], &outPipe[1], &errPipe[1], &pidPipe[1]}) {
      if (*fd >= 0) ::close(*fd);
      *fd = -1;
    }
    int startError = 0;
    if (!wait) {
      int report = 0;
      ssize_t n;
      do {
        n = ::read(pidPipe[0], &report, sizeof report);
      } while (n < 0 && errno == EINTR);
      int status = 0;
      while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
      }
      if (n == sizeof report && report > 0) {
        result->pid = report;
      } else if (n == sizeof report && report < 0) {
        startError = -report;
      }
      // An exec failure in the grandchild is reported through the same pipe.
      int execReport = 0;
      do {
        n = ::read(pidPipe[0], &execReport, sizeof execReport);
      } while (n < 0 && errno == EINTR);
      if (n == sizeof execReport && execReport < 0) startError = -execReport;
      closeAll();
      return startError;
    }
    result->pid = pid;
    if (inPipe[1] >= 0) {
      (void)!::write(inPipe[1], spec.input.data(), spec.input.size());
      ::close(inPipe[1]);
      inPipe[1] = -1;
    }
    std::string output, errors;
    if (outPipe[0] >= 0) readAll(outPipe[0], &output);
    if (errPipe[0] >= 0) readAll(errPipe[0], &errors);
    int status = 0;
    while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    int execReport = 0;
    ssize_t n;
    do {
      n = ::read(pidPipe[0], &execReport, sizeof execReport);
    } while (n < 0 && errno == EINTR);
    closeAll();
    if (n == sizeof execReport && execReport < 0) return -execReport;
    result->output = std::move(output);
    result->exitStatus = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    return 0;
  }

  std::string root_;
};

}  // namespace

std::unique_ptr<Env> newPosixEnv(std::string root) {
  return std::make_unique<PosixEnv>(std::move(root));
}

}  // namespace kolt
