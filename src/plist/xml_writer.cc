// The XML property-list writer: format 1.0, tab indentation, keys in the
// dictionary's (sorted) order, no document type declaration. Everything is
// appended to one string; a value that XML cannot carry fails the whole
// write.
#include <array>
#include <cmath>
#include <cstdint>
#include <cstring>

#include "kolt/error.h"
#include "kolt/plist.h"
#include "plist/base64.h"
#include "plist/calendar.h"
#include "plist/number_text.h"

namespace kolt {
namespace {

// How the writer treats each byte of a string.
enum ByteClass : std::uint8_t {
  kPlain = 0,
  kEscape = 1,     // & < > and CR, written as references
  kForbidden = 2,  // C0 controls other than tab and line feed
  kMultiByte = 3,  // the start (or stray continuation) of a UTF-8 sequence
};

constexpr std::array<std::uint8_t, 256> makeClasses() {
  std::array<std::uint8_t, 256> t{};
  for (int c = 0; c < 0x20; ++c) t[c] = kForbidden;
  t['\t'] = t['\n'] = kPlain;
  t['\r'] = t['&'] = t['<'] = t['>'] = kEscape;
  for (int c = 0x80; c < 0x100; ++c) t[c] = kMultiByte;
  return t;
}

constexpr std::array<std::uint8_t, 256> kClasses = makeClasses();

bool isContinuation(unsigned char c) {
  return (c & 0xC0) == 0x80;
}

// Length of the well-formed UTF-8 sequence at `p` that XML 1.0 can carry, or
// 0 (invalid UTF-8, a surrogate, U+FFFE or U+FFFF).
std::size_t xmlCharLength(const unsigned char* p, std::size_t left) {
  const unsigned char c = p[0];
  if (c >= 0xC2 && c <= 0xDF) return left >= 2 && isContinuation(p[1]) ? 2 : 0;
  if (c >= 0xE0 && c <= 0xEF) {
    if (left < 3 || !isContinuation(p[1]) || !isContinuation(p[2])) return 0;
    if (c == 0xE0 && p[1] < 0xA0) return 0;                                     // overlong
    if (c == 0xED && p[1] > 0x9F) return 0;                                     // surrogate
    if (c == 0xEF && p[1] == 0xBF && (p[2] == 0xBE || p[2] == 0xBF)) return 0;  // U+FFFE/F
    return 3;
  }
  if (c >= 0xF0 && c <= 0xF4) {
    if (left < 4 || !isContinuation(p[1]) || !isContinuation(p[2]) || !isContinuation(p[3])) {
      return 0;
    }
    if (c == 0xF0 && p[1] < 0x90) return 0;  // overlong
    if (c == 0xF4 && p[1] > 0x8F) return 0;  // above U+10FFFF
    return 4;
  }
  return 0;
}

class XmlWriter {
 public:
  explicit XmlWriter(std::string& out) : out_(out) {}
  bool write(const Value& v, std::size_t depth);
  const std::string& failure() const { return failure_; }

 private:
  bool text(std::string_view s, const char* what);
  void open(std::size_t depth, std::string_view tag) {
    out_.append(depth, '\t');
    out_ += tag;
  }

