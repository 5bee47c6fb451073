// Reading the files and assembling the output.
#include "volume_conversion.h"

#include <system_error>

#include "kolt/error.h"
#include "kolt/plist.h"
#include "text_config_reader.h"
#include "volume_builder.h"
#include "xml_config_reader.h"

namespace pdcfgconvert {
namespace {

std::string errnoText(int rc) {
  return std::generic_category().message(rc);
}

// Reads a whole file of at most kMaxInputBytes. `missingIsAbsent`: a file that
// does not exist gives nothing and no message.
std::optional<std::string> readInput(kolt::Env& env, const std::string& path, bool missingIsAbsent,
                                     std::string* message) {
  kolt::FileInfo info;
  int rc = env.fileInfo(path, &info);
  if (rc == ENOENT && missingIsAbsent) return std::nullopt;
  if (rc == 0 && info.isDirectory) rc = EISDIR;
  std::string bytes;
  if (rc == 0 && info.size <= kMaxInputBytes) rc = env.readFile(path, &bytes);
  if (rc != 0) {
    *message = path + ": cannot read: " + errnoText(rc);
    return std::nullopt;
  }
  // Checked again after reading: the file may have grown meanwhile.
  if (info.size > kMaxInputBytes || bytes.size() > kMaxInputBytes) {
    *message = path + ": the file is larger than " + std::to_string(kMaxInputBytes >> 20) + " MiB";
    return std::nullopt;
  }
  return bytes;
}

std::string located(const std::string& path, const ConversionError& error) {
  if (error.line == 0) return path + ": " + error.message;
  return path + ":" + std::to_string(error.line) + ": " + error.message;
}

// "<directory of the source>/<volume>-auxdata.plist"
std::string auxDataPath(const Options& options) {
  const std::size_t slash = options.sourcePath.find_last_of('/');
  const std::string directory =
      slash == std::string::npos ? std::string() : options.sourcePath.substr(0, slash + 1);
  return directory + options.volumeName + "-auxdata.plist";
}

}  // namespace

std::optional<std::string> convertVolume(const Options& options, kolt::Env& env,
                                         std::string* message) {
  std::optional<std::string> source =
      readInput(env, options.sourcePath, /*missingIsAbsent=*/false, message);
  if (!source) return std::nullopt;

  VolumeBuilder builder(options.syntax);
  ConversionError error;
  const bool read = options.syntax == Syntax::kXml ? readXmlConfig(*source, builder, &error)
                                                   : readTextConfig(*source, builder, &error);
  std::optional<kolt::Value> volume;
  if (read) volume = builder.finish(options.volumeName, &error);
  if (!volume) {
    *message = located(options.sourcePath, error);
    return std::nullopt;
  }

  if (options.withAuxData) {
    const std::string path = auxDataPath(options);
    std::optional<std::string> bytes = readInput(env, path, /*missingIsAbsent=*/true, message);
    if (!bytes && !message->empty()) return std::nullopt;
    if (bytes) {
      std::optional<kolt::Error> parseError;
      std::optional<kolt::Value> auxData = kolt::parsePropertyList(*bytes, &parseError);
      if (!auxData) {
        *message = path + ": not a valid property list: " +
                   (parseError && parseError->description() ? *parseError->description()
                                                            : std::string("unknown reason"));
        return std::nullopt;
      }
      volume->set("auxData", std::move(*auxData));
    }
  }

  std::optional<kolt::Error> writeError;
  std::optional<std::string> xml = kolt::writeXmlPropertyList(*volume, &writeError);
  if (!xml) {
    *message = "cannot write the property list: " + (writeError && writeError->description()
                                                         ? *writeError->description()
                                                         : std::string("unknown reason"));
  }
  return xml;
}

}  // namespace pdcfgconvert
