// A line-by-line reader: comments, [Section Name] headers, Key value lines.
#include "text_config_reader.h"

#include <cstdio>
#include <string>
#include <vector>

#include "value_text.h"

namespace pdcfgconvert {
namespace {

bool isBlank(char c) {
  return c == ' ' || c == '\t';
}

std::string_view trim(std::string_view text) {
  while (!text.empty() && isBlank(text.front())) text.remove_prefix(1);
  while (!text.empty() && isBlank(text.back())) text.remove_suffix(1);
  return text;
}

std::vector<std::string_view> splitWords(std::string_view text) {
  std::vector<std::string_view> words;
  std::size_t i = 0;
  while (i < text.size()) {
    while (i < text.size() && isBlank(text[i])) ++i;
    const std::size_t start = i;
    while (i < text.size() && !isBlank(text[i])) ++i;
    if (i > start) words.push_back(text.substr(start, i - start));
  }
  return words;
}

// The first byte that a text line may not hold (control characters other than
// tab), or -1.
int firstControlByte(std::string_view line) {
  for (char c : line) {
    const auto byte = static_cast<unsigned char>(c);
    if ((byte < 0x20 && byte != '\t') || byte == 0x7F) return byte;
  }
  return -1;
}

std::string sectionList() {
  std::string list;
  const auto& schema = volumeSchema();
  for (std::size_t i = 0; i < schema.size(); ++i) {
    if (i > 0) list += i + 1 == schema.size() ? " and " : ", ";
    list += "[" + std::string(schema[i].name) + (schema[i].named ? " <name>]" : "]");
  }
  return list;
}

class TextReader {
 public:
  TextReader(VolumeBuilder& builder, ConversionError* error) : builder_(builder), error_(error) {}

  bool readLine(std::string_view line, int number) {
    number_ = number;
    if (!line.empty() && line.back() == '\r') line.remove_suffix(1);
    if (line.size() > kMaxTextLineBytes) {
      return fail("the line is longer than " + std::to_string(kMaxTextLineBytes) + " bytes");
    }
    if (!isValidUtf8(line)) return fail("the line is not UTF-8 text");
    if (const int byte = firstControlByte(line); byte >= 0) {
      char text[64];
      std::snprintf(text, sizeof text, "the line holds the control character 0x%02X", byte);
      return fail(text);
    }
    line = trim(line);
    if (line.empty() || line.front() == '#') return true;
    if (line.front() == '[') return readHeader(line);
    return readSetting(line);
  }

 private:
  bool fail(std::string message) {
    error_->line = number_;
    error_->message = std::move(message);
    return false;
  }

  bool readHeader(std::string_view line) {
    if (line.back() != ']') {
      return fail("a section header is \"[Kind]\" or \"[Kind name]\" alone on its line");
    }
    const std::vector<std::string_view> words = splitWords(line.substr(1, line.size() - 2));
    if (words.empty() || words.size() > 2) {
      return fail("a section header is \"[Kind]\" or \"[Kind name]\"; found " +
                  quoteForMessage(line));
    }
    const SectionDefinition* definition = findSection(words[0], Syntax::kText);
    if (definition == nullptr) {
      return fail("unknown section " + quoteForMessage(words[0]) + "; the sections are " +
                  sectionList());
    }
    std::optional<std::string_view> name;
    if (words.size() == 2) name = words[1];
    if (!builder_.beginSection(*definition, name, number_, error_)) return false;
    section_ = definition;
    header_ = std::string(line);
    return true;
  }

  bool readSetting(std::string_view line) {
    std::vector<std::string_view> words = splitWords(line);
    if (section_ == nullptr) {
      return fail("the setting " + quoteForMessage(words[0]) + " comes before any section header");
    }
    const KeyDefinition* key = findKey(*section_, words[0], Syntax::kText);
    if (key == nullptr) {
      std::string known;
      for (const KeyDefinition& k : section_->keys)
        known += (known.empty() ? "" : ", ") + std::string(k.name);
      return fail("unknown key " + quoteForMessage(words[0]) + " in " + header_ +
                  "; its keys are " + known);
    }
    words.erase(words.begin());
    return builder_.addSetting(*key, words, number_, error_);
  }

  VolumeBuilder& builder_;
  ConversionError* error_;
  int number_ = 0;
  const SectionDefinition* section_ = nullptr;
  std::string header_;
};

}  // namespace

bool readTextConfig(std::string_view text, VolumeBuilder& builder, ConversionError* error) {
  TextReader reader(builder, error);
  int number = 0;
  std::size_t start = 0;
  while (start < text.size()) {
    std::size_t end = text.find('\n', start);
    if (end == std::string_view::npos) end = text.size();
    if (!reader.readLine(text.substr(start, end - start), ++number)) return false;
    start = end + 1;
  }
  return true;
}

}  // namespace pdcfgconvert
