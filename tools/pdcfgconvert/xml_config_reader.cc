// The XML form on expat: <volumeConfig> holds section elements, which hold
// key elements. Elements nest three deep at most, so a deep document fails at
// its fourth level, long before it costs anything.
#include "xml_config_reader.h"

#include <expat.h>

#include <climits>
#include <cstring>
#include <string>
#include <vector>

#include "value_text.h"

namespace pdcfgconvert {
namespace {

constexpr std::string_view kRootElement = "volumeConfig";

bool isXmlSpace(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

std::string_view trimXmlSpace(std::string_view text) {
  while (!text.empty() && isXmlSpace(text.front())) text.remove_prefix(1);
  while (!text.empty() && isXmlSpace(text.back())) text.remove_suffix(1);
  return text;
}

class XmlReader {
 public:
  XmlReader(VolumeBuilder& builder, ConversionError* error) : builder_(builder), error_(error) {}
  ~XmlReader() {
    if (parser_ != nullptr) XML_ParserFree(parser_);
  }
  XmlReader(const XmlReader&) = delete;
  XmlReader& operator=(const XmlReader&) = delete;

  bool read(std::string_view text) {
    if (text.size() > static_cast<std::size_t>(INT_MAX)) {
      error_->message = "the document is too large";
      return false;
    }
    parser_ = XML_ParserCreate(nullptr);
    if (parser_ == nullptr) {
      error_->message = "out of memory";
      return false;
    }
    XML_SetUserData(parser_, this);
    XML_SetElementHandler(parser_, &XmlReader::onStart, &XmlReader::onEnd);
    XML_SetCharacterDataHandler(parser_, &XmlReader::onText);
    XML_SetStartDoctypeDeclHandler(parser_, &XmlReader::onDoctype);
    const XML_Status status =
        XML_Parse(parser_, text.data(), static_cast<int>(text.size()), /*isFinal=*/XML_TRUE);
    if (failed_) return false;
    if (status != XML_STATUS_OK) {
      error_->line = currentLine();
      error_->message = std::string("malformed XML: ") + XML_ErrorString(XML_GetErrorCode(parser_));
      return false;
    }
    return true;
  }

 private:
  static void onStart(void* self, const XML_Char* name, const XML_Char** attributes) {
    static_cast<XmlReader*>(self)->start(name, attributes);
  }
  static void onEnd(void* self, const XML_Char*) { static_cast<XmlReader*>(self)->end(); }
  static void onText(void* self, const XML_Char* text, int length) {
    static_cast<XmlReader*>(self)->characters(
        std::string_view(text, static_cast<std::size_t>(length)));
  }
  static void onDoctype(void* self, const XML_Char*, const XML_Char*, const XML_Char*, int) {
    static_cast<XmlReader*>(self)->fail(
        "document type declarations are not allowed in a volume configuration");
  }

  int currentLine() const {
    const XML_Size line = XML_GetCurrentLineNumber(parser_);
    return line > static_cast<XML_Size>(INT_MAX) ? INT_MAX : static_cast<int>(line);
  }

  void fail(std::string message) {
    if (failed_) return;
    failed_ = true;
    error_->line = currentLine();
    error_->message = std::move(message);
    XML_StopParser(parser_, XML_FALSE);
  }
  // Stops after a step that the builder refused; it has filled in the error.
  void stopUnless(bool ok) {
    if (ok || failed_) return;
    failed_ = true;
    XML_StopParser(parser_, XML_FALSE);
  }

  void start(std::string_view name, const XML_Char** attributes) {
    if (failed_) return;
    ++depth_;
    // Element names are unbounded in XML; a message shows the start of one.
    constexpr std::size_t kShown = 40;
    const std::string element =
        "<" + std::string(name.substr(0, kShown)) + (name.size() > kShown ? "...>" : ">");
    if (depth_ == 1) return startRoot(name, element, attributes);
    if (depth_ == 2) return startSection(name, element, attributes);
    if (depth_ == 3) return startKey(name, element, attributes);
    fail("unexpected element " + element + " inside <" + spell(key_->name, Syntax::kXml) +
         ">; key elements hold only their value");
  }

  void startRoot(std::string_view name, const std::string& element, const XML_Char** attributes) {
    if (name != kRootElement) {
      return fail("the root element must be <" + std::string(kRootElement) + ">, found " + element);
    }
    for (const XML_Char** a = attributes; *a != nullptr; a += 2) {
      if (std::strcmp(a[0], "version") != 0) {
        return fail(element + " has no attribute " + quoteForMessage(a[0]));
      }
      if (std::strcmp(a[1], "1") != 0) {
        return fail("unsupported version " + quoteForMessage(a[1]) + "; this tool reads version 1");
      }
    }
  }

  void startSection(std::string_view name, const std::string& element,
                    const XML_Char** attributes) {
    section_ = findSection(name, Syntax::kXml);
    if (section_ == nullptr) {
      std::string known;
      for (const SectionDefinition& s : volumeSchema()) {
        known += (known.empty() ? "<" : ", <") + spell(s.name, Syntax::kXml) + ">";
      }
      return fail("unknown element " + element + " in <" + std::string(kRootElement) +
                  ">; the sections are " + known);
    }
    std::optional<std::string_view> sectionName;
    for (const XML_Char** a = attributes; *a != nullptr; a += 2) {
      if (std::strcmp(a[0], "name") != 0) {
        return fail(element + " has no attribute " + quoteForMessage(a[0]));
      }
      sectionName = a[1];
    }
    sectionElement_ = element;
    stopUnless(builder_.beginSection(*section_, sectionName, currentLine(), error_));
  }

  void startKey(std::string_view name, const std::string& element, const XML_Char** attributes) {
    key_ = findKey(*section_, name, Syntax::kXml);
    if (key_ == nullptr) {
      std::string known;
      for (const KeyDefinition& k : section_->keys) {
        known += (known.empty() ? "<" : ", <") + spell(k.name, Syntax::kXml) + ">";
      }
      return fail("unknown element " + element + " in " + sectionElement_ + "; its keys are " +
                  known);
    }
    keyLine_ = currentLine();
    text_.clear();
    fieldTexts_.clear();
    const bool record = key_->fields.size() > 1;
    fieldTexts_.resize(record ? key_->fields.size() : 0);
    std::vector<bool> given(fieldTexts_.size(), false);
    for (const XML_Char** a = attributes; *a != nullptr; a += 2) {
      std::size_t field = 0;
      while (record && field < key_->fields.size() && key_->fields[field].name != a[0]) ++field;
      if (!record || field == key_->fields.size()) {
        return fail(element + " has no attribute " + quoteForMessage(a[0]));
      }
      fieldTexts_[field] = a[1];
      given[field] = true;
    }
    for (std::size_t field = 0; field < given.size(); ++field) {
      if (!given[field]) {
        return fail(element + " needs the attribute \"" + std::string(key_->fields[field].name) +
                    "\"");
      }
    }
  }

  void characters(std::string_view text) {
    if (failed_) return;
    if (depth_ == 3 && key_->fields.size() == 1) {
      if (text_.size() + text.size() > kMaxXmlValueBytes) {
        return fail("the value of <" + spell(key_->name, Syntax::kXml) + "> is longer than " +
                    std::to_string(kMaxXmlValueBytes) + " bytes");
      }
      text_ += text;
      return;
    }
    if (!trimXmlSpace(text).empty()) {
      fail("unexpected text " + quoteForMessage(trimXmlSpace(text)) +
           (depth_ == 3 ? " in <" + spell(key_->name, Syntax::kXml) + ">, which takes attributes"
                        : std::string(" between elements")));
    }
  }

  void end() {
    if (failed_) return;
    if (depth_ == 3) {
      std::vector<std::string_view> fields(fieldTexts_.begin(), fieldTexts_.end());
      if (key_->fields.size() == 1) fields = {trimXmlSpace(text_)};
      stopUnless(builder_.addSetting(*key_, fields, keyLine_, error_));
    }
    --depth_;
  }

  VolumeBuilder& builder_;
  ConversionError* error_;
  XML_Parser parser_ = nullptr;
  bool failed_ = false;
  int depth_ = 0;
  const SectionDefinition* section_ = nullptr;
  std::string sectionElement_;
  const KeyDefinition* key_ = nullptr;
  int keyLine_ = 0;
  std::string text_;
  std::vector<std::string> fieldTexts_;
};

}  // namespace

bool readXmlConfig(std::string_view text, VolumeBuilder& builder, ConversionError* error) {
  XmlReader reader(builder, error);
  return reader.read(text);
}

}  // namespace pdcfgconvert
