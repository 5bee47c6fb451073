// The SAN's configuration record, read as bytes: parsed whole by
// getVornConfig, or only its "globals" by the change check, which most often
// finds the revision unchanged (a configuration of a thousand volumes takes
// far longer to parse than to fetch).
#ifndef KOLT_CONFIG_FETCHED_CONFIGURATION_H
#define KOLT_CONFIG_FETCHED_CONFIGURATION_H

#include <memory>
#include <optional>
#include <string_view>

#include "kolt/directory.h"
#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt {

// The configuration record of a SAN, holding its stored text.
class FetchedConfiguration {
 public:
  // Looks the record up as getVornConfig does, with the same errors: 501
  // "No existing configuration" without a SAN name or record, POSIX 22 when
  // it holds no configuration, or the directory's error.
  static std::optional<FetchedConfiguration> fetch(DirectoryNode& node, const std::string* sanName,
                                                   ErrorSlot* error);

  // The "globals" dictionary, read from the start of an XML text up to its
  // end, without reading further. Nothing when the text is not UTF-8 XML or
  // has no dictionary "globals" before the end of its top dictionary;
  // parse() then tells.
  std::optional<Value> peekGlobals() const;

  // The whole configuration, with getVornConfig's errors: POSIX 22 with the
  // parser's text, or when the configuration is not a dictionary.
  std::optional<Value> parse(ErrorSlot* error) const;

 private:
  FetchedConfiguration() = default;
  std::unique_ptr<DirectoryRecord> record_;  // holds the bytes of `text_`
  std::string_view text_;
};

// The byte range of the value of the top dictionary's "globals" key in an
// XML property list, when that value is a dictionary; nothing otherwise (or
// for text that declares an encoding other than UTF-8). Stops reading at the
// end of that value. Pure.
std::optional<std::pair<std::size_t, std::size_t>> findGlobalsInXml(std::string_view xml);

}  // namespace kolt

#endif  // KOLT_CONFIG_FETCHED_CONFIGURATION_H
