// Reading and writing the lines of fsmlist.
#include "config/hosted_volume_list.h"

#include "config/utf8_text.h"
#include "kolt/controller_helpers.h"
#include "kolt/env.h"

namespace kolt {

Array parseHostedVolumeList(std::string_view text) {
  Array names;
  if (!utf8::isValid(text)) return names;
  std::size_t lineStart = 0;
  while (lineStart <= text.size()) {
    std::size_t lineEnd = text.find('\n', lineStart);
    if (lineEnd == std::string_view::npos) lineEnd = text.size();
    const std::string_view line = text.substr(lineStart, lineEnd - lineStart);
    // The first field ends at the first white-space character.
    std::size_t pos = 0;
    std::size_t fieldEnd = line.size();
    char32_t c;
    for (std::size_t before = pos; utf8::next(line, &pos, &c); before = pos) {
      if (utf8::isWhitespace(c)) {
        fieldEnd = before;
        break;
      }
    }
    if (fieldEnd > 0) names.emplace_back(std::string(line.substr(0, fieldEnd)));
    lineStart = lineEnd + 1;
  }
  return names;
}

std::string hostedVolumeLine(std::string_view volumeName) {
  std::string line(volumeName);
  line += " . 0\n";
  return line;
}

Array getHostedVolumeList() {
  std::string text;
  if (currentEnv().readFile(kFsmlistPath, &text) != 0) return {};
  return parseHostedVolumeList(text);
}

}  // namespace kolt
