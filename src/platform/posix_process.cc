// Child processes: fork and exec with the standard streams set up, exec
// failures reported through a status pipe, both output pipes drained together.
#include "platform/posix_process.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string_view>

namespace kolt::posix {
namespace {

// An owned descriptor.
class Fd {
 public:
  Fd() = default;
  explicit Fd(int fd) : fd_(fd) {}
  ~Fd() { reset(); }
  Fd(const Fd&) = delete;
  Fd& operator=(const Fd&) = delete;
  int get() const { return fd_; }
  bool valid() const { return fd_ >= 0; }
  void reset(int fd = -1) {
    if (fd_ >= 0) ::close(fd_);
    fd_ = fd;
  }

 private:
  int fd_ = -1;
};

// A pipe whose ends are both close-on-exec.
int makePipe(Fd* readEnd, Fd* writeEnd) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return errno;
  readEnd->reset(ends[0]);
  writeEnd->reset(ends[1]);
  return 0;
}

int openNullDevice(int flags, Fd* fd) {
  const int n = ::open("/dev/null", flags | O_CLOEXEC | O_NOCTTY);
  if (n < 0) return errno;
  fd->reset(n);
  return 0;
}

// The child's end of an output stream, and the parent's end when it is a pipe.
int openOutput(const StreamSpec& spec, bool pipeAllowed, Fd* childEnd, Fd* parentEnd) {
  switch (spec.kind) {
    case StreamSpec::Kind::kPipe:
      if (pipeAllowed) return makePipe(parentEnd, childEnd);
      break;
    case StreamSpec::Kind::kAppendToExistingFile: {
      // Neither created nor truncated; a file that cannot be opened leaves
      // the stream on the null device.
      const int n = ::open(spec.path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC | O_NOCTTY);
      if (n >= 0) {
        childEnd->reset(n);
        return 0;
      }
      break;
    }
    case StreamSpec::Kind::kNull:
      break;
  }
  return openNullDevice(O_WRONLY, childEnd);
}

int writeAllNonBlocking(int fd, std::string_view data) {
  while (!data.empty()) {
    const ssize_t n = ::write(fd, data.data(), data.size());
    if (n < 0) {
      if (errno == EINTR) continue;
      return errno == EAGAIN ? E2BIG : errno;
    }
    data.remove_prefix(static_cast<std::size_t>(n));
  }
  return 0;
}

// The input of a child that is not waited for: a pipe filled before the start.
int preparePrefilledInput(const std::string& input, Fd* childEnd) {
  Fd writeEnd;
  if (const int rc = makePipe(childEnd, &writeEnd); rc != 0) return rc;
  if (input.size() > 65536 &&
      ::fcntl(writeEnd.get(), F_SETPIPE_SZ,
              static_cast<int>(std::min<std::size_t>(input.size(), 1u << 30))) < 0) {
    return errno;
  }
  if (::fcntl(writeEnd.get(), F_SETFL, O_NONBLOCK) != 0) return errno;
  return writeAllNonBlocking(writeEnd.get(), input);
}

// What the child (or the intermediate process) tells the parent through the
// status pipe. Writes of this size on a pipe are atomic.
struct Report {
  int kind;
  int value;
};
constexpr int kReportPid = 1;        // the intermediate's child started: value is its pid
constexpr int kReportForkError = 2;  // the intermediate could not fork: value is errno
constexpr int kReportExecError = 3;  // exec failed: value is errno

void sendReport(int fd, int kind, int value) {
  const Report report{kind, value};
  while (::write(fd, &report, sizeof report) < 0 && errno == EINTR) {
  }
}

// Reads one report; false at end of file (every writer closed its end).
bool receiveReport(int fd, Report* report) {
  for (;;) {
    const ssize_t n = ::read(fd, report, sizeof *report);
    if (n < 0 && errno == EINTR) continue;
    return n == static_cast<ssize_t>(sizeof *report);
  }
}

void closeRangeFrom(unsigned first, unsigned last, int maxFd) {
  if (first > last) return;
  if (::close_range(first, last, 0) == 0) return;
  for (int fd = static_cast<int>(first); fd < maxFd && static_cast<unsigned>(fd) <= last; ++fd) {
    ::close(fd);
  }
}

struct ChildSetup {
  const char* executable;
  char* const* argv;
  char* const* envp;
  int in, out, err, status;
  int maxFd;
  bool detach;
};

// Runs in the forked child: only async-signal-safe calls from here on.
[[noreturn]] void runChild(const ChildSetup& s) {
  sigset_t none;
  sigemptyset(&none);
  ::sigprocmask(SIG_SETMASK, &none, nullptr);
  struct sigaction dfl {};
  dfl.sa_handler = SIG_DFL;
  ::sigaction(SIGPIPE, &dfl, nullptr);

  // Move every descriptor we need above the standard ones first, so that
  // none is overwritten while the standard streams are put in place.
  const int status = ::fcntl(s.status, F_DUPFD_CLOEXEC, 3);
  const int in = ::fcntl(s.in, F_DUPFD_CLOEXEC, 3);
  const int out = ::fcntl(s.out, F_DUPFD_CLOEXEC, 3);
  const int err = ::fcntl(s.err, F_DUPFD_CLOEXEC, 3);
  if (status < 0) ::_exit(127);
  if (in < 0 || out < 0 || err < 0) {
    sendReport(status, kReportExecError, errno);
    ::_exit(127);
  }

  if (s.detach) {
    const pid_t grandchild = ::fork();
    if (grandchild < 0) {
      sendReport(status, kReportForkError, errno);
      ::_exit(127);
    }
    if (grandchild > 0) {
      sendReport(status, kReportPid, grandchild);
      ::_exit(0);
    }
  }

  if (::dup2(in, 0) < 0 || ::dup2(out, 1) < 0 || ::dup2(err, 2) < 0) {
    sendReport(status, kReportExecError, errno);
    ::_exit(127);
  }
  // Nothing else of the caller's reaches the program, even descriptors that
  // other code opened without close-on-exec.
  closeRangeFrom(3, static_cast<unsigned>(status) - 1, s.maxFd);
  closeRangeFrom(static_cast<unsigned>(status) + 1, ~0u, s.maxFd);
  ::execve(s.executable, s.argv, s.envp);
  sendReport(status, kReportExecError, errno);
  ::_exit(127);
}

// Blocks SIGPIPE on this thread while we write to a child's input, and
// discards a SIGPIPE that our own write raised.
class SigpipeGuard {
 public:
  SigpipeGuard() {
    sigemptyset(&pipeSet_);
    sigaddset(&pipeSet_, SIGPIPE);
    sigset_t pending;
    sigemptyset(&pending);
    ::sigpending(&pending);
    wasPending_ = sigismember(&pending, SIGPIPE) == 1;
    ::pthread_sigmask(SIG_BLOCK, &pipeSet_, &previous_);
  }
  ~SigpipeGuard() {
    if (raised_ && !wasPending_) {
      const struct timespec zero {};
      while (::sigtimedwait(&pipeSet_, nullptr, &zero) < 0 && errno == EINTR) {
      }
    }
    ::pthread_sigmask(SIG_SETMASK, &previous_, nullptr);
  }
  void noteRaised() { raised_ = true; }

