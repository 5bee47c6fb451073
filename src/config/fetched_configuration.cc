#include "config/fetched_configuration.h"

#include <expat.h>
#include <strings.h>

#include <algorithm>
#include <climits>
#include <string>

#include "kolt/directory_records.h"

namespace kolt {
namespace {

// Walks an XML property list with expat until the value of the top
// dictionary's "globals" key has ended, and notes where it lies.
class GlobalsFinder {
 public:
  explicit GlobalsFinder(XML_Parser parser) : parser_(parser) {}

  std::optional<std::pair<std::size_t, std::size_t>> range;

  static void XMLCALL onDeclaration(void* self, const XML_Char*, const XML_Char* encoding, int) {
    auto* f = static_cast<GlobalsFinder*>(self);
    if (encoding != nullptr && ::strcasecmp(encoding, "UTF-8") != 0) f->stop();
  }
  static void XMLCALL onStart(void* self, const XML_Char* name, const XML_Char**) {
    static_cast<GlobalsFinder*>(self)->start(name);
  }
  static void XMLCALL onEnd(void* self, const XML_Char*) {
    static_cast<GlobalsFinder*>(self)->end();
  }
  static void XMLCALL onText(void* self, const XML_Char* s, int len) {
    auto* f = static_cast<GlobalsFinder*>(self);
    if (f->depth_ == 3 && f->inKey_) f->key_.append(s, static_cast<std::size_t>(len));
  }

 private:
  void stop() { XML_StopParser(parser_, XML_FALSE); }

  void start(std::string_view name) {
    ++depth_;
    if ((depth_ == 1 && name != "plist") || (depth_ == 2 && name != "dict")) return stop();
    if (depth_ != 3) return;
    if (name == "key") {
      inKey_ = true;
      key_.clear();
    } else if (key_ == "globals") {
      if (name != "dict") return stop();
      inGlobals_ = true;
      start_ = static_cast<std::size_t>(XML_GetCurrentByteIndex(parser_));
    }
  }

  void end() {
    if (depth_ == 3) {
      if (inKey_) {
        inKey_ = false;
      } else if (inGlobals_) {
        const auto endIndex = static_cast<std::size_t>(XML_GetCurrentByteIndex(parser_) +
                                                       XML_GetCurrentByteCount(parser_));
        range.emplace(start_, endIndex);
        return stop();
      } else {
        key_.clear();  // a value of another key
      }
    } else if (depth_ == 2) {
      return stop();  // the top dictionary ended without globals
    }
    --depth_;
  }

  XML_Parser parser_;
  int depth_ = 0;
  bool inKey_ = false;
  bool inGlobals_ = false;
  std::string key_;
  std::size_t start_ = 0;
};

}  // namespace

std::optional<std::pair<std::size_t, std::size_t>> findGlobalsInXml(std::string_view xml) {
  std::unique_ptr<XML_ParserStruct, decltype(&XML_ParserFree)> parser(XML_ParserCreate(nullptr),
                                                                      XML_ParserFree);
  if (!parser) return std::nullopt;
  GlobalsFinder finder(parser.get());
  XML_SetUserData(parser.get(), &finder);
  XML_SetXmlDeclHandler(parser.get(), GlobalsFinder::onDeclaration);
  XML_SetElementHandler(parser.get(), GlobalsFinder::onStart, GlobalsFinder::onEnd);
  XML_SetCharacterDataHandler(parser.get(), GlobalsFinder::onText);
  // Stopped at the end of globals (or at anything else), the parse reports
  // an abort; what counts is whether the range was found.
  XML_Parse(parser.get(), xml.data(), static_cast<int>(std::min<std::size_t>(xml.size(), INT_MAX)),
            XML_TRUE);
  return finder.range;
}

std::optional<FetchedConfiguration> FetchedConfiguration::fetch(DirectoryNode& node,
                                                                const std::string* sanName,
                                                                ErrorSlot* error) {
  if (sanName == nullptr) {
    setError(error, Error::vorn(kVornNoConfiguration));
    return std::nullopt;
  }
  ErrorSlot slot;
  auto records = node.queryRecords(RecordType::kGroups, ldapSanConfNameForName(*sanName),
                                   Attribute::kXMLPlist, 1, &slot);
  if (!records) {
    if (slot) setError(error, std::move(*slot));
    return std::nullopt;
  }
  if (records->empty()) {
    setError(error, Error::vorn(kVornNoConfiguration));
    return std::nullopt;
  }
  FetchedConfiguration fetched;
  fetched.record_ = std::move(records->front());
  auto values = fetched.record_->valuesForAttribute(Attribute::kXMLPlist, &slot);
  if (!values) {
    if (slot) setError(error, std::move(*slot));
    return std::nullopt;
  }
  if (values->empty()) {
    setError(error, Error::posix(kPosixEINVAL, "The configuration record holds no configuration"));
    return std::nullopt;
  }
  fetched.text_ = values->front();
  return fetched;
}

std::optional<Value> FetchedConfiguration::peekGlobals() const {
  const auto range = findGlobalsInXml(text_);
  if (!range) return std::nullopt;
  std::string globals = "<plist version=\"1.0\">";
  globals.append(text_.substr(range->first, range->second - range->first));
  globals += "</plist>";
  std::optional<Value> value = parsePropertyList(globals);
  if (!value || !value->isDictionary()) return std::nullopt;
  return value;
}

std::optional<Value> FetchedConfiguration::parse(ErrorSlot* error) const {
  ErrorSlot parseError;
  std::optional<Value> config = parsePropertyList(text_, &parseError);
  if (!config) {
    setError(error, Error::posix(kPosixEINVAL, parseError && parseError->description()
                                                   ? *parseError->description()
                                                   : "The configuration cannot be read"));
    return std::nullopt;
  }
  if (!config->isDictionary()) {
    setError(error, Error::posix(kPosixEINVAL, "The stored configuration is not a dictionary"));
    return std::nullopt;
  }
  return config;
}

}  // namespace kolt
