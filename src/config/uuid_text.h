// UUID text in the system's canonical form: 36 upper-case characters,
// groups of 8-4-4-4-12 hexadecimal digits.
#ifndef KOLT_CONFIG_UUID_TEXT_H
#define KOLT_CONFIG_UUID_TEXT_H

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "kolt/env.h"

namespace kolt {

using UUIDBytes = std::array<std::uint8_t, 16>;

// The canonical upper-case text of `bytes`.
std::string formatUUID(const UUIDBytes& bytes);
// A fresh random UUID from the Env, as canonical upper-case text.
std::string newUUIDString(Env& env);
// Reads a UUID in 8-4-4-4-12 form (either letter case; surrounding white
// space ignored). Nothing for any other text.
std::optional<UUIDBytes> parseUUID(std::string_view text);

}  // namespace kolt

#endif  // KOLT_CONFIG_UUID_TEXT_H
