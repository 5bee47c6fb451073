// The binary property-list reader ("bplist00").
//
// Layout: an 8-byte header, the objects, an offset table (one offset per
// object) and a 32-byte trailer naming the sizes of offsets and object
// references, the object count, the top object and the table's position.
// Containers refer to other objects by index, so objects may be shared, and
// a hostile list may share them into a cycle or into an expansion of
// billions of values from a few hundred bytes. Reading therefore happens in
// two passes: a measuring pass walks the graph of distinct objects once
// (memoised), rejecting cycles and computing what each object expands to
// (values, bytes, nesting); only a list within the budget is then built.
#include <cmath>
#include <cstring>
#include <limits>
#include <utility>
#include <vector>

#include "plist/readers.h"

namespace kolt::plist_internal {
namespace {

constexpr std::size_t kHeaderSize = 8;
constexpr std::size_t kTrailerSize = 32;

enum ObjectType : std::uint8_t {
  kSimple = 0x0,  // null, false, true, fill
  kInt = 0x1,
  kReal = 0x2,
  kDate = 0x3,
  kData = 0x4,
  kAscii = 0x5,
  kUtf16 = 0x6,
  kUid = 0x8,
  kArray = 0xA,
  kOrderedSet = 0xB,
  kSet = 0xC,
  kDict = 0xD,
};

std::uint64_t readBigEndian(const unsigned char* p, std::size_t n) {
  std::uint64_t v = 0;
  for (std::size_t i = 0; i < n; ++i) v = (v << 8) | p[i];
  return v;
}

std::uint64_t saturatingAdd(std::uint64_t a, std::uint64_t b) {
  const std::uint64_t s = a + b;
  return s < a ? std::numeric_limits<std::uint64_t>::max() : s;
}

// One object's marker, count and where its body (bytes or references) lies.
struct Header {
  std::uint8_t type = 0;
  std::uint8_t info = 0;
  std::uint64_t count = 0;  // elements, bytes or UTF-16 units
  std::size_t body = 0;     // offset of the body
  std::size_t refs = 0;     // references in the body (containers)
};

// What an object expands to when every reference is copied by value.
struct Extent {
  std::uint64_t objects = 0;
  std::uint64_t bytes = 0;
  std::uint32_t height = 0;  // containers on the longest path down, itself included
  std::uint8_t state = 0;    // 0 unseen, 1 being measured, 2 measured
};

class BinaryReader {
 public:
  BinaryReader(std::string_view bytes, const ParseBudget& budget)
      : data_(reinterpret_cast<const unsigned char*>(bytes.data())),
        size_(bytes.size()),
        budget_(budget) {}

  std::optional<Value> read(std::string* reason);

 private:
  bool fail(std::string why) {
    if (reason_.empty()) reason_ = std::move(why);
    return false;
  }
  bool readTrailer();
  bool header(std::uint64_t index, Header* h);
  std::uint64_t ref(const Header& h, std::size_t i) const {
    return readBigEndian(data_ + h.body + i * refSize_, refSize_);
  }
  bool measure();
  bool measureLeaf(std::uint64_t index, const Header& h, Extent* e);
  Value build(std::uint64_t index);

  const unsigned char* data_;
  std::size_t size_;
  ParseBudget budget_;
  std::string reason_;

