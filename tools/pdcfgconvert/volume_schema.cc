// The table of sections and keys. Defaults and bounds live here so that the
// usage text, both readers and the output agree on them.
#include "volume_schema.h"

namespace pdcfgconvert {
namespace {

constexpr std::int64_t kKiB = 1024;
constexpr std::int64_t kMiB = 1024 * kKiB;
constexpr std::int64_t kGiB = 1024 * kMiB;

FieldDefinition field(ValueKind kind) {
  FieldDefinition f;
  f.kind = kind;
  return f;
}
FieldDefinition bounded(ValueKind kind, std::int64_t min, std::int64_t max,
                        bool powerOfTwo = false) {
  FieldDefinition f = field(kind);
  f.min = min;
  f.max = max;
  f.powerOfTwo = powerOfTwo;
  return f;
}
FieldDefinition choice(std::vector<std::string_view> words) {
  FieldDefinition f = field(ValueKind::kChoice);
  f.choices = std::move(words);
  return f;
}

// A key of one value; without a default it is optional and left out when
// absent.
KeyDefinition key(std::string_view name, std::string_view outputKey, FieldDefinition value,
                  std::string_view defaultText = {}) {
  KeyDefinition k;
  k.name = name;
  k.outputKey = outputKey;
  k.fields = {std::move(value)};
  k.defaultText = defaultText;
  return k;
}
KeyDefinition required(KeyDefinition k) {
  k.required = true;
  return k;
}

std::vector<SectionDefinition> buildSchema() {
  constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
  const FieldDefinition boolean = field(ValueKind::kBoolean);
  const FieldDefinition name = field(ValueKind::kName);

  // "Node <disk> <index>": one disk of a stripe group, at its position.
  FieldDefinition disk = name;
  disk.name = "disk";
  FieldDefinition index = bounded(ValueKind::kInteger, 0, 65535);
  index.name = "index";
  KeyDefinition node = required(key("Node", "nodes", disk));
  node.fields.push_back(index);
  node.repeatable = true;

  return {
      {SectionKind::kGlobal,
       "Global",
       /*named=*/false,
       {
           // The volume's own name: when given it must equal the name on the
           // command line; the output carries that name under "name".
           key("Volume", "", name),
           key("FileLocks", "fileLocks", boolean, "no"),
           key("Quotas", "quotas", boolean, "no"),
           key("InodeCacheSize", "inodeCacheSize", bounded(ValueKind::kInteger, 16, 1 << 30),
               "32768"),
           key("JournalSize", "journalSize", bounded(ValueKind::kSize, kMiB, 64 * kGiB), "16M"),
           key("BlockSize", "blockSize", bounded(ValueKind::kSize, 4 * kKiB, kMiB, true), "16K"),
           key("AllocationStrategy", "allocationStrategy", choice({"Round", "Fill", "Balance"}),
               "Round"),
           key("MaxConnections", "maxConnections", bounded(ValueKind::kInteger, 1, 65535), "32"),
       }},
      {SectionKind::kDisk,
       "Disk",
       /*named=*/true,
       {
           required(key("Sectors", "sectors", bounded(ValueKind::kInteger, 1, kMax))),
           key("SectorSize", "sectorSize", bounded(ValueKind::kInteger, 512, 4096, true), "512"),
       }},
      {SectionKind::kStripeGroup,
       "StripeGroup",
       /*named=*/true,
       {
           key("Status", "status", choice({"Up", "Down"}), "Up"),
           key("Metadata", "metadata", boolean, "no"),
           key("Journal", "journal", boolean, "no"),
           key("Exclusive", "exclusive", boolean, "no"),
           key("Read", "read", boolean, "yes"),
           key("Write", "write", boolean, "yes"),
           key("StripeBreadth", "stripeBreadth", bounded(ValueKind::kSize, 4 * kKiB, kGiB), "256K"),
           key("Affinity", "affinity", name),
           node,
       }},
  };
}

}  // namespace

const std::vector<SectionDefinition>& volumeSchema() {
  static const std::vector<SectionDefinition> schema = buildSchema();
  return schema;
}

std::string spell(std::string_view name, Syntax syntax) {
  std::string spelled(name);
  if (syntax == Syntax::kXml && !spelled.empty() && spelled[0] >= 'A' && spelled[0] <= 'Z') {
    spelled[0] = static_cast<char>(spelled[0] - 'A' + 'a');
  }
  return spelled;
}

const SectionDefinition* findSection(std::string_view spelled, Syntax syntax) {
  for (const SectionDefinition& section : volumeSchema()) {
    if (spell(section.name, syntax) == spelled) return &section;
  }
  return nullptr;
}

const KeyDefinition* findKey(const SectionDefinition& section, std::string_view spelled,
                             Syntax syntax) {
  for (const KeyDefinition& key : section.keys) {
    if (spell(key.name, syntax) == spelled) return &key;
  }
  return nullptr;
}

}  // namespace pdcfgconvert
