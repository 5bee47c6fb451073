#include "demo_report.h"

#include <cstdio>
#include <ctime>

#include "kolt/change_check.h"

namespace kolt::demo {

void Report::step(const std::string& machine, const std::string& title) {
  ++steps_;
  header_ = "[" + std::to_string(steps_) + "] " + (machine.empty() ? "" : machine + ": ") + title;
  milliseconds_ = -1;
  lines_.clear();
}

void Report::took(std::chrono::steady_clock::duration elapsed) {
  milliseconds_ = std::chrono::duration<double, std::milli>(elapsed).count();
}

void Report::line(const std::string& label, const std::string& text) {
  lines_.push_back({label, text});
}

void Report::check(bool ok, const std::string& expectation) {
  ++checks_;
  if (ok) return;
  ++failures_;
  lines_.push_back({"FAILED", "expected " + expectation});
}

void Report::endStep() {
  if (milliseconds_ >= 0) {
    std::printf("\n%-70s %8.1f ms\n", header_.c_str(), milliseconds_);
  } else {
    std::printf("\n%s\n", header_.c_str());
  }
  for (const Line& l : lines_) {
    // Continuation lines of a long text keep the column.
    std::string text = l.text;
    std::size_t pos = 0;
    while ((pos = text.find('\n', pos)) != std::string::npos) {
      text.replace(pos, 1, "\n                  ");
      pos += 19;
    }
    std::printf("    %-13s %s\n", l.label.c_str(), text.c_str());
  }
  std::fflush(stdout);
}

std::string joined(const std::vector<std::string>& items, const std::string& separator) {
  std::string out;
  for (const std::string& item : items) out += (out.empty() ? "" : separator) + item;
  return out.empty() ? "none" : out;
}

std::string maskText(std::uint32_t mask) {
  char hex[16];
  std::snprintf(hex, sizeof hex, "0x%02x", mask);
  std::vector<std::string> bits;
  if (mask & kChangeNewConfig) bits.push_back("0x40 new document handed in");
  if (mask & kChangeApplied) bits.push_back("0x01 published configuration applied");
  if (mask & kChangeRole) bits.push_back("0x02 role set or changed");
  if (mask & kChangeQuerixServer) bits.push_back("0x04 search-service settings changed");
  if (mask & kChangeControllerToClient) bits.push_back("0x08 controller became client");
  return std::string(hex) + (bits.empty() ? " (nothing changed)" : " = " + joined(bits, " + "));
}

std::string dateText(double secondsSince2001) {
  const std::time_t t = static_cast<std::time_t>(secondsSince2001) + 978307200;
  std::tm tm{};
  ::gmtime_r(&t, &tm);
  char text[40];
  std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S UTC", &tm);
  return text;
}

}  // namespace kolt::demo
