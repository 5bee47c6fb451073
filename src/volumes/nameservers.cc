#include "volumes/nameservers.h"

#include "config/utf8_text.h"
#include "kolt/env.h"
#include "volumes/inet_address.h"

namespace kolt {
namespace {

// The address text an entry stands for, or null.
const std::string* entryAddress(const Value& entry) {
  if (const std::string* s = entry.asString()) return s;
  return entry.findString("addr");
}

}  // namespace

Array parseFsnameservers(std::string_view text, const Dictionary* map) {
  Array list;
  if (!utf8::isValid(text)) return list;
  std::size_t lineStart = 0;
  while (lineStart <= text.size()) {
    std::size_t lineEnd = text.find('\n', lineStart);
    if (lineEnd == std::string_view::npos) lineEnd = text.size();
    const std::string_view line = text.substr(lineStart, lineEnd - lineStart);
    lineStart = lineEnd + 1;
    if (utf8::utf16Length(line) <= 6) continue;
    const std::optional<std::uint32_t> address = parseInetAddress(line);
    if (!address) continue;
    std::string dotted = formatInetAddress(*address);
    if (map == nullptr) {
      list.emplace_back(std::move(dotted));
      continue;
    }
    Dictionary entry;
    if (const Value* uuid = map->find(dotted)) entry.set("uuid", *uuid);
    entry.set("addr", std::move(dotted));
    list.emplace_back(std::move(entry));
  }
  return list;
}

std::string formatFsnameservers(const Array& list) {
  std::string text;
  for (const Value& entry : list) {
    const std::string* address = entryAddress(entry);
    if (address == nullptr || address->find('\n') != std::string::npos) continue;
    text += *address;
    text += '\n';
  }
  return text;
}

Array read_fsnameservers(const Dictionary* map) {
  std::string text;
  if (currentEnv().readFile(kFsnameserversPath, &text) != 0) return {};
  return parseFsnameservers(text, map);
}

bool write_fsnameservers(const Array& list) {
  return writeFileAtomically(currentEnv(), kFsnameserversPath, formatFsnameservers(list), 0644) ==
         0;
}

Array fsnameservers_without_uuids(const Array& list) {
  Array result;
  result.reserve(list.size());
  for (const Value& entry : list) {
    if (const std::string* address = entryAddress(entry)) result.emplace_back(*address);
  }
  return result;
}

}  // namespace kolt
