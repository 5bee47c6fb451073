// Option parsing by hand: four options, no global state.
#include "command_line.h"

#include "value_text.h"

namespace pdcfgconvert {

bool isVolumeName(std::string_view name) {
  if (name.empty() || name.size() > 255 || !isValidUtf8(name)) return false;
  for (char c : name) {
    const auto byte = static_cast<unsigned char>(c);
    if (c == '/' || c == '.' || byte < 0x20 || byte == 0x7F) return false;
  }
  return true;
}

std::optional<Options> parseCommandLine(const std::vector<std::string_view>& arguments,
                                        std::string* problem) {
  Options options;
  std::optional<std::string_view> volumeName, format;
  std::vector<std::string_view> paths;
  bool optionsEnded = false;
  for (std::size_t i = 0; i < arguments.size(); ++i) {
    const std::string_view argument = arguments[i];
    if (optionsEnded || argument.size() < 2 || argument[0] != '-') {
      paths.push_back(argument);
      continue;
    }
    if (argument == "--") {
      optionsEnded = true;
    } else if (argument == "-h" || argument == "--help") {
      options.help = true;
      return options;
    } else if (argument == "-A") {
      options.withAuxData = true;
    } else if (argument.substr(0, 2) == "-n" || argument.substr(0, 2) == "-F") {
      std::optional<std::string_view>& slot = argument[1] == 'n' ? volumeName : format;
      const std::string option(argument.substr(0, 2));
      if (slot) {
        *problem = "option " + option + " is given twice";
        return std::nullopt;
      }
      if (argument.size() > 2) {
        slot = argument.substr(2);
      } else if (i + 1 < arguments.size()) {
        slot = arguments[++i];
      } else {
        *problem = "option " + option + " needs a value";
        return std::nullopt;
      }
    } else {
      *problem = "unknown option " + quoteForMessage(argument);
      return std::nullopt;
    }
  }
  if (!volumeName) {
    *problem = "the volume name (-n <volume>) is missing";
    return std::nullopt;
  }
  if (!isVolumeName(*volumeName)) {
    *problem = "bad volume name " + quoteForMessage(*volumeName) +
               ": 1 to 255 bytes of UTF-8 without \"/\", \".\" or control characters";
    return std::nullopt;
  }
  options.volumeName = std::string(*volumeName);
  if (format && *format != "plist") {
    *problem = "unsupported output format " + quoteForMessage(*format) + "; only plist is";
    return std::nullopt;
  }
  if (paths.size() != 1) {
    *problem = paths.empty() ? "the source file is missing" : "more than one source file given";
    return std::nullopt;
  }
  options.sourcePath = std::string(paths.front());
  const auto endsWith = [](std::string_view text, std::string_view suffix) {
    return text.size() >= suffix.size() && text.substr(text.size() - suffix.size()) == suffix;
  };
  if (endsWith(options.sourcePath, ".cfgx")) {
    options.syntax = Syntax::kXml;
  } else if (endsWith(options.sourcePath, ".cfg")) {
    options.syntax = Syntax::kText;
  } else {
    *problem =
        "the source file's name must end in .cfg or .cfgx: " + quoteForMessage(options.sourcePath);
    return std::nullopt;
  }
  if (options.withAuxData && options.syntax == Syntax::kXml) {
    *problem = "-A applies to a .cfg source only";
    return std::nullopt;
  }
  return options;
}

}  // namespace pdcfgconvert
