// Property-list values and their codecs.
//
// kolt::Value is a concrete value type holding one property-list value:
// dictionary (string keys, kept sorted), array, string, integer (signed or
// unsigned 64-bit), real, boolean, date or data. Copying a Value copies the
// whole tree; nothing a caller holds changes behind its back.
#ifndef KOLT_PLIST_H
#define KOLT_PLIST_H

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "kolt/export.h"

namespace kolt {

class Error;
class Value;

// Seconds since 2001-01-01T00:00:00Z (the platform's reference date).
// Fractions are kept in memory and in binary property lists; XML keeps
// whole seconds.
struct Date {
  double seconds = 0;
  friend bool operator==(const Date&, const Date&) = default;
};

// A 64-bit integer that remembers whether it is the unsigned value above
// INT64_MAX (bit pattern in `bits`) or a signed value.
struct Integer {
  std::int64_t bits = 0;
  bool isUnsigned = false;  // true only for values above INT64_MAX
};

// Raw bytes (a <data> element).
struct Data {
  std::string bytes;
};

using Array = std::vector<Value>;

// A dictionary with string keys kept in byte order. Keys are unique.
class KOLT_EXPORT Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;
  using const_iterator = std::vector<Entry>::const_iterator;
  using iterator = std::vector<Entry>::iterator;

  Dictionary() = default;

  // The value under `key`, or null when absent. The pointer stays valid until
  // the dictionary is next changed.
  const Value* find(std::string_view key) const;
  Value* find(std::string_view key);
  bool contains(std::string_view key) const { return find(key) != nullptr; }

  // Stores `value` under `key`, replacing any earlier value. Returns a
  // reference to the stored value.
  Value& set(std::string key, Value value);
  // Removes `key`; returns whether it was present.
  bool erase(std::string_view key);

  // Defined after Value, which must be complete for them (clang insists).
  std::size_t size() const;
  bool empty() const;
  const_iterator begin() const { return entries_.begin(); }
  const_iterator end() const { return entries_.end(); }
  iterator begin() { return entries_.begin(); }
  iterator end() { return entries_.end(); }
  void clear();

  // Builds a dictionary from entries in any order; a later duplicate key
  // replaces an earlier one. Used by the readers.
  static Dictionary fromEntries(std::vector<Entry> entries);

  friend bool operator==(const Dictionary& a, const Dictionary& b);

 private:
  std::vector<Entry> entries_;
};

class KOLT_EXPORT Value {
 public:
  enum class Type : std::uint8_t {
    kDictionary,
    kArray,
    kString,
    kInteger,
    kReal,
    kBoolean,
    kDate,
    kData,
  };

  // An empty dictionary.
  Value() = default;
  Value(Dictionary d) : v_(std::move(d)) {}
  Value(Array a) : v_(std::move(a)) {}
  Value(std::string s) : v_(std::move(s)) {}
  Value(std::string_view s) : v_(std::string(s)) {}
  Value(const char* s) : v_(std::string(s)) {}
  Value(Integer i) : v_(i) {}
  Value(Date d) : v_(d) {}
  Value(Data d) : v_(std::move(d)) {}

  static Value dictionary() { return Value(Dictionary()); }
  static Value array() { return Value(Array()); }
  static Value integer(std::int64_t i) { return Value(Integer{i, false}); }
  // An unsigned integer; values up to INT64_MAX are ordinary integers.
  static Value uinteger(std::uint64_t u);
  static Value real(double d);
  static Value boolean(bool b);
  static Value date(double secondsSince2001) { return Value(Date{secondsSince2001}); }
  static Value data(std::string bytes) { return Value(Data{std::move(bytes)}); }

  Type type() const { return static_cast<Type>(v_.index()); }
  bool isDictionary() const { return type() == Type::kDictionary; }
  bool isArray() const { return type() == Type::kArray; }
  bool isString() const { return type() == Type::kString; }
  bool isInteger() const { return type() == Type::kInteger; }
  bool isReal() const { return type() == Type::kReal; }
  bool isNumber() const { return isInteger() || isReal(); }
  bool isBoolean() const { return type() == Type::kBoolean; }
  bool isDate() const { return type() == Type::kDate; }
  bool isData() const { return type() == Type::kData; }

