// Fuzzes the name-server file reader with arbitrary file text, with and
// without an address map, and checks that what it reads writes back and
// reads again unchanged.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "volumes/inet_address.h"
#include "volumes/nameservers.h"

using kolt::Array;
using kolt::Dictionary;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);

  const Array plain = kolt::parseFsnameservers(text, nullptr);
  for (const kolt::Value& entry : plain) {
    // Every address comes out in dotted-quad form, which reads as itself.
    const std::string* address = entry.asString();
    if (address == nullptr) std::abort();
    const auto parsed = kolt::parseInetAddress(*address);
    if (!parsed || kolt::formatInetAddress(*parsed) != *address) std::abort();
  }
  if (!(kolt::parseFsnameservers(kolt::formatFsnameservers(plain), nullptr) == plain)) std::abort();

  // With a map holding the first address: entries carry "uuid" only for it.
  Dictionary map;
  if (!plain.empty()) map.set(*plain.front().asString(), "UUID-0");
  const Array labelled = kolt::parseFsnameservers(text, &map);
  if (labelled.size() != plain.size()) std::abort();
  if (!(kolt::fsnameservers_without_uuids(labelled) == plain)) std::abort();
  return 0;
}
