// parsePropertyList: picks the reader by the first bytes and turns its
// reason into the error the caller sees.
#include "kolt/error.h"
#include "kolt/plist.h"
#include "plist/parse_budget.h"
#include "plist/readers.h"

namespace kolt {

std::optional<Value> parsePropertyList(std::string_view bytes, std::optional<Error>* error,
                                       const ParseLimits& limits) {
  using plist_internal::ParseBudget;
  const ParseBudget budget = ParseBudget::resolve(limits, bytes.size());
  std::string reason;
  std::optional<Value> result;
  if (bytes.empty()) {
    reason = "empty property list";
  } else if (bytes.substr(0, 8) == "bplist00") {
    result = plist_internal::readBinary(bytes, budget, &reason);
  } else if (bytes.substr(0, 6) == "bplist") {
    reason = "binary property list: unsupported version";
  } else {
    // expat reads a UTF-8 byte order mark itself, but no whitespace before
    // the XML declaration; writers of property lists sometimes leave some.
    std::string_view xml = bytes;
    if (xml.substr(0, 3) == "\xEF\xBB\xBF") xml.remove_prefix(3);
    std::size_t lines = 0;
    while (!xml.empty() && (xml[0] == ' ' || xml[0] == '\t' || xml[0] == '\n' || xml[0] == '\r')) {
      if (xml[0] == '\n') ++lines;
      xml.remove_prefix(1);
    }
    if (xml.empty()) {
      reason = "empty property list";
    } else {
      result = plist_internal::readXml(xml, budget, &reason, lines);
    }
  }
  if (!result) setError(error, Error::posix(kPosixEINVAL, std::move(reason)));
  return result;
}

}  // namespace kolt