  // Typed access: null when the value is of another kind.
  const Dictionary* asDictionary() const { return std::get_if<Dictionary>(&v_); }
  Dictionary* asDictionary() { return std::get_if<Dictionary>(&v_); }
  const Array* asArray() const { return std::get_if<Array>(&v_); }
  Array* asArray() { return std::get_if<Array>(&v_); }
  const std::string* asString() const { return std::get_if<std::string>(&v_); }
  const Integer* asInteger() const { return std::get_if<Integer>(&v_); }
  const double* asReal() const { return std::get_if<double>(&v_); }
  const bool* asBoolean() const { return std::get_if<Boolean>(&v_) ? &std::get_if<Boolean>(&v_)->value : nullptr; }
  const Date* asDate() const { return std::get_if<Date>(&v_); }
  const Data* asData() const { return std::get_if<Data>(&v_); }

  // The platform's truth value of a boolean or number ("boolValue"): false
  // for zero and for values of other kinds.
  bool truthValue() const;

  // Dictionary shortcuts: null / no-op when this is not a dictionary.
  const Value* find(std::string_view key) const;
  Value* find(std::string_view key);
  const std::string* findString(std::string_view key) const;
  const Dictionary* findDictionary(std::string_view key) const;
  Dictionary* findDictionary(std::string_view key);
  const Array* findArray(std::string_view key) const;
  Array* findArray(std::string_view key);
  // Stores under `key`; turns a non-dictionary into an empty dictionary first.
  Value& set(std::string key, Value value);
  bool erase(std::string_view key);

  // The platform's equality: integers and reals compare by numeric value;
  // booleans never equal numbers; dates compare exactly; strings and data byte
  // for byte; dictionaries by key set and values; arrays element by element.
  friend bool operator==(const Value& a, const Value& b);

  // The stable printed form used for "%@" in log lines. A top-level string
  // prints as itself; collections print their entries in order.
  std::string description() const;

 private:
  // A distinct wrapper so that booleans never convert from pointers or ints.
  struct Boolean {
    bool value = false;
  };
  std::variant<Dictionary, Array, std::string, Integer, double, Boolean, Date, Data> v_;
};

inline std::size_t Dictionary::size() const { return entries_.size(); }
inline bool Dictionary::empty() const { return entries_.empty(); }
inline void Dictionary::clear() { entries_.clear(); }

// Limits that every reader enforces. A document that exceeds one is rejected
// with an error; nothing partial is returned.
struct ParseLimits {
  // Nesting of containers. Values are copied, compared, printed and written
  // recursively, so keep this in the hundreds or low thousands.
  std::size_t maxDepth = 512;
  // Values produced, dictionary keys included (after expanding shared
  // references in binary lists). 0 means: the input size in bytes, at least
  // 1 << 20.
  std::size_t maxObjects = 0;
  // Bytes of string, key and data content produced. 0 means: twice the input
  // size, at least 64 MiB.
  std::size_t maxBytes = 0;
};

// Parses an XML or binary ("bplist00") property list. XML may begin with a
// UTF-8 byte order mark and whitespace; a document type declaration is
// accepted, entity declarations and processing instructions are not. Binary
// lists may share objects (each reference is expanded by value) but not
// contain themselves; UID, set and null objects are refused.
// Returns the value, or nothing with `error` (POSIX 22, the reason as its
// description, with line and column for XML) when the input is malformed,
// exceeds a limit, or holds text that is not a value of the tag's kind
// ("12abc" is no integer, "yesterday" no date).
KOLT_EXPORT std::optional<Value> parsePropertyList(std::string_view bytes,
                                                   std::optional<Error>* error = nullptr,
                                                   const ParseLimits& limits = {});

// Writes `value` as an XML property list, format 1.0: the XML declaration,
// <plist version="1.0">, tab indentation, sorted keys, no document type
// declaration, a final newline. &, <, > and carriage returns are written as
// references; reals in their shortest exact form; dates in whole seconds
// (floored); data as base64 in lines of 76 characters. Fails (POSIX 22, the
// reason as description) for strings or keys holding invalid UTF-8 or
// characters XML 1.0 cannot carry (C0 controls other than tab and line feed,
// U+FFFE, U+FFFF), and for dates that are not finite or beyond the calendar.
KOLT_EXPORT std::optional<std::string> writeXmlPropertyList(const Value& value,
                                                            std::optional<Error>* error = nullptr);

}  // namespace kolt

#endif  // KOLT_PLIST_H
