// pdcfgconvert: converts a volume's .cfg or .cfgx file into an XML property
// list on standard output. The controller-side volume collection runs it at
// "/System/Library/Filesystems/kolt.fs/Contents/bin/pdcfgconvert"; tests and
// the demo install it into sandbox roots and name the root in KOLT_ROOT.
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "command_line.h"
#include "kolt/env.h"
#include "usage_text.h"
#include "volume_conversion.h"

namespace {

constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;

void printError(const std::string& message) {
  std::fprintf(stderr, "pdcfgconvert: %s\n", message.c_str());
}

bool hasParentComponent(std::string_view path) {
  std::size_t start = 0;
  while (start <= path.size()) {
    std::size_t end = path.find('/', start);
    if (end == std::string_view::npos) end = path.size();
    if (path.substr(start, end - start) == "..") return true;
    start = end + 1;
  }
  return false;
}

// The Env that maps the source's paths: below KOLT_ROOT for an absolute path,
// the host itself for a relative one or when no root is set.
std::unique_ptr<kolt::Env> envForSource(const std::string& sourcePath, std::string* problem) {
  const char* root = std::getenv("KOLT_ROOT");
  const bool sandboxed = root != nullptr && *root != '\0' && std::string_view(root) != "/" &&
                         !sourcePath.empty() && sourcePath.front() == '/';
  if (!sandboxed) return kolt::newPosixEnv("/");
  if (hasParentComponent(sourcePath)) {
    *problem = sourcePath + ": a path below KOLT_ROOT may not hold \"..\"";
    return nullptr;
  }
  return kolt::newPosixEnv(root);
}

bool writeAll(std::FILE* stream, const std::string& text) {
  return std::fwrite(text.data(), 1, text.size(), stream) == text.size() &&
         std::fflush(stream) == 0;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace pdcfgconvert;
  const std::vector<std::string_view> arguments(argv + (argc > 0 ? 1 : 0), argv + argc);
  std::string problem;
  const std::optional<Options> options = parseCommandLine(arguments, &problem);
  if (!options) {
    printError(problem);
    std::fputs(std::string(kUsageLine).c_str(), stderr);
    return kExitUsage;
  }
  if (options->help) {
    if (!writeAll(stdout, usageText())) return kExitFailure;
    return 0;
  }
  const std::unique_ptr<kolt::Env> env = envForSource(options->sourcePath, &problem);
  if (env == nullptr) {
    printError(problem);
    return kExitFailure;
  }
  const std::optional<std::string> output = convertVolume(*options, *env, &problem);
  if (!output) {
    printError(problem);
    return kExitFailure;
  }
  if (!writeAll(stdout, *output)) {
    printError("cannot write to standard output");
    return kExitFailure;
  }
  return 0;
}
