// The sections and keys of a volume configuration, shared by the text (.cfg)
// and XML (.cfgx) forms. Both forms hold the same sections and keys; only the
// spelling differs: the text form writes "StripeGroup" and "FileLocks", the
// XML form "stripeGroup" and "fileLocks" (first letter in lower case).
#ifndef PDCFGCONVERT_VOLUME_SCHEMA_H
#define PDCFGCONVERT_VOLUME_SCHEMA_H

#include <cstdint>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

namespace pdcfgconvert {

// Which source form a name is spelled for.
enum class Syntax { kText, kXml };

enum class ValueKind {
  kBoolean,  // yes, no, true, false
  kInteger,  // decimal digits
  kSize,     // decimal digits with an optional K, M, G or T suffix (powers of 1024)
  kName,     // a letter, digit or "_", then letters, digits, "_", "-" or "."
  kChoice,   // one of a fixed list of words; the output is the word in lower case
};

// One value of a key. A key has one field (its value), or several fields that
// form a record (written as positional values in .cfg, as attributes in
// .cfgx).
struct FieldDefinition {
  std::string_view name;  // the record's key and the .cfgx attribute; empty for a one-field key
  ValueKind kind = ValueKind::kName;
  std::int64_t min = 0;  // inclusive bounds of integers and sizes
  std::int64_t max = std::numeric_limits<std::int64_t>::max();
  bool powerOfTwo = false;                // integers and sizes only
  std::vector<std::string_view> choices;  // for kChoice, as written in both forms
};

struct KeyDefinition {
  std::string_view name;       // as written in .cfg
  std::string_view outputKey;  // key in the output; empty: checked but not written out
  std::vector<FieldDefinition> fields;
  std::string_view defaultText;  // used when the key is absent; empty: none
  bool required = false;         // the section must hold the key at least once
  bool repeatable = false;       // every occurrence appends a record to an array
};

enum class SectionKind { kGlobal, kDisk, kStripeGroup };

struct SectionDefinition {
  SectionKind kind;
  std::string_view name;  // as written in .cfg
  bool named;             // "[Disk D0]" carries a name; "[Global]" does not
  std::vector<KeyDefinition> keys;
};

// Every section kind, in the order the usage text lists them.
const std::vector<SectionDefinition>& volumeSchema();

// The section or key spelled `spelled` in `syntax`, or null.
const SectionDefinition* findSection(std::string_view spelled, Syntax syntax);
const KeyDefinition* findKey(const SectionDefinition& section, std::string_view spelled,
                             Syntax syntax);

// `name` as written in `syntax`: unchanged for text, first letter lowered for
// XML.
std::string spell(std::string_view name, Syntax syntax);

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_VOLUME_SCHEMA_H
