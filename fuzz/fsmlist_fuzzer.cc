// Fuzzes the hosted-volume list reader with arbitrary fsmlist text and checks
// that every name it reads is one field that writes back as one line.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "config/hosted_volume_list.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const kolt::Array names = kolt::parseHostedVolumeList(text);
  std::string rewritten;
  for (const kolt::Value& name : names) {
    const std::string* s = name.asString();
    if (s == nullptr || s->empty() || s->find('\n') != std::string::npos) std::abort();
    rewritten += kolt::hostedVolumeLine(*s);
  }
  if (!(kolt::parseHostedVolumeList(rewritten) == names)) std::abort();
  return 0;
}
