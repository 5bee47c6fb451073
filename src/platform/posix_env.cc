// PosixEnv: the real host, with every system path mapped below a root.
#include <dirent.h>
#include <fcntl.h>
#include <ifaddrs.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>
#include <uuid/uuid.h>

#include <cctype>
#include <cerrno>
#include <climits>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <vector>

#include "kolt/env.h"
#include "platform/directory/ldap_directory.h"
#include "platform/path_components.h"
#include "platform/posix_process.h"
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

// Maps a system path below `root`. "." and ".." are resolved by name and
// never climb above the root, so no path (a volume name "../../x" included)
// names a file outside it. A relative path counts from the root.
std::string mapBelowRoot(const std::string& root, std::string_view path) {
  const std::vector<std::string_view> parts = pathComponents(path);
  std::string out = root == "/" ? std::string() : root;
  for (const std::string_view part : parts) {
    out += '/';
    out += part;
  }
  if (parts.empty()) return root;
  // A trailing slash keeps its meaning ("this must be a directory").
  if (path.back() == '/') out += '/';
  return out;
}

// True when the path can be handed to the system: an embedded NUL would
// silently name a shorter path.
bool usablePath(const std::string& path) {
  return path.find('\0') == std::string::npos;
}

bool isPidText(const std::string& text, long* pid) {
  std::size_t end = text.find_last_not_of(" \t\r\n");
  if (end == std::string::npos) return false;
  const std::string digits = text.substr(0, end + 1);
  if (digits.empty() || digits.size() > 10) return false;
  for (char c : digits) {
    if (c < '0' || c > '9') return false;
  }
  *pid = std::strtol(digits.c_str(), nullptr, 10);
  return true;
}

class PosixEnv final : public Env {
 public:
  explicit PosixEnv(std::string root) : root_(normaliseRoot(std::move(root))) {}

  std::string hostPath(const std::string& path) const override { return mapBelowRoot(root_, path); }

