// The components of a slash-separated path, with "." and ".." resolved by
// name (".." never climbs above the first component). Shared by the path
// mapping of the Env and by the test Envs that model a file system.
#ifndef KOLT_PLATFORM_PATH_COMPONENTS_H
#define KOLT_PLATFORM_PATH_COMPONENTS_H

#include <string_view>
#include <vector>

namespace kolt {

inline std::vector<std::string_view> pathComponents(std::string_view path) {
  std::vector<std::string_view> parts;
  std::size_t start = 0;
  while (start <= path.size()) {
    std::size_t end = path.find('/', start);
    if (end == std::string_view::npos) end = path.size();
    const std::string_view part = path.substr(start, end - start);
    if (part == "..") {
      if (!parts.empty()) parts.pop_back();
    } else if (!part.empty() && part != ".") {
      parts.push_back(part);
    }
    start = end + 1;
  }
  return parts;
}

}  // namespace kolt

#endif  // KOLT_PLATFORM_PATH_COMPONENTS_H
