// Logging: the "%@" formatter, the diagnostic log, log_message's two writes,
// NError, and the sink under concurrent swaps.
#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "fixtures/fault_env.h"
#include "fixtures/log_capture.h"
#include "fixtures/sandbox.h"
#include "kolt/error.h"
#include "kolt/log.h"

namespace kolt {
namespace {

using testing::FaultEnv;
using testing::LogCapture;
using testing::LogLine;
using testing::Sandbox;
using testing::StderrCapture;

TEST(FormatMessage, PrintfConversionsAndValuesAndPercent) {
  EXPECT_EQ(formatMessage("%d %s %u %x %@ %%", {-5, "abc", 7u, 255, Value("v")}),
            "-5 abc 7 ff v %");
  EXPECT_EQ(formatMessage("%5d|%-4s|%.2f|%03X", {42, "ab", 3.14159, 10}), "   42|ab  |3.14|00A");
  EXPECT_EQ(formatMessage("%ld %lu %lld %zu %c", {-1L, 2UL, 3LL, std::size_t{4}, 65u}),
            "-1 2 3 4 A");
  EXPECT_EQ(formatMessage("%i%%", {100}), "100%");
  EXPECT_EQ(formatMessage("ends with %", {}), "ends with %");
}

TEST(FormatMessage, MissingAndAbsentArgumentsPrintAsNull) {
  EXPECT_EQ(formatMessage("%@ and %d and %s", {1}), "1 and (null) and (null)");
  const Value* absentValue = nullptr;
  const Error* absentError = nullptr;
  EXPECT_EQ(
      formatMessage("[%@][%@][%s]", {absentValue, absentError, static_cast<const char*>(nullptr)}),
      "[(null)][(null)][(null)]");
  EXPECT_EQ(formatMessage("%@", {std::optional<Value>()}), "(null)");
}

TEST(FormatMessage, ValuesAndErrorsPrintTheirDescriptions) {
  Value dict;
  dict.set("b", Value::integer(2));
  dict.set("a", Value("x"));
  EXPECT_EQ(formatMessage("cfg %@", {dict}), "cfg " + dict.description());
  EXPECT_EQ(formatMessage("%@", {Value::integer(-12)}), "-12");
  EXPECT_EQ(formatMessage("%@", {Error::vorn(501)}),
            "Error Domain=com.orvat.vorn.ErrorDomain Code=501 \"No existing configuration\"");
  EXPECT_EQ(formatMessage("%@ %@", {1.5, 0.1}), "1.5 0.1");
  // A conversion that does not fit its argument prints it as "%@" would.
  EXPECT_EQ(formatMessage("%d|%s", {Value("text"), 7}), "text|7");
  // Text that looks like a format is printed, not interpreted.
  EXPECT_EQ(formatMessage("%s|%@", {"%n%s%d", Value("%@%x")}), "%n%s%d|%@%x");
}

TEST(DiagnosticLog, OneLineToTheSinkWithoutPrefixAtNotice) {
  LogCapture capture;
  log("Unable to open config.plist (%d)", 2);
  EXPECT_EQ(capture.lines(),
            (std::vector<LogLine>{{kDiagnosticPriority, "Unable to open config.plist (2)"}}));
  EXPECT_EQ(kDiagnosticPriority, 13);
}

TEST(LogMessage, WritesTheFixedLineToTheSinkAndToStandardError) {
  LogCapture capture;
  StderrCapture err;
  const int rc = log_message(77, "volume 'v1' failed: 100%");
  const std::string written = err.finish();
  EXPECT_EQ(written, "vornd: [77] ERROR: volume 'v1' failed: 100%\n");
  EXPECT_EQ(capture.lines(),
            (std::vector<LogLine>{{13, "vornd: [77] ERROR: volume 'v1' failed: 100%"}}));
  EXPECT_EQ(rc, '\n');
}

TEST(LogMessage, AnAbsentMessagePrintsNull) {
  LogCapture capture;
  StderrCapture err;
  log_message(-3, nullptr);
  EXPECT_EQ(err.finish(), "vornd: [-3] ERROR: null\n");
}

TEST(NError, WritesOneLineInThisProcessesNameOnceToEachPlace) {
  Sandbox box;
  FaultEnv env(&box.env());
  env.fakeProcessId(1234);
  ScopedEnv scoped(&env);
  LogCapture capture;
  StderrCapture err;
  const Error failure = Error::posix(kPosixEINVAL, "Invalid argument");
  const Value url("ldap://mdc.example/");
  const Value* absent = nullptr;
  const int rc = NError("Error got error '%@' for url '%@' (%@)", failure, url, absent);
  const std::string expected =
      "vornd: [1234] ERROR: Error got error 'Error Domain=NSPOSIXErrorDomain Code=22 \"Invalid "
      "argument\"' for url 'ldap://mdc.example/' ((null))";
  EXPECT_EQ(err.finish(), expected + "\n");
  EXPECT_EQ(capture.lines(), (std::vector<LogLine>{{13, expected}}));
  EXPECT_EQ(rc, '\n');
}

// Counts lines per handler and checks each arrives whole.
struct Counter {
  std::atomic<int> lines{0};
  std::atomic<int> malformed{0};
  static void handle(int priority, const char* line, void* context) {
    auto* self = static_cast<Counter*>(context);
    if (priority != 13 || std::string(line).rfind("worker ", 0) != 0) ++self->malformed;
    ++self->lines;
  }
};

TEST(LogSink, SwappingTheSinkWhileOtherThreadsLogLosesAndTearsNothing) {
  Counter first, second;
  kolt_set_log_handler(&Counter::handle, &first);
  constexpr int kWorkers = 4, kLinesEach = 3000;
  std::atomic<bool> done{false};
  std::vector<std::thread> workers;
  for (int w = 0; w < kWorkers; ++w) {
    workers.emplace_back([w] {
      for (int i = 0; i < kLinesEach; ++i) log("worker %d line %d %@", w, i, Value("payload"));
    });
  }
  std::thread swapper([&] {
    for (int i = 0; !done.load(); ++i) {
      kolt_set_log_handler(&Counter::handle, i % 2 ? &first : &second);
    }
  });
  for (auto& t : workers) t.join();
  done = true;
  swapper.join();
  kolt_set_log_handler(nullptr, nullptr);
  EXPECT_EQ(first.lines + second.lines, kWorkers * kLinesEach);
  EXPECT_EQ(first.malformed + second.malformed, 0);
}

}  // namespace
}  // namespace kolt
