// The attribute rules that both directory implementations apply when a
// record is created.
#ifndef KOLT_PLATFORM_DIRECTORY_NEW_RECORD_VALUES_H
#define KOLT_PLATFORM_DIRECTORY_NEW_RECORD_VALUES_H

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "kolt/directory.h"
#include "kolt/error.h"

namespace kolt {

using AttributeValues = std::map<Attribute, std::vector<std::string>>;

// The values a new record named `recordName` is created with: `attributes`
// without empty lists and without the record name, which may be given only
// as that same one name (a record has one name). A user's full name, which
// the directory requires, defaults to the record name. Fails with the
// client's "not supported" (-12) for any other record name.
std::optional<Error> newRecordValues(RecordType type, const std::string& recordName,
                                     const AttributeValues& attributes, AttributeValues* values);

}  // namespace kolt

#endif  // KOLT_PLATFORM_DIRECTORY_NEW_RECORD_VALUES_H
