#include <algorithm>
#include <cmath>
#include <limits>

#include "kolt/plist.h"

namespace kolt {
namespace {

bool keyLess(const Dictionary::Entry& e, std::string_view key) {
  return e.first < key;
}

// The numeric value of an integer as a 128-bit signed number.
__int128 wide(const Integer& i) {
  return i.isUnsigned ? static_cast<__int128>(static_cast<std::uint64_t>(i.bits))
                      : static_cast<__int128>(i.bits);
}

bool integerEqualsReal(const Integer& i, double d) {
  if (std::isnan(d) || std::isinf(d)) return false;
  if (d != std::floor(d)) return false;
  // long double holds every 64-bit integer exactly on x86_64.
  const long double w = i.isUnsigned ? static_cast<long double>(static_cast<std::uint64_t>(i.bits))
                                     : static_cast<long double>(i.bits);
  return w == static_cast<long double>(d);
}

}  // namespace

// --- Dictionary ---------------------------------------------------------------

const Value* Dictionary::find(std::string_view key) const {
  auto it = std::lower_bound(entries_.begin(), entries_.end(), key, keyLess);
  return it != entries_.end() && it->first == key ? &it->second : nullptr;
}

Value* Dictionary::find(std::string_view key) {
  auto it = std::lower_bound(entries_.begin(), entries_.end(), key, keyLess);
  return it != entries_.end() && it->first == key ? &it->second : nullptr;
}

Value& Dictionary::set(std::string key, Value value) {
  // Appending in key order (what the readers see) needs no search.
  if (entries_.empty() || entries_.back().first < key) {
    entries_.emplace_back(std::move(key), std::move(value));
    return entries_.back().second;
  }
  auto it = std::lower_bound(entries_.begin(), entries_.end(), std::string_view(key), keyLess);
  if (it != entries_.end() && it->first == key) {
    it->second = std::move(value);
    return it->second;
  }
  it = entries_.emplace(it, std::move(key), std::move(value));
  return it->second;
}

bool Dictionary::erase(std::string_view key) {
  auto it = std::lower_bound(entries_.begin(), entries_.end(), key, keyLess);
  if (it == entries_.end() || it->first != key) return false;
  entries_.erase(it);
  return true;
}

Dictionary Dictionary::fromEntries(std::vector<Entry> entries) {
  Dictionary d;
  const bool sorted =
      std::is_sorted(entries.begin(), entries.end(),
                     [](const Entry& a, const Entry& b) { return a.first < b.first; });
  if (!sorted) {
    std::stable_sort(entries.begin(), entries.end(),
                     [](const Entry& a, const Entry& b) { return a.first < b.first; });
  }
  // Keep the last of equal keys, as a reader assigning in order would.
  std::vector<Entry> unique;
  bool hasDuplicates = false;
  for (std::size_t i = 1; i < entries.size(); ++i) {
    if (entries[i].first == entries[i - 1].first) {
      hasDuplicates = true;
      break;
    }
  }
  if (!hasDuplicates) {
    d.entries_ = std::move(entries);
    return d;
  }
  unique.reserve(entries.size());
  for (auto& e : entries) {
    if (!unique.empty() && unique.back().first == e.first) {
      unique.back().second = std::move(e.second);
    } else {
      unique.push_back(std::move(e));
    }
  }
  unique.shrink_to_fit();
  d.entries_ = std::move(unique);
  return d;
}

bool operator==(const Dictionary& a, const Dictionary& b) {
  return a.entries_ == b.entries_;
}

// --- Value --------------------------------------------------------------------

Value Value::uinteger(std::uint64_t u) {
  const bool above = u > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  return Value(Integer{static_cast<std::int64_t>(u), above});
}

Value Value::real(double d) {
  Value v;
  v.v_ = d;
  return v;
}

Value Value::boolean(bool b) {
  Value v;
  v.v_ = Boolean{b};
  return v;
}

bool Value::truthValue() const {
  if (const bool* b = asBoolean()) return *b;
  if (const Integer* i = asInteger()) return i->bits != 0;
  if (const double* d = asReal()) return *d != 0;
  return false;
}

const Value* Value::find(std::string_view key) const {
  const Dictionary* d = asDictionary();
  return d ? d->find(key) : nullptr;
}

Value* Value::find(std::string_view key) {
  Dictionary* d = asDictionary();
  return d ? d->find(key) : nullptr;
}

const std::string* Value::findString(std::string_view key) const {
  const Value* v = find(key);
  return v ? v->asString() : nullptr;
}

const Dictionary* Value::findDictionary(std::string_view key) const {
  const Value* v = find(key);
  return v ? v->asDictionary() : nullptr;
}

Dictionary* Value::findDictionary(std::string_view key) {
  Value* v = find(key);
  return v ? v->asDictionary() : nullptr;
}

const Array* Value::findArray(std::string_view key) const {
  const Value* v = find(key);
  return v ? v->asArray() : nullptr;
}

Array* Value::findArray(std::string_view key) {
  Value* v = find(key);
  return v ? v->asArray() : nullptr;
}

Value& Value::set(std::string key, Value value) {
  if (!isDictionary()) v_ = Dictionary();
  return std::get<Dictionary>(v_).set(std::move(key), std::move(value));
}

bool Value::erase(std::string_view key) {
  Dictionary* d = asDictionary();
  return d ? d->erase(key) : false;
}

bool operator==(const Value& a, const Value& b) {
  if (a.isNumber() && b.isNumber()) {
    const Integer* ai = a.asInteger();
    const Integer* bi = b.asInteger();
    if (ai && bi) return wide(*ai) == wide(*bi);
    if (ai) return integerEqualsReal(*ai, *b.asReal());
    if (bi) return integerEqualsReal(*bi, *a.asReal());
    const double x = *a.asReal();
    const double y = *b.asReal();
    return x == y || (std::isnan(x) && std::isnan(y));
  }
  if (a.type() != b.type()) return false;
  switch (a.type()) {
    case Value::Type::kDictionary:
      return *a.asDictionary() == *b.asDictionary();
    case Value::Type::kArray:
      return *a.asArray() == *b.asArray();
    case Value::Type::kString:
      return *a.asString() == *b.asString();
    case Value::Type::kBoolean:
      return *a.asBoolean() == *b.asBoolean();
    case Value::Type::kDate:
      return a.asDate()->seconds == b.asDate()->seconds;
    case Value::Type::kData:
      return a.asData()->bytes == b.asData()->bytes;
    case Value::Type::kInteger:
    case Value::Type::kReal:
      break;
  }
  return false;
}

}  // namespace kolt
