// Placeholder codec entry points until the XML and binary codecs land.
#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt {

std::optional<Value> parsePropertyList(std::string_view, std::optional<Error>* error,
                                       const ParseLimits&) {
  setError(error, Error::posix(kPosixEINVAL, "property-list reader not built yet"));
  return std::nullopt;
}

std::optional<std::string> writeXmlPropertyList(const Value&, std::optional<Error>* error) {
  setError(error, Error::posix(kPosixEINVAL, "property-list writer not built yet"));
  return std::nullopt;
}

}  // namespace kolt
