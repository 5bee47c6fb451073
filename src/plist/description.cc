// The printed form of values ("%@"), in the style of the platform's
// descriptions: dictionaries as { key = value; }, arrays as ( a, b ).
#include <string>

#include "kolt/plist.h"
#include "plist/calendar.h"
#include "plist/number_text.h"

namespace kolt {
namespace {

bool printsUnquoted(std::string_view s) {
  if (s.empty()) return false;
  for (unsigned char c : s) {
    const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                       c == '_' || c == '.' || c == '$' || c == '/' || c == ':' || c == '-';
    if (!plain) return false;
  }
  return true;
}

void appendQuoted(std::string& out, std::string_view s) {
  if (printsUnquoted(s)) {
    out += s;
    return;
  }
  out += '"';
  for (unsigned char c : s) {
    switch (c) {
      case '"':
        out += "\\\"";
        break;
      case '\\':
        out += "\\\\";
        break;
      case '\n':
        out += "\\n";
        break;
      case '\t':
        out += "\\t";
        break;
      case '\r':
        out += "\\r";
        break;
      default:
        if (c < 0x20 || c == 0x7f) {
          static const char kHex[] = "0123456789ABCDEF";
          out += "\\U00";
          out += kHex[c >> 4];
          out += kHex[c & 15];
        } else {
          out += static_cast<char>(c);
        }
    }
  }
  out += '"';
}

void indent(std::string& out, int level) {
  out.append(static_cast<std::size_t>(level) * 4, ' ');
}

void describe(std::string& out, const Value& v, int level, bool topLevel) {
  switch (v.type()) {
    case Value::Type::kString:
      if (topLevel) {
        out += *v.asString();
      } else {
        appendQuoted(out, *v.asString());
      }
      return;
    case Value::Type::kInteger:
      out += number_text::formatInteger(*v.asInteger());
      return;
    case Value::Type::kReal:
      out += number_text::formatReal(*v.asReal());
      return;
    case Value::Type::kBoolean:
      out += *v.asBoolean() ? "true" : "false";
      return;
    case Value::Type::kDate:
      out += calendar::formatForDescription(v.asDate()->seconds);
      return;
    case Value::Type::kData: {
      static const char kHex[] = "0123456789abcdef";
      const std::string& bytes = v.asData()->bytes;
      out += "{length = " + std::to_string(bytes.size()) + ", bytes = 0x";
      const std::size_t shown = bytes.size() <= 24 ? bytes.size() : 8;
      for (std::size_t i = 0; i < shown; ++i) {
        out += kHex[static_cast<unsigned char>(bytes[i]) >> 4];
        out += kHex[static_cast<unsigned char>(bytes[i]) & 15];
      }
      if (shown < bytes.size()) {
        out += " ... ";
        for (std::size_t i = bytes.size() - 8; i < bytes.size(); ++i) {
          out += kHex[static_cast<unsigned char>(bytes[i]) >> 4];
          out += kHex[static_cast<unsigned char>(bytes[i]) & 15];
        }
      }
      out += '}';
      return;
    }
    case Value::Type::kArray: {
      out += "(\n";
      const Array& a = *v.asArray();
      for (std::size_t i = 0; i < a.size(); ++i) {
        indent(out, level + 1);
        describe(out, a[i], level + 1, false);
        if (i + 1 < a.size()) out += ',';
        out += '\n';
      }
      indent(out, level);
      out += ')';
      return;
    }
    case Value::Type::kDictionary: {
      out += "{\n";
      for (const auto& [key, value] : *v.asDictionary()) {
        indent(out, level + 1);
        appendQuoted(out, key);
        out += " = ";
        describe(out, value, level + 1, false);
        out += ";\n";
      }
      indent(out, level);
      out += '}';
      return;
    }
  }
}

}  // namespace

std::string Value::description() const {
  std::string out;
  describe(out, *this, 0, true);
  return out;
}

}  // namespace kolt
