// The limits a reader enforces while it produces values, resolved from the
// caller's ParseLimits and the size of the input.
#ifndef KOLT_PLIST_PARSE_BUDGET_H
#define KOLT_PLIST_PARSE_BUDGET_H

#include <cstddef>
#include <cstdint>

#include "kolt/plist.h"

namespace kolt::plist_internal {

struct ParseBudget {
  std::size_t maxDepth = 0;
  std::uint64_t maxObjects = 0;
  std::uint64_t maxBytes = 0;

  // 0 in `limits` means: derived from the input size. XML cannot expand
  // beyond its own size once entity declarations are refused; binary lists
  // can (shared references, UTF-16 to UTF-8), so the budget is what bounds
  // them.
  static ParseBudget resolve(const ParseLimits& limits, std::size_t inputSize) {
    ParseBudget b;
    b.maxDepth = limits.maxDepth;
    b.maxObjects = limits.maxObjects != 0 ? limits.maxObjects
                                          : (inputSize > (1u << 20) ? inputSize : (1u << 20));
    const std::uint64_t twice = static_cast<std::uint64_t>(inputSize) * 2;
    const std::uint64_t minBytes = std::uint64_t{64} << 20;
    b.maxBytes = limits.maxBytes != 0 ? limits.maxBytes : (twice > minBytes ? twice : minBytes);
    return b;
  }
};

}  // namespace kolt::plist_internal

#endif  // KOLT_PLIST_PARSE_BUDGET_H
