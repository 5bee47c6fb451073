// The XML property-list reader: expat's streaming callbacks build the tree
// directly on a value stack, so no DOM copy of the document exists. Each
// container is moved into an exactly-sized vector when its end tag arrives.
#include <expat.h>

#include <climits>
#include <cstring>
#include <memory>
#include <utility>
#include <vector>

#include "plist/base64.h"
#include "plist/calendar.h"
#include "plist/number_text.h"
#include "plist/readers.h"

namespace kolt::plist_internal {
namespace {

enum class Kind : std::uint8_t {
  kPlist,
  kDict,
  kArray,
  kKey,
  kString,
  kInteger,
  kReal,
  kTrue,
  kFalse,
  kDate,
  kData,
};

const char* tagName(Kind k) {
  switch (k) {
    case Kind::kPlist:
      return "<plist>";
    case Kind::kDict:
      return "<dict>";
    case Kind::kArray:
      return "<array>";
    case Kind::kKey:
      return "<key>";
    case Kind::kString:
      return "<string>";
    case Kind::kInteger:
      return "<integer>";
    case Kind::kReal:
      return "<real>";
    case Kind::kTrue:
      return "<true>";
    case Kind::kFalse:
      return "<false>";
    case Kind::kDate:
      return "<date>";
    case Kind::kData:
      return "<data>";
  }
  return "<?>";
}

// The element's kind; called for every element, so it looks at the first
// letter before comparing whole names.
bool classify(const char* name, Kind* kind) {
  auto is = [name](const char* tag, Kind k, Kind* out) {
    if (std::strcmp(name, tag) != 0) return false;
    *out = k;
    return true;
  };
  switch (name[0]) {
    case 'k':
      return is("key", Kind::kKey, kind);
    case 's':
      return is("string", Kind::kString, kind);
    case 'i':
      return is("integer", Kind::kInteger, kind);
    case 'd':
      return is("dict", Kind::kDict, kind) || is("date", Kind::kDate, kind) ||
             is("data", Kind::kData, kind);
    case 'a':
      return is("array", Kind::kArray, kind);
    case 't':
      return is("true", Kind::kTrue, kind);
    case 'f':
      return is("false", Kind::kFalse, kind);
    case 'r':
      return is("real", Kind::kReal, kind);
    case 'p':
      return is("plist", Kind::kPlist, kind);
    default:
      return false;
  }
}

bool isContainer(Kind k) {
  return k == Kind::kDict || k == Kind::kArray;
}
bool isLeaf(Kind k) {
  return !isContainer(k) && k != Kind::kPlist;
}

bool isXmlSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

std::string_view trimmed(std::string_view s) {
  while (!s.empty() && isXmlSpace(s.front())) s.remove_prefix(1);
  while (!s.empty() && isXmlSpace(s.back())) s.remove_suffix(1);
  return s;
}

bool allSpace(const char* s, int len) {
  for (int i = 0; i < len; ++i) {
    if (!isXmlSpace(s[i])) return false;
  }
  return true;
}

// Element names come from the document; keep them short in messages.
std::string shortName(const char* name) {
  std::string s(name);
  if (s.size() > 40) s = s.substr(0, 40) + "...";
  return "<" + s + ">";
}

struct ParserDeleter {
  void operator()(XML_ParserStruct* p) const { XML_ParserFree(p); }
};

class XmlReader {
 public:
  XmlReader(const ParseBudget& budget, std::size_t lineOffset)
      : budget_(budget), lineOffset_(lineOffset) {}

  std::optional<Value> read(std::string_view xml, std::string* reason);

 private:
  struct Frame {
    Kind kind;
    bool expectValue = false;  // a dictionary has read a key and awaits its value
    std::size_t valueStart = 0;
    std::size_t keyStart = 0;
  };

