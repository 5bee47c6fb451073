// How the demo tells its story: numbered steps, one per thing a machine does,
// each with its time, what it did, and checks that the result is what a SAN
// administrator expects. A failed check is printed at once and makes the
// demo exit non-zero.
#ifndef KOLT_EXAMPLES_DEMO_REPORT_H
#define KOLT_EXAMPLES_DEMO_REPORT_H

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace kolt::demo {

class Report {
 public:
  // Starts step `title` on `machine` (empty: not one machine's step).
  void step(const std::string& machine, const std::string& title);
  // The time the library calls of the step took.
  void took(std::chrono::steady_clock::duration elapsed);
  // One labelled line of what the step did.
  void line(const std::string& label, const std::string& text);
  // A check of the step; a failure is printed and counted.
  void check(bool ok, const std::string& expectation);
  // Ends the step: prints its lines.
  void endStep();

  int failures() const { return failures_; }
  int checks() const { return checks_; }
  int steps() const { return steps_; }

 private:
  struct Line {
    std::string label, text;
  };
  std::string header_;
  double milliseconds_ = -1;
  std::vector<Line> lines_;
  int steps_ = 0;
  int checks_ = 0;
  int failures_ = 0;
};

// Runs `body` and returns how long it took.
template <typename Body>
std::chrono::steady_clock::duration timed(Body&& body) {
  const auto start = std::chrono::steady_clock::now();
  body();
  return std::chrono::steady_clock::now() - start;
}

// Text helpers for the report.
std::string joined(const std::vector<std::string>& items, const std::string& separator = ", ");
std::string maskText(std::uint32_t mask);
// A date (seconds since 2001) as "YYYY-MM-DD HH:MM:SS UTC".
std::string dateText(double secondsSince2001);

}  // namespace kolt::demo

#endif  // KOLT_EXAMPLES_DEMO_REPORT_H