  std::size_t offsetSize_ = 0;
  std::size_t refSize_ = 0;
  std::uint64_t objectCount_ = 0;
  std::uint64_t topObject_ = 0;
  std::size_t tableOffset_ = 0;  // also the end of the object area
};

bool BinaryReader::readTrailer() {
  if (size_ < kHeaderSize + kTrailerSize + 1) return fail("too short for a binary property list");
  const unsigned char* t = data_ + size_ - kTrailerSize;
  offsetSize_ = t[6];
  refSize_ = t[7];
  objectCount_ = readBigEndian(t + 8, 8);
  topObject_ = readBigEndian(t + 16, 8);
  const std::uint64_t table = readBigEndian(t + 24, 8);
  if (offsetSize_ < 1 || offsetSize_ > 8) return fail("trailer: bad offset size");
  if (refSize_ < 1 || refSize_ > 8) return fail("trailer: bad object reference size");
  if (objectCount_ < 1) return fail("trailer: no objects");
  if (topObject_ >= objectCount_) return fail("trailer: top object out of range");
  const std::uint64_t tableEnd = size_ - kTrailerSize;
  if (table < kHeaderSize + 1 || table >= tableEnd)
    return fail("trailer: offset table out of range");
  if (objectCount_ > (tableEnd - table) / offsetSize_) {
    return fail("trailer: offset table runs past its end");
  }
  // A reference must be able to name every object.
  if (refSize_ < 8 && objectCount_ > (std::uint64_t{1} << (8 * refSize_))) {
    return fail("trailer: object reference size too small for the object count");
  }
  tableOffset_ = static_cast<std::size_t>(table);
  return true;
}

bool BinaryReader::header(std::uint64_t index, Header* h) {
  const std::uint64_t offset =
      readBigEndian(data_ + tableOffset_ + index * offsetSize_, offsetSize_);
  if (offset < kHeaderSize || offset >= tableOffset_) {
    return fail("object " + std::to_string(index) + ": offset out of range");
  }
  const std::size_t end = tableOffset_;
  std::size_t pos = static_cast<std::size_t>(offset);
  const std::uint8_t marker = data_[pos++];
  h->type = marker >> 4;
  h->info = marker & 0x0F;
  h->count = h->info;
  h->refs = 0;
  std::uint64_t unit = 0;  // body bytes per count
  switch (h->type) {
    case kSimple:
      if (h->info == 0x8 || h->info == 0x9) {
        h->body = pos;
        return true;
      }
      if (h->info == 0x0)
        return fail("object " + std::to_string(index) + ": null objects are not supported");
      if (h->info == 0xF) {
        return fail("object " + std::to_string(index) + ": fill objects are not supported");
      }
      return fail("object " + std::to_string(index) + ": unknown marker");
    case kInt:
      if (h->info > 4) return fail("object " + std::to_string(index) + ": bad integer size");
      h->count = std::uint64_t{1} << h->info;
      unit = 1;
      break;
    case kReal:
      if (h->info != 2 && h->info != 3) {
        return fail("object " + std::to_string(index) + ": bad real size");
      }
      h->count = std::uint64_t{1} << h->info;
      unit = 1;
      break;
    case kDate:
      if (h->info != 3) return fail("object " + std::to_string(index) + ": bad date size");
      h->count = 8;
      unit = 1;
      break;
    case kData:
    case kAscii:
    case kUtf16:
    case kArray:
    case kDict:
      if (h->info == 0x0F) {
        // The count follows as an integer object of 1, 2, 4 or 8 bytes.
        if (pos >= end) return fail("object " + std::to_string(index) + ": truncated count");
        const std::uint8_t countMarker = data_[pos++];
        if ((countMarker >> 4) != kInt || (countMarker & 0x0F) > 3) {
          return fail("object " + std::to_string(index) + ": bad count");
        }
        const std::size_t n = std::size_t{1} << (countMarker & 0x0F);
        if (end - pos < n) return fail("object " + std::to_string(index) + ": truncated count");
        h->count = readBigEndian(data_ + pos, n);
        pos += n;
      }
      unit = h->type == kUtf16   ? 2
             : h->type == kArray ? refSize_
             : h->type == kDict  ? 2 * refSize_
                                 : 1;
      if (h->type == kArray || h->type == kDict) {
        h->refs = h->type == kDict ? 2 : 1;  // multiplied by count below
      }
      break;
    case kUid:
      return fail("object " + std::to_string(index) + ": UID objects are not supported");
    case kOrderedSet:
    case kSet:
      return fail("object " + std::to_string(index) + ": sets are not supported");
    default:
      return fail("object " + std::to_string(index) + ": unknown marker");
  }
  if (h->count > (end - pos) / unit) {
    return fail("object " + std::to_string(index) + ": runs past the object area");
  }
  h->refs *= static_cast<std::size_t>(h->count);
  h->body = pos;
  return true;
}

bool isStringType(std::uint8_t type) {
  return type == kAscii || type == kUtf16;
}

std::uint32_t unitAt(const unsigned char* p, std::size_t i) {
  return (p[2 * i] << 8) | p[2 * i + 1];
}

bool isHighSurrogate(std::uint32_t u) {
  return u >= 0xD800 && u <= 0xDBFF;
}
bool isLowSurrogate(std::uint32_t u) {
  return u >= 0xDC00 && u <= 0xDFFF;
}

bool validUtf16(const unsigned char* p, std::size_t n) {
  for (std::size_t i = 0; i < n; ++i) {
    const std::uint32_t u = unitAt(p, i);
    if (isHighSurrogate(u)) {
      if (i + 1 >= n || !isLowSurrogate(unitAt(p, i + 1))) return false;
      ++i;
    } else if (isLowSurrogate(u)) {
      return false;
    }
  }
  return true;
}

bool BinaryReader::measureLeaf(std::uint64_t index, const Header& h, Extent* e) {
  e->objects = 1;
  e->height = 0;
  switch (h.type) {
    case kData:
      e->bytes = h.count;
      break;
    case kAscii: {
      const unsigned char* p = data_ + h.body;
      for (std::size_t i = 0; i < h.count; ++i) {
        if (p[i] >= 0x80)
          return fail("object " + std::to_string(index) + ": ASCII string holds a byte above 127");
      }
      e->bytes = h.count;
      break;
    }
    case kUtf16:
      if (!validUtf16(data_ + h.body, static_cast<std::size_t>(h.count))) {
        return fail("object " + std::to_string(index) +
                    ": UTF-16 string holds an unpaired surrogate");
      }
      e->bytes = h.count * 3;  // at most three UTF-8 bytes per unit
      break;
    case kDate: {
      double d;
      std::uint64_t bits = readBigEndian(data_ + h.body, 8);
      std::memcpy(&d, &bits, 8);
      if (!std::isfinite(d)) return fail("object " + std::to_string(index) + ": date not finite");
      break;
    }
    case kInt:
      if (h.info == 4) {
        // 16 bytes, two's complement: must fit INT64_MIN..UINT64_MAX.
        const std::uint64_t high = readBigEndian(data_ + h.body, 8);
        const std::uint64_t low = readBigEndian(data_ + h.body + 8, 8);
        const bool fits = high == 0 || (high == ~std::uint64_t{0} && (low >> 63) == 1);
        if (!fits) return fail("object " + std::to_string(index) + ": integer beyond 64 bits");
      }
      break;
    default:
      break;
  }
  return true;
}

// Walks the distinct objects reachable from the top, depth first without
// recursion, so a deep or cyclic list costs no stack.
bool BinaryReader::measure() {
  std::vector<Extent> extents(static_cast<std::size_t>(objectCount_));
  struct Step {
    std::uint64_t index;
    Header h;
    std::size_t next = 0;  // next reference to visit
    Extent sum;
  };
  std::vector<Step> path;

  auto enter = [&](std::uint64_t index) -> bool {
    Header h;
    if (!header(index, &h)) return false;
    Extent& e = extents[static_cast<std::size_t>(index)];
    if (h.type != kArray && h.type != kDict) {
      if (!measureLeaf(index, h, &e)) return false;
      e.state = 2;
      return true;
    }
    if (path.size() + 1 > budget_.maxDepth) {
      return fail("containers nested deeper than " + std::to_string(budget_.maxDepth) + " levels");
    }
    e.state = 1;
    path.push_back({index, h, 0, {}});
    path.back().sum.objects = 1;
    return true;
  };

  if (!enter(topObject_)) return false;
  while (!path.empty()) {
    Step& step = path.back();
    if (step.next < step.h.refs) {
      const std::size_t i = step.next++;
      const std::uint64_t child = ref(step.h, i);
      if (child >= objectCount_) {
        return fail("object " + std::to_string(step.index) + ": reference out of range");
      }
      const bool isKey = step.h.type == kDict && i < step.h.count;
      Extent& ce = extents[static_cast<std::size_t>(child)];
      if (ce.state == 1) {
        return fail("object " + std::to_string(child) + " contains itself");
      }
      if (isKey) {
        Header kh;
        if (!header(child, &kh)) return false;
        if (!isStringType(kh.type)) {
          return fail("object " + std::to_string(step.index) + ": dictionary key is not a string");
        }
      }
      if (ce.state == 0) {
        const std::size_t depthBefore = path.size();
        if (!enter(child)) return false;
        if (path.size() > depthBefore) continue;  // a container: finish it first
      }
      Step& s = path.back();
      if (path.size() + ce.height > budget_.maxDepth) {
        return fail("containers nested deeper than " + std::to_string(budget_.maxDepth) +
                    " levels");
      }
      s.sum.objects = saturatingAdd(s.sum.objects, ce.objects);
      s.sum.bytes = saturatingAdd(s.sum.bytes, ce.bytes);
      if (ce.height + 1 > s.sum.height) s.sum.height = ce.height + 1;
      continue;
    }
    // All references measured.
    Extent& e = extents[static_cast<std::size_t>(step.index)];
    e = step.sum;
    if (e.height == 0) e.height = 1;
    e.state = 2;
    if (e.objects > budget_.maxObjects) {
      return fail("shared references expand to more than " + std::to_string(budget_.maxObjects) +
                  " objects");
    }
    if (e.bytes > budget_.maxBytes) {
      return fail("shared references expand to more than " + std::to_string(budget_.maxBytes) +
                  " bytes of strings and data");
    }
    path.pop_back();
    if (!path.empty()) {
      Step& parent = path.back();
      parent.sum.objects = saturatingAdd(parent.sum.objects, e.objects);
      parent.sum.bytes = saturatingAdd(parent.sum.bytes, e.bytes);
      if (e.height + 1 > parent.sum.height) parent.sum.height = e.height + 1;
    }
  }
  const Extent& top = extents[static_cast<std::size_t>(topObject_)];
  if (top.objects > budget_.maxObjects) return fail("too many objects");
  if (top.bytes > budget_.maxBytes) return fail("too many bytes of strings and data");
  return true;
}

void appendUtf8(std::string& out, std::uint32_t cp) {
  if (cp < 0x80) {
    out += static_cast<char>(cp);
  } else if (cp < 0x800) {
    out += static_cast<char>(0xC0 | (cp >> 6));
    out += static_cast<char>(0x80 | (cp & 0x3F));
  } else if (cp < 0x10000) {
    out += static_cast<char>(0xE0 | (cp >> 12));
    out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    out += static_cast<char>(0x80 | (cp & 0x3F));
  } else {
    out += static_cast<char>(0xF0 | (cp >> 18));
    out += static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
    out += static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    out += static_cast<char>(0x80 | (cp & 0x3F));
  }
}

// The string of a string object the measuring pass has validated.
std::string stringOf(const unsigned char* data, const Header& h) {
  const unsigned char* p = data + h.body;
  const std::size_t n = static_cast<std::size_t>(h.count);
  if (h.type == kAscii) return std::string(reinterpret_cast<const char*>(p), n);
  // UTF-16BE; first the exact UTF-8 length so the string is allocated once.
  std::size_t length = 0;
  for (std::size_t i = 0; i < n; ++i) {
    const std::uint32_t u = unitAt(p, i);
    if (isHighSurrogate(u)) {
      length += 4;
      ++i;
    } else {
      length += u < 0x80 ? 1 : u < 0x800 ? 2 : 3;
    }
  }
  std::string out;
  out.reserve(length);
  for (std::size_t i = 0; i < n; ++i) {
    std::uint32_t u = unitAt(p, i);
    if (isHighSurrogate(u)) {
      u = 0x10000 + ((u - 0xD800) << 10) + (unitAt(p, i + 1) - 0xDC00);
      ++i;
    }
    appendUtf8(out, u);
  }
  return out;
}

// Builds an object the measuring pass has accepted: every header, reference,
// key and string is known to be valid, so nothing can fail here.
Value BinaryReader::build(std::uint64_t index) {
  Header h;
  header(index, &h);
  const unsigned char* p = data_ + h.body;
  switch (h.type) {
    case kSimple:
      return Value::boolean(h.info == 0x9);
    case kInt: {
      if (h.info < 3) return Value::integer(static_cast<std::int64_t>(readBigEndian(p, h.count)));
      if (h.info == 3) return Value::integer(static_cast<std::int64_t>(readBigEndian(p, 8)));
      const std::uint64_t high = readBigEndian(p, 8);
      const std::uint64_t low = readBigEndian(p + 8, 8);
      return high == 0 ? Value::uinteger(low) : Value::integer(static_cast<std::int64_t>(low));
    }
    case kReal:
      if (h.info == 2) {
        float f;
        const std::uint32_t bits = static_cast<std::uint32_t>(readBigEndian(p, 4));
        std::memcpy(&f, &bits, 4);
        return Value::real(f);
      } else {
        double d;
        const std::uint64_t bits = readBigEndian(p, 8);
        std::memcpy(&d, &bits, 8);
        return Value::real(d);
      }
    case kDate: {
      double d;
      const std::uint64_t bits = readBigEndian(p, 8);
      std::memcpy(&d, &bits, 8);
      return Value::date(d);
    }
    case kData:
      return Value::data(std::string(reinterpret_cast<const char*>(p), h.count));
    case kAscii:
    case kUtf16:
      return Value(stringOf(data_, h));
    case kArray: {
      Array a;
      a.reserve(h.refs);
      for (std::size_t i = 0; i < h.refs; ++i) a.push_back(build(ref(h, i)));
      return Value(std::move(a));
    }
    case kDict: {
      const std::size_t n = static_cast<std::size_t>(h.count);
      std::vector<Dictionary::Entry> entries;
      entries.reserve(n);
      for (std::size_t i = 0; i < n; ++i) {
        Header kh;
        header(ref(h, i), &kh);
        entries.emplace_back(stringOf(data_, kh), build(ref(h, n + i)));
      }
      return Value(Dictionary::fromEntries(std::move(entries)));
    }
    default:
      return Value();
  }
}

std::optional<Value> BinaryReader::read(std::string* reason) {
  if (readTrailer() && measure()) return build(topObject_);
  *reason = "binary property list: " + reason_;
  return std::nullopt;
}

}  // namespace

std::optional<Value> readBinary(std::string_view bytes, const ParseBudget& budget,
                                std::string* reason) {
  BinaryReader reader(bytes, budget);
  return reader.read(reason);
}

}  // namespace kolt::plist_internal
