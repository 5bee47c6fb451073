// Value conversion, whole-volume checks and the output property list.
#include "volume_builder.h"

#include <algorithm>
#include <cassert>

#include "value_text.h"

namespace pdcfgconvert {
namespace {

using kolt::Array;
using kolt::Dictionary;
using kolt::Value;

constexpr std::string_view kNameRule =
    "1 to 64 letters, digits, \"_\", \"-\" or \".\", starting with a letter, digit or \"_\"";

// "a, b or c"
std::string listOfWords(const std::vector<std::string_view>& words) {
  std::string text;
  for (std::size_t i = 0; i < words.size(); ++i) {
    if (i > 0) text += i + 1 == words.size() ? " or " : ", ";
    text += words[i];
  }
  return text;
}

std::string lowerCase(std::string_view word) {
  std::string lowered(word);
  for (char& c : lowered) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return lowered;
}

bool isPowerOfTwo(std::int64_t n) {
  return n > 0 && (n & (n - 1)) == 0;
}

std::int64_t integerOf(const Value& value) {
  return value.asInteger()->bits;
}

// The key spelled `name` in .cfg; every caller names a key of the table.
const KeyDefinition& keyNamed(const SectionDefinition& section, std::string_view name) {
  const KeyDefinition* key = findKey(section, name, Syntax::kText);
  assert(key != nullptr);
  return *key;
}

}  // namespace

std::string VolumeBuilder::describe(const Section& section) const {
  if (syntax_ == Syntax::kXml) {
    std::string text = "<" + spell(section.definition->name, syntax_);
    if (section.definition->named) text += " name=\"" + section.name + "\"";
    return text + ">";
  }
  if (!section.definition->named) return "[" + std::string(section.definition->name) + "]";
  return "[" + std::string(section.definition->name) + " " + section.name + "]";
}

std::string VolumeBuilder::describe(const KeyDefinition& key) const {
  if (syntax_ == Syntax::kXml) return "<" + spell(key.name, syntax_) + ">";
  return std::string(key.name);
}

bool VolumeBuilder::fail(ConversionError* error, int line, std::string message) const {
  error->line = line;
  error->message = std::move(message);
  return false;
}

std::optional<Value> VolumeBuilder::convertField(const FieldDefinition& field,
                                                 std::string_view text,
                                                 std::string* problem) const {
  const std::string found = ", found " + quoteForMessage(text);
  switch (field.kind) {
    case ValueKind::kBoolean:
      if (const std::optional<bool> b = parseBooleanText(text)) return Value::boolean(*b);
      *problem = "expected yes, no, true or false" + found;
      return std::nullopt;
    case ValueKind::kInteger:
    case ValueKind::kSize: {
      const bool isSize = field.kind == ValueKind::kSize;
      const std::optional<std::int64_t> n = isSize ? parseSizeText(text) : parseIntegerText(text);
      if (n && *n >= field.min && *n <= field.max && (!field.powerOfTwo || isPowerOfTwo(*n))) {
        return Value::integer(*n);
      }
      const auto bound = [isSize](std::int64_t b) {
        return isSize ? formatSizeText(b) : std::to_string(b);
      };
      *problem = std::string("expected ") + (field.powerOfTwo ? "a power of two"
                                             : isSize         ? "a size"
                                                              : "a whole number");
      *problem += " from " + bound(field.min) + " to " + bound(field.max);
      if (isSize) *problem += " (digits with an optional K, M, G or T suffix)";
      *problem += found;
      return std::nullopt;
    }
    case ValueKind::kName:
      if (isNameText(text)) return Value(text);
      *problem = "expected a name (" + std::string(kNameRule) + ")" + found;
      return std::nullopt;
    case ValueKind::kChoice:
      for (std::string_view word : field.choices) {
        if (text == word) return Value(lowerCase(word));
      }
      *problem = "expected " + listOfWords(field.choices) + found;
      return std::nullopt;
  }
  return std::nullopt;
}

bool VolumeBuilder::beginSection(const SectionDefinition& definition,
                                 std::optional<std::string_view> name, int line,
                                 ConversionError* error) {
  const bool xml = syntax_ == Syntax::kXml;
  const std::string plain =
      xml ? "<" + spell(definition.name, syntax_) + ">" : "[" + std::string(definition.name) + "]";
  if (name && !definition.named) {
    return fail(error, line, plain + (xml ? " takes no name attribute" : " takes no name"));
  }
  if (!name && definition.named) {
    return fail(error, line, plain + (xml ? " needs a name attribute" : " needs a name"));
  }
  if (name && !isNameText(*name)) {
    return fail(error, line,
                "bad name " + quoteForMessage(*name) + " for " + plain + ": a name is " +
                    std::string(kNameRule));
  }
  Section section;
  section.definition = &definition;
  section.name = name ? std::string(*name) : std::string();
  section.line = line;
  // A map, not a scan of the sections: a 4 MiB source holds 10^5 of them.
  const auto [earlier, isNew] = sectionLines_.try_emplace({definition.kind, section.name}, line);
  if (!isNew) {
    return fail(error, line,
                "duplicate section " + describe(section) + " (first at line " +
                    std::to_string(earlier->second) + ")");
  }
  sections_.push_back(std::move(section));
  return true;
}

bool VolumeBuilder::addSetting(const KeyDefinition& key,
                               const std::vector<std::string_view>& fieldTexts, int line,
                               ConversionError* error) {
  assert(!sections_.empty());
  Section& section = sections_.back();
  if (fieldTexts.size() != key.fields.size()) {
    std::string expected = std::to_string(key.fields.size()) + " value";
    if (key.fields.size() != 1) {
      expected += "s (";
      for (std::size_t i = 0; i < key.fields.size(); ++i) {
        expected += (i > 0 ? " " : "") + std::string(key.fields[i].name);
      }
      expected += ")";
    }
    return fail(
        error, line,
        describe(key) + " takes " + expected + ", found " + std::to_string(fieldTexts.size()));
  }
  std::vector<int>& lines = section.keyLines[key.name];
  if (!lines.empty() && !key.repeatable) {
    return fail(error, line,
                "duplicate " + describe(key) + " in " + describe(section) + " (first at line " +
                    std::to_string(lines.front()) + ")");
  }
  std::vector<Value> converted;
  for (std::size_t i = 0; i < key.fields.size(); ++i) {
    std::string problem;
    std::optional<Value> value = convertField(key.fields[i], fieldTexts[i], &problem);
    if (!value) {
      std::string where = describe(key);
      if (!key.fields[i].name.empty()) where += " " + std::string(key.fields[i].name);
      return fail(error, line, where + ": " + problem);
    }
    converted.push_back(std::move(*value));
  }
  lines.push_back(line);
  if (!key.repeatable) {
    section.values.set(std::string(key.name), std::move(converted.front()));
    return true;
  }
  Dictionary record;
  for (std::size_t i = 0; i < key.fields.size(); ++i) {
    record.set(std::string(key.fields[i].name), std::move(converted[i]));
  }
  Value* records = section.values.find(key.name);
  if (records == nullptr) records = &section.values.set(std::string(key.name), Value::array());
  records->asArray()->push_back(Value(std::move(record)));
  return true;
}

bool VolumeBuilder::completeSection(Section& section, ConversionError* error) const {
  for (const KeyDefinition& key : section.definition->keys) {
    if (section.values.contains(key.name)) continue;
    if (key.required) {
      return fail(error, section.line, describe(section) + " has no " + describe(key));
    }
    if (key.defaultText.empty()) continue;
    std::string problem;
    std::optional<Value> value = convertField(key.fields.front(), key.defaultText, &problem);
    assert(value && "a default must be a valid value of its key");
    section.values.set(std::string(key.name), std::move(*value));
  }
  return true;
}

bool VolumeBuilder::checkVolumeName(const Section& global, std::string_view volumeName,
                                    ConversionError* error) const {
  const std::string* stored =
      global.values.find("Volume") ? global.values.find("Volume")->asString() : nullptr;
  if (stored == nullptr || *stored == volumeName) return true;
  const int line = global.keyLines.at("Volume").front();
  return fail(error, line,
              "the volume name " + quoteForMessage(*stored) +
                  " does not match the name given with -n, " + quoteForMessage(volumeName));
}

bool VolumeBuilder::checkStripeGroups(ConversionError* error) const {
  const Section* global = nullptr;
  const Section* journal = nullptr;
  bool anyGroup = false, anyMetadata = false;
  for (const Section& s : sections_) {
    if (s.definition->kind == SectionKind::kGlobal) global = &s;
  }
  const std::int64_t blockSize = integerOf(*global->values.find("BlockSize"));
  for (const Section& s : sections_) {
    if (s.definition->kind != SectionKind::kStripeGroup) continue;
    anyGroup = true;
    anyMetadata = anyMetadata || s.values.find("Metadata")->truthValue();
    if (s.values.find("Journal")->truthValue()) {
      if (journal != nullptr) {
        return fail(error, s.keyLines.at("Journal").front(),
                    describe(s) + " holds the journal too; only one stripe group may (" +
                        describe(*journal) + " at line " + std::to_string(journal->line) + ")");
      }
      journal = &s;
    }
    const std::int64_t breadth = integerOf(*s.values.find("StripeBreadth"));
    if (breadth % blockSize != 0) {
      const auto it = s.keyLines.find("StripeBreadth");
      return fail(error, it == s.keyLines.end() ? s.line : it->second.front(),
                  describe(keyNamed(*s.definition, "StripeBreadth")) + " " +
                      formatSizeText(breadth) + " of " + describe(s) +
                      " is not a multiple of the block size " + formatSizeText(blockSize));
    }
  }
  const bool xml = syntax_ == Syntax::kXml;
  if (!anyGroup) {
    return fail(error, 0,
                std::string("the volume has no stripe group (") +
                    (xml ? "<stripeGroup name=...>" : "[StripeGroup <name>]") + ")");
  }
  if (!anyMetadata) {
    return fail(error, 0,
                std::string("no stripe group holds the metadata (") +
                    (xml ? "<metadata>yes</metadata>" : "Metadata yes") + ")");
  }
  if (journal == nullptr) {
    return fail(error, 0,
                std::string("no stripe group holds the journal (") +
                    (xml ? "<journal>yes</journal>" : "Journal yes") + ")");
  }
  return true;
}

bool VolumeBuilder::checkNodes(ConversionError* error) {
  std::map<std::string, int> diskLines;  // disk name -> line of its section
  for (const Section& s : sections_) {
    if (s.definition->kind == SectionKind::kDisk) diskLines[s.name] = s.line;
  }
  std::map<std::string, int> diskUsedAt;  // disk name -> line of the node that uses it
  for (Section& s : sections_) {
    if (s.definition->kind != SectionKind::kStripeGroup) continue;
    const KeyDefinition& nodeKey = keyNamed(*s.definition, "Node");
    Array& nodes = *s.values.find("Node")->asArray();
    const std::vector<int>& lines = s.keyLines.at("Node");
    std::map<std::int64_t, int> indexLines;
    for (std::size_t i = 0; i < nodes.size(); ++i) {
      const std::string& disk = *nodes[i].findString("disk");
      const std::int64_t index = integerOf(*nodes[i].find("index"));
      // Names were checked when read, so they need no quoting.
      const std::string where =
          describe(nodeKey) + " " + disk + " " + std::to_string(index) + " in " + describe(s);
      if (!diskLines.contains(disk)) {
        return fail(error, lines[i], where + ": no disk of that name is defined");
      }
      if (const auto used = diskUsedAt.find(disk); used != diskUsedAt.end()) {
        return fail(error, lines[i],
                    where + ": the disk is already used at line " + std::to_string(used->second));
      }
      if (const auto taken = indexLines.find(index); taken != indexLines.end()) {
        return fail(error, lines[i],
                    where + ": index " + std::to_string(index) + " is already used at line " +
                        std::to_string(taken->second));
      }
      diskUsedAt[disk] = lines[i];
      indexLines[index] = lines[i];
    }
    // Indexes are unique; they run 0..n-1 exactly when the largest is n-1.
    const auto& [largest, largestLine] = *indexLines.rbegin();
    if (largest != static_cast<std::int64_t>(nodes.size()) - 1) {
      return fail(error, largestLine,
                  "the nodes of " + describe(s) + " must be numbered 0 to " +
                      std::to_string(nodes.size() - 1) + "; index " + std::to_string(largest) +
                      " is out of sequence");
    }
    std::sort(nodes.begin(), nodes.end(), [](const Value& a, const Value& b) {
      return integerOf(*a.find("index")) < integerOf(*b.find("index"));
    });
  }
  return true;
}

std::optional<Value> VolumeBuilder::finish(std::string_view volumeName, ConversionError* error) {
  const Section* global = nullptr;
  for (Section& s : sections_) {
    if (!completeSection(s, error)) return std::nullopt;
    if (s.definition->kind == SectionKind::kGlobal) global = &s;
  }
  if (global == nullptr) {
    fail(error, 0,
         syntax_ == Syntax::kXml ? "the volume has no <global> element"
                                 : "the volume has no [Global] section");
    return std::nullopt;
  }
  if (!checkVolumeName(*global, volumeName, error) || !checkStripeGroups(error) ||
      !checkNodes(error)) {
    return std::nullopt;
  }

  // Every key of the section under its output key; records of a repeatable
  // key stay an array.
  const auto outputOf = [](const Section& s) {
    Dictionary out;
    for (const KeyDefinition& key : s.definition->keys) {
      const Value* value = s.values.find(key.name);
      if (value != nullptr && !key.outputKey.empty()) out.set(std::string(key.outputKey), *value);
    }
    return out;
  };
  Dictionary disks;
  Array stripeGroups;
  Value volume = Value::dictionary();
  volume.set("name", Value(volumeName));
  for (const Section& s : sections_) {
    switch (s.definition->kind) {
      case SectionKind::kGlobal:
        volume.set("global", Value(outputOf(s)));
        break;
      case SectionKind::kDisk:
        disks.set(s.name, Value(outputOf(s)));
        break;
      case SectionKind::kStripeGroup: {
        Dictionary group = outputOf(s);
        group.set("name", Value(s.name));
        stripeGroups.push_back(Value(std::move(group)));
        break;
      }
    }
  }
  volume.set("disks", Value(std::move(disks)));
  volume.set("stripeGroups", Value(std::move(stripeGroups)));
  return volume;
}

}  // namespace pdcfgconvert