 private:
  sigset_t pipeSet_;
  sigset_t previous_;
  bool wasPending_ = false;
  bool raised_ = false;
};

// True once `pid` has exited; it stays waitable (not reaped).
bool hasExited(pid_t pid) {
  siginfo_t info{};
  return ::waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOHANG | WNOWAIT) == 0 &&
         info.si_pid == pid;
}

// Reads what is available now; returns false at end of file or on error.
bool drainAvailable(Fd* fd, std::string* sink) {
  char buffer[65536];
  for (;;) {
    const ssize_t n = ::read(fd->get(), buffer, sizeof buffer);
    if (n > 0) {
      sink->append(buffer, static_cast<std::size_t>(n));
      continue;
    }
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && errno == EAGAIN) return true;
    fd->reset();
    return false;
  }
}

// Feeds the input and drains both outputs at once, until both outputs end or
// the child has exited: a grandchild that keeps the child's output open (a
// tool that starts a daemon) must not hold the caller.
int pump(pid_t pid, Fd* in, std::string_view input, Fd* out, Fd* err, std::string* output,
         std::string* errorOutput) {
  SigpipeGuard guard;
  if (in->valid()) {
    if (input.empty() || ::fcntl(in->get(), F_SETFL, O_NONBLOCK) != 0) in->reset();
  }
  for (Fd* fd : {out, err}) {
    if (fd->valid()) ::fcntl(fd->get(), F_SETFL, O_NONBLOCK);
  }
  // The child's exit wakes poll through a pid descriptor; without one we
  // look every 100 ms.
  Fd exitFd(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  bool exited = false;
  while (!exited && (in->valid() || out->valid() || err->valid())) {
    struct pollfd fds[4];
    nfds_t count = 0;
    const auto add = [&](const Fd& fd, short events) {
      fds[count++] = {fd.valid() ? fd.get() : -1, events, 0};
    };
    add(*in, POLLOUT);
    add(*out, POLLIN);
    add(*err, POLLIN);
    add(exitFd, POLLIN);
    const int ready = ::poll(fds, count, exitFd.valid() ? -1 : 100);
    if (ready < 0) {
      if (errno == EINTR) continue;
      return errno;
    }
    if (fds[0].revents != 0) {
      const ssize_t n =
          ::write(in->get(), input.data(), std::min<std::size_t>(input.size(), 65536));
      if (n > 0) {
        input.remove_prefix(static_cast<std::size_t>(n));
        if (input.empty()) in->reset();
      } else if (n < 0 && errno != EINTR && errno != EAGAIN) {
        // The child stopped reading: the rest of the input is dropped.
        if (errno == EPIPE) guard.noteRaised();
        in->reset();
      }
    }
    if (fds[1].revents != 0) drainAvailable(out, output);
    if (fds[2].revents != 0) drainAvailable(err, errorOutput);
    exited = exitFd.valid() ? fds[3].revents != 0 : hasExited(pid);
  }
  // Whatever the child wrote before it exited is in the pipes now.
  if (out->valid()) drainAvailable(out, output);
  if (err->valid()) drainAvailable(err, errorOutput);
  return 0;
}

int waitForExit(pid_t pid, int* status) {
  for (;;) {
    if (::waitpid(pid, status, 0) >= 0) return 0;
    if (errno != EINTR) return errno;
  }
}

int maxDescriptor() {
  struct rlimit limit;
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur == RLIM_INFINITY) return 65536;
  return static_cast<int>(std::min<rlim_t>(limit.rlim_cur, 1 << 20));
}

}  // namespace

