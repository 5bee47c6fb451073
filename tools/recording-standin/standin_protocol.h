// What the recording stand-in and the sandbox fixture agree on: where the
// stand-in keeps its record and reads its instructions, and how one record
// line is written.
//
// All files live in "<root>/.kolt-standin/", where <root> is the sandbox root
// that the stand-in learns from KOLT_ROOT:
//   calls          one line per run: pid, name, input, arguments...; fields
//                  separated by tabs, with "\\", "\t" and "\n" escaped
//   <name>.exit    exit status (decimal); 0 when absent
//   <name>.stdout  printed on standard output
//   <name>.stderr  printed on standard error
//   <name>.echo    present: copy standard input to standard output
//   <name>.hold    present: wait until it is removed (at most 30 seconds)
#ifndef KOLT_TOOLS_RECORDING_STANDIN_PROTOCOL_H
#define KOLT_TOOLS_RECORDING_STANDIN_PROTOCOL_H

#include <string>
#include <string_view>
#include <vector>

namespace kolt::standin {

inline constexpr const char* kControlDirectory = "/.kolt-standin/";
inline constexpr const char* kRecordFile = "calls";

inline std::string escapeField(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (const char c : text) {
    if (c == '\\') {
      out += "\\\\";
    } else if (c == '\t') {
      out += "\\t";
    } else if (c == '\n') {
      out += "\\n";
    } else {
      out += c;
    }
  }
  return out;
}

// Splits one record line (without its line feed) into unescaped fields.
inline std::vector<std::string> splitRecord(std::string_view line) {
  std::vector<std::string> fields(1);
  for (std::size_t i = 0; i < line.size(); ++i) {
    const char c = line[i];
    if (c == '\t') {
      fields.emplace_back();
    } else if (c == '\\' && i + 1 < line.size()) {
      const char next = line[++i];
      fields.back() += next == 't' ? '\t' : next == 'n' ? '\n' : next;
    } else {
      fields.back() += c;
    }
  }
  return fields;
}

}  // namespace kolt::standin

#endif  // KOLT_TOOLS_RECORDING_STANDIN_PROTOCOL_H
