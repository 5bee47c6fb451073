// Helpers shared by the property-list tests: a canonical text dump that the
// Python oracle prints the same way, a hand builder for binary lists, and a
// runner for the oracle script.
#ifndef KOLT_TESTS_UNIT_PLIST_PLIST_TEST_SUPPORT_H
#define KOLT_TESTS_UNIT_PLIST_PLIST_TEST_SUPPORT_H

#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "kolt/error.h"
#include "kolt/plist.h"

namespace kolt::plist_test {

inline std::string hex(std::string_view bytes) {
  static const char kHex[] = "0123456789abcdef";
  std::string out;
  for (unsigned char c : bytes) {
    out += kHex[c >> 4];
    out += kHex[c & 15];
  }
  return out;
}

// One line per token, keys in byte order; the oracle script prints the same.
inline void dump(std::string& out, const Value& v) {
  switch (v.type()) {
    case Value::Type::kDictionary:
      out += "dict " + std::to_string(v.asDictionary()->size()) + "\n";
      for (const auto& [k, item] : *v.asDictionary()) {
        out += "key " + hex(k) + "\n";
        dump(out, item);
      }
      return;
    case Value::Type::kArray:
      out += "array " + std::to_string(v.asArray()->size()) + "\n";
      for (const Value& item : *v.asArray()) dump(out, item);
      return;
    case Value::Type::kString:
      out += "string " + hex(*v.asString()) + "\n";
      return;
    case Value::Type::kInteger: {
      const Integer& i = *v.asInteger();
      out += "int " +
             (i.isUnsigned ? std::to_string(static_cast<std::uint64_t>(i.bits))
                           : std::to_string(i.bits)) +
             "\n";
      return;
    }
    case Value::Type::kReal: {
      const double d = *v.asReal();
      if (std::isnan(d)) {
        out += "real nan\n";
        return;
      }
      std::uint64_t bits;
      std::memcpy(&bits, &d, 8);
      char buf[32];
      std::snprintf(buf, sizeof buf, "%016llx", static_cast<unsigned long long>(bits));
      out += std::string("real ") + buf + "\n";
      return;
    }
    case Value::Type::kBoolean:
      out += *v.asBoolean() ? "bool true\n" : "bool false\n";
      return;
    case Value::Type::kDate:
      out += "date " + std::to_string(std::llround(v.asDate()->seconds * 1e6)) + "\n";
      return;
    case Value::Type::kData:
      out += "data " + hex(v.asData()->bytes) + "\n";
      return;
  }
}

inline std::string dump(const Value& v) {
  std::string out;
  dump(out, v);
  return out;
}

inline std::string readFile(const std::filesystem::path& p) {
  std::ifstream in(p, std::ios::binary);
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

inline void writeFile(const std::filesystem::path& p, std::string_view bytes) {
  std::ofstream out(p, std::ios::binary);
  out.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
}

// A directory removed at the end of the test.
class ScratchDir {
 public:
  ScratchDir() {
    std::string tmpl = (std::filesystem::temp_directory_path() / "kolt-plist-XXXXXX").string();
    path_ = ::mkdtemp(tmpl.data());
  }
  ~ScratchDir() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }
  const std::filesystem::path& path() const { return path_; }
  std::filesystem::path operator/(const char* name) const { return path_ / name; }

 private:
  std::filesystem::path path_;
};

inline bool havePython() {
  return std::system("command -v python3 >/dev/null 2>&1") == 0;
}

// Runs the oracle script with `args` (each shell-quoted); returns its exit
// status.
inline int runOracle(const std::vector<std::string>& args) {
  std::string cmd = "python3 '" KOLT_SOURCE_DIR "/tests/unit/plist/plistlib_oracle.py'";
  for (const std::string& a : args) cmd += " '" + a + "'";
  const int status = std::system(cmd.c_str());
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// Builds binary property lists object by object, for hostile cases.
class BplistBuilder {
 public:
  explicit BplistBuilder(int refSize = 1, int offsetSize = 2)
      : refSize_(refSize), offsetSize_(offsetSize) {}

  // Appends an encoded object; returns its index.
  std::size_t add(std::string encoded) {
    objects_.push_back(std::move(encoded));
    return objects_.size() - 1;
  }

  static std::string bigEndian(std::uint64_t v, int n) {
    std::string s;
    for (int i = n - 1; i >= 0; --i) s += static_cast<char>((v >> (8 * i)) & 0xFF);
    return s;
  }
  // A marker with a count, extended past 14 as the format does.
  static std::string marker(int type, std::uint64_t count) {
    if (count < 15) return std::string(1, static_cast<char>((type << 4) | count));
    return std::string(1, static_cast<char>((type << 4) | 0xF)) + "\x13" + bigEndian(count, 8);
  }
  static std::string integer(std::int64_t v) {
    return "\x13" + bigEndian(static_cast<std::uint64_t>(v), 8);
  }
  static std::string ascii(std::string_view s) { return marker(5, s.size()) + std::string(s); }
  static std::string utf16(const std::vector<std::uint16_t>& units) {
    std::string s = marker(6, units.size());
    for (std::uint16_t u : units) s += bigEndian(u, 2);
    return s;
  }
  std::string array(const std::vector<std::size_t>& refs) const {
    std::string s = marker(0xA, refs.size());
    for (std::size_t r : refs) s += bigEndian(r, refSize_);
    return s;
  }
  std::string dict(const std::vector<std::size_t>& keys,
                   const std::vector<std::size_t>& values) const {
    std::string s = marker(0xD, keys.size());
    for (std::size_t r : keys) s += bigEndian(r, refSize_);
    for (std::size_t r : values) s += bigEndian(r, refSize_);
    return s;
  }

  std::string finish(std::size_t top) const {
    std::string out = "bplist00";
    std::vector<std::size_t> offsets;
    for (const std::string& o : objects_) {
      offsets.push_back(out.size());
      out += o;
    }
    const std::size_t table = out.size();
    for (std::size_t off : offsets) out += bigEndian(off, offsetSize_);
    out += std::string(6, '\0');
    out += static_cast<char>(offsetSize_);
    out += static_cast<char>(refSize_);
    out += bigEndian(objects_.size(), 8);
    out += bigEndian(top, 8);
    out += bigEndian(table, 8);
    return out;
  }

 private:
  int refSize_;
  int offsetSize_;
  std::vector<std::string> objects_;
};

// Parses and returns the error's description, or "" when the parse worked.
inline std::string parseFailure(std::string_view bytes, const ParseLimits& limits = {}) {
  std::optional<Error> error;
  std::optional<Value> v = parsePropertyList(bytes, &error, limits);
  if (v) return "";
  if (!error) return "(no error)";
  if (error->code() != kPosixEINVAL || error->domain() != kPosixErrorDomain) return "(wrong code)";
  return error->description().value_or("(no description)");
}

// A document with a value of every kind and the edge cases of each.
inline Value sampleDocument() {
  Value doc = Value::dictionary();
  doc.set("string", "plain");
  doc.set("escapes", "a & b < c > d \"q\" 'a'\ttab\nline");
  doc.set("carriage\rreturn", "line1\r\nline2\r");
  doc.set("caf\xC3\xA9 \xE6\x97\xA5\xE6\x9C\xAC \xF0\x9F\x98\x80", "\xF0\x9F\x98\x80 non-ASCII");
  doc.set("empty string", "");
  doc.set("empty dict", Value::dictionary());
  doc.set("empty array", Value::array());
  doc.set("int min", Value::integer(INT64_MIN));
  doc.set("int max", Value::integer(INT64_MAX));
  doc.set("uint max", Value::uinteger(UINT64_MAX));
  doc.set("minus one", Value::integer(-1));
  doc.set("zero", Value::integer(0));
  doc.set("negative zero", Value::real(-0.0));
  doc.set("third", Value::real(1.0 / 3.0));
  doc.set("tiny", Value::real(4.9406564584124654e-324));
  doc.set("huge", Value::real(1.7976931348623157e308));
  doc.set("nan", Value::real(std::nan("")));
  doc.set("inf", Value::real(INFINITY));
  doc.set("minus inf", Value::real(-INFINITY));
  doc.set("yes", Value::boolean(true));
  doc.set("no", Value::boolean(false));
  doc.set("date 1900", Value::date(-3187296000.0));  // 1900-01-01T00:00:00Z
  doc.set("date 2100", Value::date(3124137599.0));   // 2099-12-31T23:59:59Z
  doc.set("data", Value::data(std::string("\0\x01\xFF\0zz", 6)));
  doc.set("long data", Value::data(std::string(200, '\x5A')));
  doc.set("empty data", Value::data(""));
  Value nested = Value::array();
  nested.asArray()->push_back(Value::dictionary());
  nested.asArray()->back().set("inner", Value::array());
  nested.asArray()->back().find("inner")->asArray()->push_back(Value::integer(7));
  nested.asArray()->push_back("x");
  doc.set("nested", nested);
  return doc;
}

}  // namespace kolt::plist_test

#endif  // KOLT_TESTS_UNIT_PLIST_PLIST_TEST_SUPPORT_H
