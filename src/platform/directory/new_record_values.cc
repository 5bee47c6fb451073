#include "platform/directory/new_record_values.h"

#include <ldap.h>

#include "platform/directory/directory_error.h"

namespace kolt {

std::optional<Error> newRecordValues(RecordType type, const std::string& recordName,
                                     const AttributeValues& attributes, AttributeValues* values) {
  values->clear();
  for (const auto& [attribute, list] : attributes) {
    if (attribute == Attribute::kRecordName) {
      if (list.size() == 1 && list[0] == recordName) continue;
      return directoryError(LDAP_NOT_SUPPORTED, "records have one name");
    }
    if (!list.empty()) (*values)[attribute] = list;
  }
  if (type == RecordType::kUsers && values->count(Attribute::kFullName) == 0) {
    (*values)[Attribute::kFullName] = {recordName};
  }
  return std::nullopt;
}

}  // namespace kolt
