// PosixEnv's child processes, driven through the recording stand-in.
#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <set>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "fixtures/sandbox.h"
#include "kolt/env.h"

namespace kolt {
namespace {

using ::testing::ElementsAre;
using testing::kToolDirectory;
using testing::Sandbox;
using testing::ToolCall;

std::string bigText(std::size_t size, char seed) {
  std::string text(size, '\0');
  for (std::size_t i = 0; i < size; ++i) text[i] = static_cast<char>(seed + (i * 7) % 61);
  return text;
}

ProcessSpec specFor(const std::string& executable, std::vector<std::string> arguments = {}) {
  ProcessSpec spec;
  spec.executable = executable;
  spec.arguments = std::move(arguments);
  return spec;
}

// The parent pid of a live process, from /proc.
pid_t parentOf(pid_t pid) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/status");
  std::string line;
  while (std::getline(in, line)) {
    if (line.rfind("PPid:", 0) == 0) return static_cast<pid_t>(std::atol(line.c_str() + 5));
  }
  return -1;
}

TEST(PosixEnvProcess, WaitedChildGetsItsArgumentsAndReportsStatusAndBothOutputs) {
  Sandbox box;
  const std::string tool = box.installTool("qmadmin");
  // More than a pipe holds on both streams at once: a reader that drains one
  // stream before the other deadlocks here.
  const std::string out = bigText(1 << 20, 'a');
  const std::string err = bigText((1 << 20) + 17, 'A');
  box.setToolOutput("qmadmin", out, err);
  box.setToolExitStatus("qmadmin", 3);

  ProcessSpec spec =
      specFor(tool, {"-s", "start vol1", "", "tab\there", "line\nfeed", "back\\slash"});
  spec.standardOutput = StreamSpec::pipe();
  spec.standardError = StreamSpec::pipe();
  ProcessResult result;
  ASSERT_EQ(box.env().runProcess(spec, /*wait=*/true, &result), 0);
  EXPECT_EQ(result.exitStatus, 3);
  EXPECT_GT(result.pid, 0);
  EXPECT_EQ(result.output.size(), out.size());
  EXPECT_TRUE(result.output == out);
  EXPECT_TRUE(result.errorOutput == err);

  const std::vector<ToolCall> calls = box.toolCalls();
  ASSERT_EQ(calls.size(), 1u);
  EXPECT_EQ(calls[0].name, "qmadmin");
  EXPECT_EQ(calls[0].pid, result.pid);
  EXPECT_THAT(calls[0].arguments,
              ElementsAre("-s", "start vol1", "", "tab\there", "line\nfeed", "back\\slash"));
}

TEST(PosixEnvProcess, LargeInputIsFedWhileOutputIsDrained) {
  Sandbox box;
  const std::string tool = box.installTool("pdcfgconvert");
  box.echoToolInput("pdcfgconvert");  // writes as it reads: needs both at once
  ProcessSpec spec = specFor(tool);
  spec.standardInput = StreamSpec::pipe();
  spec.input = bigText(3 << 20, '0');
  spec.standardOutput = StreamSpec::pipe();
  ProcessResult result;
  ASSERT_EQ(box.env().runProcess(spec, true, &result), 0);
  EXPECT_EQ(result.exitStatus, 0);
  EXPECT_TRUE(result.output == spec.input);
  ASSERT_EQ(box.toolCalls().size(), 1u);
  EXPECT_TRUE(box.toolCalls()[0].input == spec.input);
}

TEST(PosixEnvProcess, ChildThatStopsReadingItsInputDoesNotKillTheCaller) {
  Sandbox box;
  box.makeDirectory("/bin");
  ASSERT_EQ(::symlink("/bin/sh", box.hostPath("/bin/sh").c_str()), 0);
  ProcessSpec spec = specFor("/bin/sh", {"-c", "exit 4"});
  spec.standardInput = StreamSpec::pipe();
  spec.input = bigText(4 << 20, 'x');
  ProcessResult result;
  ASSERT_EQ(box.env().runProcess(spec, true, &result), 0);  // no SIGPIPE reached us
  EXPECT_EQ(result.exitStatus, 4);

  spec = specFor("/bin/sh", {"-c", "kill -TERM $$"});
  ASSERT_EQ(box.env().runProcess(spec, true, &result), 0);
  EXPECT_EQ(result.exitStatus, 128 + SIGTERM);
}

TEST(PosixEnvProcess, AWaitedChildThatLeavesADaemonHoldingItsOutputStillEnds) {
  Sandbox box;
  box.makeDirectory("/bin");
  ASSERT_EQ(::symlink("/bin/sh", box.hostPath("/bin/sh").c_str()), 0);
  // The background job keeps both output pipes open long after its parent
  // has exited.
  ProcessSpec spec = specFor("/bin/sh", {"-c", "sleep 1000 & echo $!; echo started >&2; exit 6"});
  spec.standardOutput = StreamSpec::pipe();
  spec.standardError = StreamSpec::pipe();
  ProcessResult result;
  ASSERT_EQ(box.env().runProcess(spec, true, &result), 0);
  const pid_t daemon = static_cast<pid_t>(std::atol(result.output.c_str()));
  if (daemon > 1) ::kill(daemon, SIGKILL);
  EXPECT_GT(daemon, 1);
  EXPECT_EQ(result.errorOutput, "started\n");
  EXPECT_EQ(result.exitStatus, 6);
}

TEST(PosixEnvProcess, ChildSeesOnlyItsStandardStreamsAndTheSandboxRoot) {
  Sandbox box;
  box.makeDirectory("/bin");
  ASSERT_EQ(::symlink("/bin/sh", box.hostPath("/bin/sh").c_str()), 0);
  // A descriptor that someone opened without close-on-exec.
  const int leaked = ::open("/dev/null", O_RDONLY);
  ASSERT_GE(leaked, 0);
  ASSERT_EQ(::dup2(leaked, 77), 77);
  ::setenv("KOLT_ROOT", "/somewhere/else", 1);
  ProcessSpec spec = specFor("/bin/sh", {"-c", "echo \"$KOLT_ROOT\"; ls /proc/$$/fd"});
  spec.standardOutput = StreamSpec::pipe();
  ProcessResult result;
  const int rc = box.env().runProcess(spec, true, &result);
  ::unsetenv("KOLT_ROOT");
  ::close(77);
  ::close(leaked);
  ASSERT_EQ(rc, 0);
  std::istringstream lines(result.output);
  std::string rootLine;
  std::getline(lines, rootLine);
  EXPECT_EQ(rootLine, box.root());
  std::set<int> fds;
  for (std::string fd; lines >> fd;) fds.insert(std::atoi(fd.c_str()));
  EXPECT_EQ(fds, (std::set<int>{0, 1, 2}));
}

TEST(PosixEnvProcess, ChildNotWaitedForRunsOnAndNeverBecomesOurZombie) {
  Sandbox box;
  const std::string tool = box.installTool("vornctl");
  box.holdTool("vornctl");
  ProcessSpec spec = specFor(tool, {"unloadProfile"});
  spec.standardInput = StreamSpec::pipe();
  spec.input = bigText(200000, 'k');  // more than a default pipe holds
  spec.standardOutput = StreamSpec::pipe();
  ProcessResult result;
  ASSERT_EQ(box.env().runProcess(spec, /*wait=*/false, &result), 0);
  ASSERT_GT(result.pid, 0);
  EXPECT_EQ(result.exitStatus, -1);

  const std::vector<ToolCall> calls = box.waitForToolCalls(1);
  ASSERT_EQ(calls.size(), 1u);
  EXPECT_EQ(calls[0].pid, result.pid);
  EXPECT_THAT(calls[0].arguments, ElementsAre("unloadProfile"));
  EXPECT_TRUE(calls[0].input == spec.input);
  // Held, so still running: and not our child.
  EXPECT_NE(parentOf(result.pid), ::getpid());
  int status = 0;
  EXPECT_EQ(::waitpid(-1, &status, WNOHANG), -1);
  EXPECT_EQ(errno, ECHILD);
  box.releaseTool("vornctl");
}

TEST(PosixEnvProcess, ExecFailureIsTheStartsError) {
  Sandbox box;
  box.writeFile(std::string(kToolDirectory) + "not-executable", "#!/bin/sh\n", 0644);
  for (const bool wait : {true, false}) {
    ProcessResult result;
    EXPECT_EQ(box.env().runProcess(specFor("/System/missing-tool"), wait, &result), ENOENT);
    EXPECT_EQ(box.env().runProcess(specFor(std::string(kToolDirectory) + "not-executable"), wait,
                                   &result),
              EACCES);
    EXPECT_EQ(box.env().runProcess(specFor("/etc"), wait, &result), EACCES);
  }
  int status = 0;
  EXPECT_EQ(::waitpid(-1, &status, WNOHANG), -1);  // nothing left behind
}

TEST(PosixEnvProcess, OutputAppendsToAnExistingFileButNeverCreatesOne) {
  Sandbox box;
  const std::string tool = box.installTool("launchctl", "/bin/");
  box.setToolOutput("launchctl", "out line\n", "err line\n");
  box.writeFile("/var/log/tool.log", "before\n", 0640);

  ProcessSpec spec = specFor(tool, {"load"});
  spec.standardOutput = StreamSpec::appendTo("/var/log/tool.log");
  spec.standardError = StreamSpec::appendTo("/var/log/tool.log");
  ProcessResult result;
  ASSERT_EQ(box.env().runProcess(spec, true, &result), 0);
  EXPECT_EQ(box.readFile("/var/log/tool.log"), "before\nout line\nerr line\n");
  EXPECT_EQ(box.fileMode("/var/log/tool.log"), 0640u);

  spec.standardOutput = StreamSpec::appendTo("/var/log/missing.log");
  spec.standardError = StreamSpec::null();
  ASSERT_EQ(box.env().runProcess(spec, true, &result), 0);
  EXPECT_EQ(result.exitStatus, 0);
  EXPECT_FALSE(box.exists("/var/log/missing.log"));
  EXPECT_EQ(box.toolCalls("launchctl").size(), 2u);
}

}  // namespace
}  // namespace kolt
