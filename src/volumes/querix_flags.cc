#include "volumes/querix_flags.h"

#include <cmath>
#include <cstring>
#include <string_view>

namespace kolt {
namespace {

// FNV-1a, 64 bits.
class Hasher {
 public:
  void bytes(const void* data, std::size_t size) {
    const auto* p = static_cast<const unsigned char*>(data);
    for (std::size_t i = 0; i < size; ++i) {
      state_ ^= p[i];
      state_ *= 0x100000001b3ULL;
    }
  }
  void tag(char t) { bytes(&t, 1); }
  void text(std::string_view s) {
    const std::uint64_t n = s.size();
    bytes(&n, sizeof n);
    bytes(s.data(), s.size());
  }
  void wholeNumber(__int128 n) { tag('n'), bytes(&n, sizeof n); }
  std::uint64_t result() const { return state_; }

 private:
  std::uint64_t state_ = 0xcbf29ce484222325ULL;
};

void hashInto(Hasher& h, const Value& v) {
  switch (v.type()) {
    case Value::Type::kDictionary:
      h.tag('D');
      for (const auto& [key, item] : *v.asDictionary()) {
        h.text(key);
        hashInto(h, item);
      }
      h.tag('d');
      return;
    case Value::Type::kArray:
      h.tag('A');
      for (const Value& item : *v.asArray()) hashInto(h, item);
      h.tag('a');
      return;
    case Value::Type::kString:
      h.tag('S'), h.text(*v.asString());
      return;
    case Value::Type::kInteger: {
      const Integer i = *v.asInteger();
      h.wholeNumber(i.isUnsigned ? static_cast<__int128>(static_cast<std::uint64_t>(i.bits))
                                 : static_cast<__int128>(i.bits));
      return;
    }
    case Value::Type::kReal: {
      // A whole real in the integers' range hashes as that integer.
      const double d = *v.asReal();
      if (std::isfinite(d) && d == std::floor(d) && d >= -9223372036854775808.0 &&
          d < 18446744073709551616.0) {
        h.wholeNumber(d < 0 ? static_cast<__int128>(static_cast<std::int64_t>(d))
                            : static_cast<__int128>(static_cast<std::uint64_t>(d)));
      } else {
        h.tag('r');
        if (!std::isnan(d)) h.bytes(&d, sizeof d);
      }
      return;
    }
    case Value::Type::kBoolean:
      h.tag(*v.asBoolean() ? 'T' : 'F');
      return;
    case Value::Type::kDate: {
      double seconds = v.asDate()->seconds;
      if (seconds == 0) seconds = 0;  // -0.0 equals 0.0
      h.tag('t'), h.bytes(&seconds, sizeof seconds);
      return;
    }
    case Value::Type::kData:
      h.tag('B'), h.text(v.asData()->bytes);
      return;
  }
}

}  // namespace

std::uint64_t hashValue(const Value& value) {
  Hasher h;
  hashInto(h, value);
  return h.result();
}

int querixServerFlagsForConfig(const Value* config, std::uint64_t* hash) {
  *hash = 0;
  if (config == nullptr) return 0;
  const Value* enabled = config->find("enableQuerixServer");
  if (enabled == nullptr || !enabled->truthValue()) return 0;
  const Value* list = config->find("querixServerVolumeList");
  if (list == nullptr) return kQuerixServerEnabled;
  *hash = hashValue(*list);
  return kQuerixServerEnabled | kQuerixServerHasList;
}

}  // namespace kolt
