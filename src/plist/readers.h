// The property-list readers behind parsePropertyList. Each returns the value,
// or nothing with the reason in `reason`; neither ever returns part of a
// document.
#ifndef KOLT_PLIST_READERS_H
#define KOLT_PLIST_READERS_H

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "kolt/plist.h"
#include "plist/parse_budget.h"

namespace kolt::plist_internal {

// An XML property list (expat). `lineOffset` is added to the line numbers in
// messages when the caller skipped leading lines.
std::optional<Value> readXml(std::string_view xml, const ParseBudget& budget, std::string* reason,
                             std::size_t lineOffset = 0);

// A binary property list starting with "bplist00".
std::optional<Value> readBinary(std::string_view bytes, const ParseBudget& budget,
                                std::string* reason);

}  // namespace kolt::plist_internal

#endif  // KOLT_PLIST_READERS_H