int startProcess(const HostProcess& process, bool wait, ProcessResult* result) {
  ProcessResult ignored;
  if (result == nullptr) result = &ignored;
  *result = ProcessResult();

  // Everything the child needs is prepared before the fork.
  std::vector<std::string> argStrings = process.arguments;
  if (argStrings.empty()) argStrings.push_back(process.executable);
  std::vector<char*> argv;
  for (auto& a : argStrings) argv.push_back(a.data());
  argv.push_back(nullptr);
  std::vector<std::string> envStrings = process.environment;
  std::vector<char*> envp;
  for (auto& e : envStrings) envp.push_back(e.data());
  envp.push_back(nullptr);

  Fd childIn, parentIn, childOut, parentOut, childErr, parentErr, statusRead, statusWrite;
  int rc = 0;
  if (process.standardInput.kind != StreamSpec::Kind::kPipe) {
    rc = openNullDevice(O_RDONLY, &childIn);
  } else if (wait) {
    rc = makePipe(&childIn, &parentIn);
  } else {
    rc = preparePrefilledInput(process.input, &childIn);
  }
  if (rc == 0) rc = openOutput(process.standardOutput, wait, &childOut, &parentOut);
  if (rc == 0) rc = openOutput(process.standardError, wait, &childErr, &parentErr);
  if (rc == 0) rc = makePipe(&statusRead, &statusWrite);
  if (rc != 0) return rc;

  const ChildSetup setup{process.executable.c_str(),
                         argv.data(),
                         envp.data(),
                         childIn.get(),
                         childOut.get(),
                         childErr.get(),
                         statusWrite.get(),
                         maxDescriptor(),
                         !wait};
  const pid_t pid = ::fork();
  if (pid < 0) return errno;
  if (pid == 0) runChild(setup);

  // Parent: keep only our ends, so end of file arrives when the child is done.
  childIn.reset();
  childOut.reset();
  childErr.reset();
  statusWrite.reset();

  Report report{};
  if (!wait) {
    // The intermediate reports the grandchild's pid (or its fork error) and
    // exits at once; we reap it here.
    const bool gotPid = receiveReport(statusRead.get(), &report);
    int status = 0;
    waitForExit(pid, &status);
    if (!gotPid) return ECHILD;
    if (report.kind != kReportPid) return report.value;
    result->pid = report.value;
    // End of file means the exec succeeded (the pipe closed on exec).
    if (receiveReport(statusRead.get(), &report) && report.kind == kReportExecError) {
      result->pid = -1;
      return report.value;
    }
    return 0;
  }

  if (receiveReport(statusRead.get(), &report) && report.kind == kReportExecError) {
    int status = 0;
    waitForExit(pid, &status);
    return report.value;
  }
  result->pid = pid;
  const int pumpRc = pump(pid, &parentIn, process.input, &parentOut, &parentErr, &result->output,
                          &result->errorOutput);
  parentIn.reset();
  parentOut.reset();
  parentErr.reset();
  int status = 0;
  if (const int waitRc = waitForExit(pid, &status); waitRc != 0) return waitRc;
  if (pumpRc != 0) return pumpRc;
  result->exitStatus = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  return 0;
}

}  // namespace kolt::posix