  int readFile(const std::string& path, std::string* contents) override {
    if (!usablePath(path)) return EINVAL;
    // Non-blocking open: a FIFO planted at a document's path must not hang us.
    const int fd = ::open(hostPath(path).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    if (fd < 0) return errno;
    struct stat st;
    int rc = ::fstat(fd, &st) != 0 ? errno : 0;
    if (rc == 0 && S_ISDIR(st.st_mode)) rc = EISDIR;
    if (rc == 0 && !S_ISREG(st.st_mode)) rc = EINVAL;
    if (rc == 0) {
      contents->clear();
      rc = readAll(fd, contents);
    }
    ::close(fd);
    return rc;
  }

  int newWritableFile(const std::string& path, mode_t mode, bool exclusive,
                      std::unique_ptr<WritableFile>* file) override {
    if (!usablePath(path)) return EINVAL;
    const int flags =
        O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOCTTY | (exclusive ? O_EXCL : 0);
    const int fd = ::open(hostPath(path).c_str(), flags, mode & 07777);
    if (fd < 0) return errno;
    // The umask may have narrowed the mode; set it exactly before any byte
    // is written. It only ever narrows, so a secret is never readable by
    // others, not even for a moment.
    if (::fchmod(fd, mode & 07777) != 0) {
      const int e = errno;
      ::close(fd);
      return e;
    }
    *file = std::make_unique<PosixWritableFile>(fd);
    return 0;
  }

  int renameFile(const std::string& from, const std::string& to) override {
    if (!usablePath(from) || !usablePath(to)) return EINVAL;
    return ::rename(hostPath(from).c_str(), hostPath(to).c_str()) == 0 ? 0 : errno;
  }

  int removeFile(const std::string& path) override {
    if (!usablePath(path)) return EINVAL;
    return ::unlink(hostPath(path).c_str()) == 0 ? 0 : errno;
  }

  int syncDirectory(const std::string& path) override {
    if (!usablePath(path)) return EINVAL;
    const int fd = ::open(hostPath(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) return errno;
    const int rc = ::fsync(fd) == 0 ? 0 : errno;
    ::close(fd);
    return rc;
  }

  int fileInfo(const std::string& path, FileInfo* info) override {
    if (!usablePath(path)) return EINVAL;
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
    if (!usablePath(path)) return EINVAL;
    const int dirFd =
        ::open(hostPath(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NONBLOCK);
    if (dirFd < 0) return errno;
    DIR* dir = ::fdopendir(dirFd);
    if (dir == nullptr) {
      const int e = errno;
      ::close(dirFd);
      return e;
    }
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
      // A dangling link lists with its own date; an entry removed meanwhile
      // is simply no longer there. Neither spoils the rest of the listing.
      if (::fstatat(dirFd, d->d_name, &st, 0) != 0 &&
          ::fstatat(dirFd, d->d_name, &st, AT_SYMLINK_NOFOLLOW) != 0) {
        if (errno == ENOENT) continue;
        rc = errno;
        break;
      }
      entries->push_back({d->d_name, timespecTo2001(st.st_mtim), S_ISDIR(st.st_mode)});
    }
    ::closedir(dir);
    if (rc != 0) entries->clear();
    return rc;
  }

  int setModificationTime(const std::string& path, double secondsSince2001) override {
    if (!usablePath(path)) return EINVAL;
    if (!std::isfinite(secondsSince2001)) return EINVAL;
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
    if (!usablePath(path)) return EINVAL;
    return ::chmod(hostPath(path).c_str(), mode & 07777) == 0 ? 0 : errno;
  }

  int createDirectories(const std::string& path, mode_t mode) override {
    if (!usablePath(path)) return EINVAL;
    const std::string full = hostPath(path);
    std::size_t pos = 1;
    for (;;) {
      const std::size_t slash = full.find('/', pos);
      const std::string partial = full.substr(0, slash);
      if (!partial.empty() && partial != "/") {
        if (::mkdir(partial.c_str(), mode & 07777) == 0) {
          // Exactly the mode asked for, whatever the umask.
          if (::chmod(partial.c_str(), mode & 07777) != 0) return errno;
        } else if (errno != EEXIST) {
          return errno;
        }
      }
      if (slash == std::string::npos || slash + 1 >= full.size()) break;
      pos = slash + 1;
    }
    struct stat st;
    if (::stat(full.c_str(), &st) != 0) return errno;
    return S_ISDIR(st.st_mode) ? 0 : ENOTDIR;
  }

  int resolvePath(const std::string& path, std::string* resolved) override {
    if (!usablePath(path)) return EINVAL;
    char buf[PATH_MAX];
    if (::realpath(hostPath(path).c_str(), buf) == nullptr) return errno;
    const std::string host(buf);
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
    return 0;
  }

  int runProcess(const ProcessSpec& spec, bool wait, ProcessResult* result) override {
    if (!usablePath(spec.executable)) return EINVAL;
    posix::HostProcess process;
    process.executable = hostPath(spec.executable);
    // argv[0] is the system path, as the program would see it on its machine.
    process.arguments.push_back(spec.executable);
    for (const std::string& a : spec.arguments) {
      if (a.find('\0') != std::string::npos) return EINVAL;
      process.arguments.push_back(a);
    }
    // Children learn the root, so stand-in tools can map system paths too.
    for (char** e = environ; e != nullptr && *e != nullptr; ++e) {
      if (std::strncmp(*e, "KOLT_ROOT=", 10) != 0) process.environment.emplace_back(*e);
    }
    process.environment.push_back("KOLT_ROOT=" + root_);
    process.standardInput = spec.standardInput;
    process.input = spec.input;
    process.standardOutput = hostStream(spec.standardOutput);
    process.standardError = hostStream(spec.standardError);
    return posix::startProcess(process, wait, result);
  }

  int hardwareUUID(std::array<std::uint8_t, 16>* uuid) override {
    std::string text;
    if (readFile("/sys/class/dmi/id/product_uuid", &text) == 0 && parseHexUUID(text, uuid))
      return 0;
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
    if (!(seconds > 0) || !std::isfinite(seconds)) return;
    struct timespec ts;
    ts.tv_sec = static_cast<time_t>(seconds);
    ts.tv_nsec = static_cast<long>((seconds - static_cast<double>(ts.tv_sec)) * 1e9);
    while (::nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
  }

  int signalJob(const std::string& label, int signal) override {
    // A label names one file in /var/run, never a path.
    if (label.empty() || label[0] == '.' || label.find('/') != std::string::npos ||
        !usablePath(label)) {
      return EINVAL;
    }
    std::string text;
    const int rc = readFile("/var/run/" + label + ".pid", &text);
    if (rc != 0) return rc;
    long pid = 0;
    // Never 0, 1 or a negative number: those would signal a process group,
    // init or every process.
    if (!isPidText(text, &pid) || pid <= 1 || pid > INT_MAX) return ESRCH;
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

  StreamSpec hostStream(const StreamSpec& s) const {
    StreamSpec mapped = s;
    if (s.kind == StreamSpec::Kind::kAppendToExistingFile) {
      if (usablePath(s.path)) {
        mapped.path = hostPath(s.path);
      } else {
        mapped = StreamSpec::null();
      }
    }
    return mapped;
  }

  std::string root_;
};

}  // namespace

std::unique_ptr<Env> newPosixEnv(std::string root) {
  return std::make_unique<PosixEnv>(std::move(root));
}

}  // namespace kolt