  static void XMLCALL onStart(void* self, const XML_Char* name, const XML_Char** atts);
  static void XMLCALL onEnd(void* self, const XML_Char* name);
  static void XMLCALL onText(void* self, const XML_Char* s, int len);
  static void XMLCALL onEntityDecl(void* self, const XML_Char*, int, const XML_Char*, int,
                                   const XML_Char*, const XML_Char*, const XML_Char*,
                                   const XML_Char*);
  static void XMLCALL onSkippedEntity(void* self, const XML_Char*, int);
  static void XMLCALL onProcessingInstruction(void* self, const XML_Char*, const XML_Char*);
  static int XMLCALL onExternalEntity(XML_Parser, const XML_Char*, const XML_Char*, const XML_Char*,
                                      const XML_Char*);

  void start(const char* name);
  void end();
  void text(const char* s, int len);
  void fail(const std::string& why);
  bool takeObject(std::size_t bytes);
  void deliver(Value v);
  std::optional<Value> leafValue(Kind kind);

  ParseBudget budget_;
  std::size_t lineOffset_;
  XML_Parser parser_ = nullptr;
  std::string failure_;
  bool failed_ = false;
  std::vector<Frame> frames_;
  std::size_t containerDepth_ = 0;
  std::vector<Value> values_;
  std::vector<std::string> keys_;
  std::string text_;
  std::uint64_t objects_ = 0;
  std::uint64_t bytes_ = 0;
};

void XmlReader::fail(const std::string& why) {
  if (failed_) return;
  failed_ = true;
  failure_ = "line " + std::to_string(XML_GetCurrentLineNumber(parser_) + lineOffset_) +
             ", column " + std::to_string(XML_GetCurrentColumnNumber(parser_) + 1) + ": " + why;
  XML_StopParser(parser_, XML_FALSE);
}

bool XmlReader::takeObject(std::size_t bytes) {
  if (++objects_ > budget_.maxObjects) {
    fail("more than " + std::to_string(budget_.maxObjects) + " objects");
    return false;
  }
  bytes_ += bytes;
  if (bytes_ > budget_.maxBytes) {
    fail("more than " + std::to_string(budget_.maxBytes) + " bytes of strings and data");
    return false;
  }
  return true;
}

void XmlReader::start(const char* name) {
  Kind kind;
  if (!classify(name, &kind)) return fail("unknown element " + shortName(name));
  if (frames_.empty()) {
    if (kind != Kind::kPlist) return fail("the root element is not <plist>");
    frames_.push_back({kind, false, values_.size(), keys_.size()});
    return;
  }
  Frame& parent = frames_.back();
  if (isLeaf(parent.kind)) {
    return fail("element " + shortName(name) + " inside " + tagName(parent.kind));
  }
  if (kind == Kind::kPlist) return fail("<plist> inside another element");
  if (parent.kind == Kind::kDict) {
    if (!parent.expectValue && kind != Kind::kKey) {
      return fail(std::string(tagName(kind)) + " in a dictionary without a <key>");
    }
    if (parent.expectValue && kind == Kind::kKey) return fail("<key> without a value");
  } else {
    if (kind == Kind::kKey) return fail("<key> outside a dictionary");
    if (parent.kind == Kind::kPlist && values_.size() > parent.valueStart) {
      return fail("more than one value in <plist>");
    }
  }
  if (isContainer(kind)) {
    if (++containerDepth_ > budget_.maxDepth) {
      return fail("containers nested deeper than " + std::to_string(budget_.maxDepth) + " levels");
    }
  } else {
    text_.clear();
  }
  frames_.push_back({kind, false, values_.size(), keys_.size()});
}

std::optional<Value> XmlReader::leafValue(Kind kind) {
  switch (kind) {
    case Kind::kString:
      if (!takeObject(text_.size())) return std::nullopt;
      return Value(std::string(text_));
    case Kind::kInteger:
      if (auto i = number_text::parseInteger(trimmed(text_))) {
        if (!takeObject(0)) return std::nullopt;
        return Value(*i);
      }
      fail("<integer> does not hold an integer in range");
      return std::nullopt;
    case Kind::kReal:
      if (auto d = number_text::parseReal(trimmed(text_))) {
        if (!takeObject(0)) return std::nullopt;
        return Value::real(*d);
      }
      fail("<real> does not hold a number");
      return std::nullopt;
    case Kind::kTrue:
    case Kind::kFalse:
      if (!trimmed(text_).empty()) {
        fail(std::string(tagName(kind)) + " is not empty");
        return std::nullopt;
      }
      if (!takeObject(0)) return std::nullopt;
      return Value::boolean(kind == Kind::kTrue);
    case Kind::kDate:
      if (auto d = calendar::parseIso8601(trimmed(text_))) {
        if (!takeObject(0)) return std::nullopt;
        return Value::date(*d);
      }
      fail("<date> does not hold a date of the form YYYY-MM-DDTHH:MM:SSZ");
      return std::nullopt;
    case Kind::kData:
      if (auto bytes = base64::decode(text_)) {
        if (!takeObject(bytes->size())) return std::nullopt;
        if (bytes->capacity() > bytes->size() + 32) bytes->shrink_to_fit();
        return Value::data(std::move(*bytes));
      }
      fail("<data> does not hold base64 text");
      return std::nullopt;
    default:
      return std::nullopt;
  }
}

// Hands a finished value to the enclosing frame.
void XmlReader::deliver(Value v) {
  values_.push_back(std::move(v));
  Frame& parent = frames_.back();
  if (parent.kind == Kind::kDict) parent.expectValue = false;
}

void XmlReader::end() {
  const Frame frame = frames_.back();
  frames_.pop_back();
  switch (frame.kind) {
    case Kind::kPlist:
      if (values_.size() == frame.valueStart) fail("<plist> holds no value");
      return;
    case Kind::kKey:
      if (!takeObject(text_.size())) return;
      keys_.emplace_back(text_);
      frames_.back().expectValue = true;
      return;
    case Kind::kArray: {
      --containerDepth_;
      Array a;
      a.reserve(values_.size() - frame.valueStart);
      for (std::size_t i = frame.valueStart; i < values_.size(); ++i) {
        a.push_back(std::move(values_[i]));
      }
      values_.resize(frame.valueStart);
      if (!takeObject(0)) return;
      deliver(Value(std::move(a)));
      return;
    }
    case Kind::kDict: {
      --containerDepth_;
      if (frame.expectValue) return fail("<key> without a value");
      std::vector<Dictionary::Entry> entries;
      entries.reserve(values_.size() - frame.valueStart);
      for (std::size_t i = 0; frame.valueStart + i < values_.size(); ++i) {
        entries.emplace_back(std::move(keys_[frame.keyStart + i]),
                             std::move(values_[frame.valueStart + i]));
      }
      values_.resize(frame.valueStart);
      keys_.resize(frame.keyStart);
      if (!takeObject(0)) return;
      deliver(Value(Dictionary::fromEntries(std::move(entries))));
      return;
    }
    default:
      if (std::optional<Value> v = leafValue(frame.kind)) deliver(std::move(*v));
      return;
  }
}

void XmlReader::text(const char* s, int len) {
  if (frames_.empty()) return;
  const Kind kind = frames_.back().kind;
  if (isLeaf(kind)) {
    if (text_.size() + static_cast<std::size_t>(len) > budget_.maxBytes) {
      return fail("more than " + std::to_string(budget_.maxBytes) + " bytes of strings and data");
    }
    text_.append(s, static_cast<std::size_t>(len));
  } else if (!allSpace(s, len)) {
    fail(std::string("text directly inside ") + tagName(kind));
  }
}

void XMLCALL XmlReader::onStart(void* self, const XML_Char* name, const XML_Char**) {
  auto* r = static_cast<XmlReader*>(self);
  if (!r->failed_) r->start(name);
}

void XMLCALL XmlReader::onEnd(void* self, const XML_Char*) {
  auto* r = static_cast<XmlReader*>(self);
  if (!r->failed_) r->end();
}

void XMLCALL XmlReader::onText(void* self, const XML_Char* s, int len) {
  auto* r = static_cast<XmlReader*>(self);
  if (!r->failed_) r->text(s, len);
}

// Entity declarations are how "billion laughs" and external-entity reads
// start; a property list never needs one.
void XMLCALL XmlReader::onEntityDecl(void* self, const XML_Char*, int, const XML_Char*, int,
                                     const XML_Char*, const XML_Char*, const XML_Char*,
                                     const XML_Char*) {
  static_cast<XmlReader*>(self)->fail("entity declarations are not accepted");
}

void XMLCALL XmlReader::onSkippedEntity(void* self, const XML_Char*, int) {
  static_cast<XmlReader*>(self)->fail("reference to an undeclared entity");
}

void XMLCALL XmlReader::onProcessingInstruction(void* self, const XML_Char*, const XML_Char*) {
  static_cast<XmlReader*>(self)->fail("processing instructions are not accepted");
}

int XMLCALL XmlReader::onExternalEntity(XML_Parser, const XML_Char*, const XML_Char*,
                                        const XML_Char*, const XML_Char*) {
  return XML_STATUS_ERROR;  // never read another resource
}

std::optional<Value> XmlReader::read(std::string_view xml, std::string* reason) {
  std::unique_ptr<XML_ParserStruct, ParserDeleter> parser(XML_ParserCreate(nullptr));
  if (!parser) {
    *reason = "XML property list: out of memory";
    return std::nullopt;
  }
  parser_ = parser.get();
  XML_SetUserData(parser_, this);
  XML_SetElementHandler(parser_, onStart, onEnd);
  XML_SetCharacterDataHandler(parser_, onText);
  XML_SetEntityDeclHandler(parser_, onEntityDecl);
  XML_SetSkippedEntityHandler(parser_, onSkippedEntity);
  XML_SetProcessingInstructionHandler(parser_, onProcessingInstruction);
  XML_SetExternalEntityRefHandler(parser_, onExternalEntity);
  XML_SetParamEntityParsing(parser_, XML_PARAM_ENTITY_PARSING_NEVER);

  // expat takes int lengths; feed very large documents in pieces.
  constexpr std::size_t kPiece = std::size_t{1} << 30;
  std::size_t pos = 0;
  XML_Status status = XML_STATUS_OK;
  do {
    const std::size_t n = xml.size() - pos < kPiece ? xml.size() - pos : kPiece;
    const bool last = pos + n == xml.size();
    status = XML_Parse(parser_, xml.data() + pos, static_cast<int>(n), last ? XML_TRUE : XML_FALSE);
    pos += n;
  } while (status == XML_STATUS_OK && pos < xml.size());

  if (failed_) {
    *reason = "XML property list: " + failure_;
    return std::nullopt;
  }
  if (status != XML_STATUS_OK) {
    *reason = "XML property list: line " +
              std::to_string(XML_GetCurrentLineNumber(parser_) + lineOffset_) + ", column " +
              std::to_string(XML_GetCurrentColumnNumber(parser_) + 1) + ": " +
              XML_ErrorString(XML_GetErrorCode(parser_));
    return std::nullopt;
  }
  if (values_.size() != 1 || !frames_.empty()) {
    *reason = "XML property list: no value";
    return std::nullopt;
  }
  return std::move(values_.front());
}

}  // namespace

std::optional<Value> readXml(std::string_view xml, const ParseBudget& budget, std::string* reason,
                             std::size_t lineOffset) {
  XmlReader reader(budget, lineOffset);
  return reader.read(xml, reason);
}

}  // namespace kolt::plist_internal
