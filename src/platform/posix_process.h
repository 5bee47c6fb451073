// Child processes on the real host, for PosixEnv.
#ifndef KOLT_PLATFORM_POSIX_PROCESS_H
#define KOLT_PLATFORM_POSIX_PROCESS_H

#include <string>
#include <vector>

#include "kolt/env.h"

namespace kolt::posix {

// A process to start, with every path already mapped to the host.
struct HostProcess {
  std::string executable;                // host path
  std::vector<std::string> arguments;    // argv, argv[0] included
  std::vector<std::string> environment;  // "NAME=value" entries
  StreamSpec standardInput;              // kNull or kPipe; any other kind means kNull
  std::string input;                     // fed to a piped standard input
  StreamSpec standardOutput;             // paths of kAppendToExistingFile are host paths
  StreamSpec standardError;
};

// Starts `process`. With `wait`, feeds the input and drains both output pipes
// together (no deadlock whatever their sizes), then collects the exit status.
// Without `wait`, the child is started through an intermediate process that
// is reaped at once, so it never becomes a zombie of the caller; its piped
// input must fit in a pipe (it is written before the start) and piped output
// goes to the null device. Returns 0, or the errno of the failed start
// (including the child's failed exec).
int startProcess(const HostProcess& process, bool wait, ProcessResult* result);

}  // namespace kolt::posix

#endif  // KOLT_PLATFORM_POSIX_PROCESS_H
