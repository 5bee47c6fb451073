// A stand-in for the SAN's external tools in tests and the demo. Installed
// under a tool's name (qmadmin, vornctl, launchctl, ...), each run appends one
// record of its name, arguments, standard input and pid to a file inside the
// sandbox root named by KOLT_ROOT, then behaves as files there say (see
// standin_protocol.h).
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>

#include "standin_protocol.h"

namespace {

bool exists(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0;
}

bool readWhole(const std::string& path, std::string* out) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  char buf[65536];
  for (;;) {
    const ssize_t n = ::read(fd, buf, sizeof buf);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;
    out->append(buf, static_cast<std::size_t>(n));
  }
  ::close(fd);
  return true;
}

bool writeWhole(int fd, const std::string& data) {
  std::size_t done = 0;
  while (done < data.size()) {
    const ssize_t n = ::write(fd, data.data() + done, data.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    done += static_cast<std::size_t>(n);
  }
  return true;
}

// Reads standard input to its end; with `echo`, copies each piece to
// standard output as it arrives.
std::string readInput(bool echo) {
  std::string input;
  if (::isatty(0)) return input;
  char buf[65536];
  for (;;) {
    const ssize_t n = ::read(0, buf, sizeof buf);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;
    input.append(buf, static_cast<std::size_t>(n));
    if (echo) writeWhole(1, std::string(buf, static_cast<std::size_t>(n)));
  }
  return input;
}

}  // namespace

int main(int argc, char** argv) {
  const char* root = std::getenv("KOLT_ROOT");
  if (root == nullptr || *root == '\0') {
    std::fprintf(stderr, "recording stand-in: KOLT_ROOT is not set\n");
    return 126;
  }
  std::string name = argc > 0 ? argv[0] : "standin";
  if (const std::size_t slash = name.find_last_of('/'); slash != std::string::npos) {
    name = name.substr(slash + 1);
  }
  std::string control = root;
  if (!control.empty() && control.back() == '/') control.pop_back();
  control += kolt::standin::kControlDirectory;
  const std::string base = control + name;

  const std::string input = readInput(exists(base + ".echo"));

  // One write with O_APPEND: records of concurrent runs never interleave.
  std::string line = kolt::standin::escapeField(std::to_string(::getpid()));
  line += '\t' + kolt::standin::escapeField(name);
  line += '\t' + kolt::standin::escapeField(input);
  for (int i = 1; i < argc; ++i) line += '\t' + kolt::standin::escapeField(argv[i]);
  line += '\n';
  ::mkdir(control.c_str(), 0755);
  const int record = ::open((control + kolt::standin::kRecordFile).c_str(),
                            O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
  if (record < 0 ||
      ::write(record, line.data(), line.size()) != static_cast<ssize_t>(line.size())) {
    std::perror("recording stand-in: cannot record");
    return 125;
  }
  ::close(record);

  const auto giveUp = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (exists(base + ".hold") && std::chrono::steady_clock::now() < giveUp) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }

  std::string text;
  if (readWhole(base + ".stdout", &text)) writeWhole(1, text);
  text.clear();
  if (readWhole(base + ".stderr", &text)) writeWhole(2, text);
  text.clear();
  if (readWhole(base + ".exit", &text)) return std::atoi(text.c_str());
  return 0;
}
