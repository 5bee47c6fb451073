// The full usage text.
#include "usage_text.h"

#include "value_text.h"
#include "volume_schema.h"

namespace pdcfgconvert {
namespace {

constexpr std::string_view kIntroduction = R"(
Converts the source form of a Vorn volume's configuration into an XML property
list on standard output. The source is <volume>.cfg (text) or <volume>.cfgx
(XML); both forms of the same content give the same property list. Output is
written only after the whole source was read and checked; on any error a
message goes to standard error and nothing to standard output.

Options:
  -n <volume>  the volume's name (required); it goes into the output under
               "name" and must equal the source's Volume key when that is given
  -F plist     the output format; "plist" (an XML property list) is the only
               one and the default
  -A           also read the companion file <volume>-auxdata.plist next to a
               .cfg source, when it exists, and put its property list under
               "auxData" in the output (a .cfg source only)
  -h           print this text

Paths: when the environment variable KOLT_ROOT names a directory other than
"/", every absolute path given is taken below it (a sandbox root), and a path
with a ".." component is refused. Source and companion files may hold at most
4 MiB.

Exit status: 0 on success, 1 when a file cannot be read or converted or the
output cannot be written, 2 for a command-line error.

The text form (.cfg), line by line:
  - a line holds at most 4096 bytes of UTF-8 without control characters other
    than tab; a line may end in CR LF;
  - blank lines and lines whose first non-blank character is "#" are ignored;
  - "[Kind]" or "[Kind name]" alone on a line starts a section;
  - "Key value..." sets a key of the current section; words are separated by
    spaces or tabs; keys, section kinds and words such as yes or Round are
    case-sensitive.

  # A volume with one metadata and journal stripe group and one data group.
  [Global]
  Volume          Projects
  FileLocks       yes
  BlockSize       16K

  [Disk Meta0]
  Sectors         41943040

  [Disk Data0]
  Sectors         3906250000
  SectorSize      4096

  [StripeGroup MetaJournal]
  Metadata        yes
  Journal         yes
  Exclusive       yes
  Node            Meta0 0

  [StripeGroup Data]
  Affinity        Fast
  Node            Data0 0

The XML form (.cfgx) holds the same sections and keys as elements whose names
begin with a lower-case letter. The root element is <volumeConfig> (optional
attribute version="1"); each section is an element in it, a named one with a
name attribute; each key is an element in its section holding its value as
text, or, for a key of several values, as attributes named after them. No
document type declaration is allowed.

  <?xml version="1.0" encoding="UTF-8"?>
  <volumeConfig version="1">
    <global>
      <volume>Projects</volume>
      <fileLocks>yes</fileLocks>
    </global>
    <disk name="Meta0"><sectors>41943040</sectors></disk>
    <stripeGroup name="MetaJournal">
      <metadata>yes</metadata>
      <journal>yes</journal>
      <node disk="Meta0" index="0"/>
    </stripeGroup>
  </volumeConfig>

Values:
  boolean  yes, no, true or false
  integer  decimal digits
  size     decimal digits with an optional K, M, G or T suffix (times 1024,
           1024^2, 1024^3, 1024^4); written out in bytes
  name     1 to 64 letters, digits, "_", "-" or ".", starting with a letter,
           digit or "_"
  one of   one of the words listed; written out in lower case

Sections and keys (output key in parentheses):
)";

constexpr std::string_view kRules = R"(
Rules for the volume as a whole:
  - exactly one [Global] section; each disk and stripe group name once;
  - at least one stripe group; at least one holds the metadata and exactly
    one the journal;
  - every Node names a disk defined by a [Disk] section, each disk is used by
    at most one Node of the whole volume, and the indexes of a stripe group's nodes
    run 0, 1, 2... in any order;
  - every StripeBreadth is a multiple of the BlockSize.

Output: a dictionary with "name" (the -n volume name), "global" (the [Global]
keys), "disks" (disk name to its keys), "stripeGroups" (an array in source
order, each with its "name", its keys and "nodes" sorted by index) and, with
-A, "auxData". Keys that the source leaves out appear with their defaults.
)";

std::string describeField(const FieldDefinition& field) {
  const auto bound = [&field](std::int64_t b) {
    return field.kind == ValueKind::kSize ? formatSizeText(b) : std::to_string(b);
  };
  switch (field.kind) {
    case ValueKind::kBoolean:
      return "boolean";
    case ValueKind::kName:
      return "name";
    case ValueKind::kChoice: {
      std::string text = "one of ";
      for (std::size_t i = 0; i < field.choices.size(); ++i) {
        text += (i > 0 ? ", " : "") + std::string(field.choices[i]);
      }
      return text;
    }
    case ValueKind::kInteger:
    case ValueKind::kSize: {
      std::string text = field.kind == ValueKind::kSize ? "size" : "integer";
      if (field.powerOfTwo) text += ", a power of two,";
      if (field.max == std::numeric_limits<std::int64_t>::max()) {
        return text + " of at least " + bound(field.min);
      }
      return text + " " + bound(field.min) + " to " + bound(field.max);
    }
  }
  return {};
}

std::string describeKey(const KeyDefinition& key) {
  std::string text = "    " + std::string(key.name);
  if (!key.outputKey.empty()) text += " (" + std::string(key.outputKey) + ")";
  if (key.outputKey.empty()) text += " (checked against -n, not written out)";
  text += ": ";
  if (key.fields.size() == 1) {
    text += describeField(key.fields.front());
  } else {
    for (std::size_t i = 0; i < key.fields.size(); ++i) {
      text += (i > 0 ? ", then " : "") + std::string(key.fields[i].name) + " (" +
              describeField(key.fields[i]) + ")";
    }
  }
  if (!key.defaultText.empty()) text += "; default " + std::string(key.defaultText);
  if (key.required) text += key.repeatable ? "; at least once" : "; required";
  if (key.repeatable && !key.required) text += "; may repeat";
  if (key.repeatable && key.required) text += ", may repeat";
  return text + "\n";
}

}  // namespace

std::string usageText() {
  std::string text(kUsageLine);
  text += kIntroduction;
  for (const SectionDefinition& section : volumeSchema()) {
    text += "  [" + std::string(section.name) + (section.named ? " <name>]" : "]");
    if (section.kind == SectionKind::kDisk) text += " (under \"disks\")";
    if (section.kind == SectionKind::kStripeGroup) text += " (in \"stripeGroups\")";
    if (section.kind == SectionKind::kGlobal) text += " (\"global\")";
    text += "\n";
    for (const KeyDefinition& key : section.keys) text += describeKey(key);
  }
  text += kRules;
  return text;
}

}  // namespace pdcfgconvert