  std::string& out_;
  std::string failure_;
};

// Whether any of the eight bytes in `w` is a control character, non-ASCII,
// or one of & < > (bit tricks for "has a byte less than / equal to").
bool wordNeedsCare(std::uint64_t w) {
  constexpr std::uint64_t kOnes = 0x0101010101010101ull;
  constexpr std::uint64_t kHigh = 0x8080808080808080ull;
  auto hasZero = [](std::uint64_t x) { return (x - kOnes) & ~x & kHigh; };
  const std::uint64_t below20 = (w - kOnes * 0x20) & ~w & kHigh;
  return (below20 | (w & kHigh) | hasZero(w ^ (kOnes * '&')) | hasZero(w ^ (kOnes * '<')) |
          hasZero(w ^ (kOnes * '>'))) != 0;
}

bool XmlWriter::text(std::string_view s, const char* what) {
  const auto* p = reinterpret_cast<const unsigned char*>(s.data());
  const std::size_t n = s.size();
  std::size_t run = 0;  // start of the bytes not yet copied
  std::size_t i = 0;
  while (i < n) {
    if (i + 8 <= n) {
      std::uint64_t w;
      std::memcpy(&w, p + i, 8);
      if (!wordNeedsCare(w)) {
        i += 8;
        continue;
      }
    }
    const std::uint8_t cls = kClasses[p[i]];
    if (cls == kPlain) {
      ++i;
      continue;
    }
    if (cls == kMultiByte) {
      const std::size_t len = xmlCharLength(p + i, n - i);
      if (len == 0) {
        failure_ = std::string(what) +
                   " holds invalid UTF-8 or a character XML 1.0 cannot carry (U+FFFE, U+FFFF)";
        return false;
      }
      i += len;
      continue;
    }
    if (cls == kForbidden) {
      static const char kHex[] = "0123456789ABCDEF";
      failure_ = std::string(what) + " holds the control character U+00" + kHex[p[i] >> 4] +
                 kHex[p[i] & 15] + ", which XML 1.0 cannot carry";
      return false;
    }
    out_.append(s.data() + run, i - run);
    switch (p[i]) {
      case '&':
        out_ += "&amp;";
        break;
      case '<':
        out_ += "&lt;";
        break;
      case '>':
        out_ += "&gt;";
        break;
      default:
        out_ += "&#13;";
        break;  // a raw CR would be read back as LF
    }
    run = ++i;
  }
  out_.append(s.data() + run, n - run);
  return true;
}

bool XmlWriter::write(const Value& v, std::size_t depth) {
  switch (v.type()) {
    case Value::Type::kDictionary: {
      const Dictionary& d = *v.asDictionary();
      if (d.empty()) {
        open(depth, "<dict/>\n");
        return true;
      }
      open(depth, "<dict>\n");
      for (const auto& [key, value] : d) {
        open(depth + 1, "<key>");
        if (!text(key, "a key")) return false;
        out_ += "</key>\n";
        if (!write(value, depth + 1)) return false;
      }
      open(depth, "</dict>\n");
      return true;
    }
    case Value::Type::kArray: {
      const Array& a = *v.asArray();
      if (a.empty()) {
        open(depth, "<array/>\n");
        return true;
      }
      open(depth, "<array>\n");
      for (const Value& item : a) {
        if (!write(item, depth + 1)) return false;
      }
      open(depth, "</array>\n");
      return true;
    }
    case Value::Type::kString:
      open(depth, "<string>");
      if (!text(*v.asString(), "a string")) return false;
      out_ += "</string>\n";
      return true;
    case Value::Type::kInteger:
      open(depth, "<integer>");
      number_text::appendInteger(out_, *v.asInteger());
      out_ += "</integer>\n";
      return true;
    case Value::Type::kReal:
      open(depth, "<real>");
      number_text::appendReal(out_, *v.asReal());
      out_ += "</real>\n";
      return true;
    case Value::Type::kBoolean:
      open(depth, *v.asBoolean() ? "<true/>\n" : "<false/>\n");
      return true;
    case Value::Type::kDate: {
      const double s = v.asDate()->seconds;
      // Beyond the calendar's range (or NaN) the text would name another
      // date, or one the reader refuses.
      if (!std::isfinite(s) || std::fabs(s) >= calendar::kMaxIso8601Seconds) {
        failure_ = "a date lies outside the range XML dates can express";
        return false;
      }
      open(depth, "<date>");
      out_ += calendar::formatIso8601(s);
      out_ += "</date>\n";
      return true;
    }
    case Value::Type::kData:
      open(depth, "<data>\n");
      base64::appendLines(out_, v.asData()->bytes, depth);
      open(depth, "</data>\n");
      return true;
  }
  return false;
}

}  // namespace

std::optional<std::string> writeXmlPropertyList(const Value& value, std::optional<Error>* error) {
  std::string out;
  out.reserve(4096);  // growing is cheaper than walking the tree twice
  out +=
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
      "<plist version=\"1.0\">\n";
  XmlWriter writer(out);
  if (!writer.write(value, 0)) {
    setError(error, Error::posix(kPosixEINVAL,
                                 "cannot write the property list as XML: " + writer.failure()));
    return std::nullopt;
  }
  out += "</plist>\n";
  return out;
}

}  // namespace kolt
