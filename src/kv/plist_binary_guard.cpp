#include "kv/plist_binary_guard.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <string_view>
#include <vector>

#include "base/byte_reader.h"
#include "kv/nesting.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kMagic = "bplist00";

// The trailer is the last 32 bytes; offsets in it. All integers of the format are big endian.
constexpr std::size_t kTrailerSize = 32;
constexpr std::size_t kOffsetWidthAt = 6;
constexpr std::size_t kReferenceWidthAt = 7;
constexpr std::size_t kObjectCountAt = 8;
constexpr std::size_t kRootAt = 16;
constexpr std::size_t kTableAt = 24;

// High half of an object's first byte. The low half is a count, or the power of two of a width.
enum Marker : unsigned {
  kSimple = 0x0,
  kInteger = 0x1,
  kReal = 0x2,
  kDate = 0x3,
  kData = 0x4,
  kAscii = 0x5,
  kUtf16 = 0x6,
  kUid = 0x8,
  kArray = 0xA,
  kDictionary = 0xD,
};
constexpr unsigned kFalse = 0x08;
constexpr unsigned kTrue = 0x09;
constexpr unsigned kCountFollows = 0xF;

// Seconds since 2001 of the first and last instant that has a text form (years 1 to 9999).
constexpr double kFirstDate = -63114076800.0;
constexpr double kLastDate = 252423993599.0;

// For each object the library looks at every container around it: this bounds the sum.
constexpr std::uint64_t kMaximumAncestors = 64 * kPlistMaximumObjects;

constexpr bool isContainer(unsigned marker) { return marker == kArray || marker == kDictionary; }

struct Object {
  unsigned marker = 0;
  unsigned low = 0;
  std::uint64_t count = 0;  // bytes, characters, items or entries
  std::size_t payload = 0;  // where the content starts
};

// A container on the way from the root to the object that is examined.
struct Level {
  std::uint64_t object = 0;
  std::size_t references = 0;
  std::uint64_t keys = 0;  // the first references are keys
  std::uint64_t count = 0;
  std::uint64_t next = 0;
};

class Guard {
 public:
  explicit Guard(std::span<const std::byte> document) : reader_(document) {}

  Status check() {
    if (reader_.size() < kMagic.size() + kTrailerSize) return Error{"the document is cut short"};
    if (readTrailer() && visit(root_, false)) {
      while (!levels_.empty() && step()) {
      }
    }
    if (problem_ != nullptr) return Error{problem_};
    return Done{};
  }

 private:
  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }

  bool readTrailer() {
    const std::size_t trailer = reader_.size() - kTrailerSize;
    const auto field = [&](std::size_t at, std::size_t width) {
      return reader_.readBigEndian(trailer + at, width).value_or(0);
    };
    offsetWidth_ = static_cast<std::size_t>(field(kOffsetWidthAt, 1));
    referenceWidth_ = static_cast<std::size_t>(field(kReferenceWidthAt, 1));
    objectCount_ = field(kObjectCountAt, 8);
    root_ = field(kRootAt, 8);
    const std::uint64_t table = field(kTableAt, 8);
    if (offsetWidth_ < 1 || offsetWidth_ > 8 || referenceWidth_ < 1 || referenceWidth_ > 8) {
      return fail("the trailer has an impossible width");
    }
    if (table < kMagic.size() || table > trailer ||
        objectCount_ > (trailer - table) / offsetWidth_) {
      return fail("the offset table does not lie inside the document");
    }
    table_ = static_cast<std::size_t>(table);
    open_.resize(static_cast<std::size_t>(objectCount_));
    return true;
  }

  // True when count bytes from offset lie between the header and the offset table.
  bool holds(std::uint64_t offset, std::uint64_t count) const {
    return offset >= kMagic.size() && offset <= table_ && count <= table_ - offset;
  }

  bool readObject(std::uint64_t number, Object& object) {
    if (number >= objectCount_) return fail("an object reference is out of range");
    const auto entry = table_ + static_cast<std::size_t>(number) * offsetWidth_;
    const std::uint64_t offset = reader_.readBigEndian(entry, offsetWidth_).value_or(0);
    if (!holds(offset, 1)) return fail("an object does not lie inside the document");
    const auto at = static_cast<std::size_t>(offset);
    const auto first = static_cast<unsigned>(reader_.readBigEndian(at, 1).value_or(0));
    object.marker = first >> 4;
    object.low = first & 0xF;
    object.payload = at + 1;
    object.count = object.low;
    const bool counted = isContainer(object.marker) || object.marker == kData ||
                         object.marker == kAscii || object.marker == kUtf16;
    return !counted || object.low != kCountFollows || readCount(object);
  }

  // A count of 15 or more is an integer object of its own.
  bool readCount(Object& object) {
    const auto first = static_cast<unsigned>(reader_.readBigEndian(object.payload, 1).value_or(0));
    const std::size_t width = std::size_t{1} << (first & 0xF);
    if (first >> 4 != kInteger || width > 8 || !holds(object.payload + 1, width)) {
      return fail("a length is not readable");
    }
    object.count = reader_.readBigEndian(object.payload + 1, width).value_or(0);
    object.payload += 1 + width;
    return true;
  }

  bool checkExtent(const Object& object, std::uint64_t unit) {
    return (object.count <= table_ / unit && holds(object.payload, object.count * unit)) ||
           fail("a length exceeds the document");
  }

  bool visit(std::uint64_t number, bool asKey) {
    if (++objects_ > kPlistMaximumObjects) return fail("it expands to more than 4000000 values");
    ancestors_ += levels_.size();
    if (ancestors_ > kMaximumAncestors) return fail("too many values are nested deeply");
    Object object;
    if (!readObject(number, object)) return false;
    if (asKey && object.marker != kAscii && object.marker != kUtf16) {
      return fail("a dictionary key is not a string");
    }
    return isContainer(object.marker) ? enter(number, object) : checkLeaf(object);
  }

  bool enter(std::uint64_t number, const Object& object) {
    const std::uint64_t parts = object.marker == kDictionary ? 2 : 1;
    if (!checkExtent(object, parts * referenceWidth_)) return false;
    const auto index = static_cast<std::size_t>(number);
    if (open_[index]) return fail("a container contains itself");
    if (levels_.size() == static_cast<std::size_t>(kMaximumDepth)) {
      return fail(kTooDeep);
    }
    open_[index] = true;
    const std::uint64_t keys = object.marker == kDictionary ? object.count : 0;
    levels_.push_back({number, object.payload, keys, object.count * parts, 0});
    return true;
  }

  // Examines the next part of the innermost open container, or closes it.
  bool step() {
    Level& level = levels_.back();
    if (level.next == level.count) {
      open_[static_cast<std::size_t>(level.object)] = false;
      levels_.pop_back();
      return true;
    }
    const std::size_t at =
        level.references + static_cast<std::size_t>(level.next) * referenceWidth_;
    const bool asKey = level.next < level.keys;
    ++level.next;
    return visit(reader_.readBigEndian(at, referenceWidth_).value_or(UINT64_MAX), asKey);
  }

  bool checkLeaf(const Object& object) {
    const std::size_t width = std::size_t{1} << object.low;
    switch (object.marker) {
      case kSimple:
        return object.low == kFalse || object.low == kTrue || fail("an object has no known type");
      case kInteger:
        return checkInteger(object, width);
      case kReal:
        if (width != 4 && width != 8) return fail("a real number has an impossible width");
        return holds(object.payload, width) || fail("a length exceeds the document");
      case kDate:
        return checkDate(object, width);
      case kData:
        return checkExtent(object, 1) && expand(object.count);
      case kAscii:
        return checkExtent(object, 1) && expand(object.count) && checkAscii(object);
      case kUtf16:
        return checkExtent(object, 2) && expand(object.count * 2) && checkUtf16(object);
      case kUid:
        return fail("archives of objects are not accepted");
      default:
        return fail("an object has no known type");
    }
  }

  // An object that is referred to often is repeated in memory.
  bool expand(std::uint64_t bytes) {
    expanded_ += bytes;
    return expanded_ <= kPlistMaximumBytes || fail("it expands to more than 64 MiB");
  }

  bool checkInteger(const Object& object, std::size_t width) {
    if (width > 16) return fail("an integer has an impossible width");
    if (!holds(object.payload, width)) return fail("a length exceeds the document");
    // The widest form is that of unsigned integers past the signed ones; its upper half is empty.
    return width < 16 || reader_.readBigEndian(object.payload, 8) == 0 ||
           fail("an integer does not fit in 64 bits");
  }

  bool checkDate(const Object& object, std::size_t width) {
    if (width != 8) return fail("a date has an impossible width");
    if (!holds(object.payload, width)) return fail("a length exceeds the document");
    const auto bits = reader_.readBigEndian(object.payload, width).value_or(0);
    const auto seconds = std::bit_cast<double>(bits);
    return (seconds >= kFirstDate && seconds <= kLastDate) || fail("a date is out of range");
  }

  // The library would cut a text at its first zero.
  bool checkAscii(const Object& object) {
    for (std::size_t i = 0; i < object.count; ++i) {
      if (reader_.readBigEndian(object.payload + i, 1) == 0) {
        return fail("a string contains a zero character");
      }
    }
    return true;
  }

  bool checkUtf16(const Object& object) {
    bool halfPair = false;
    for (std::size_t i = 0; i < object.count; ++i) {
      const auto unit = reader_.readBigEndian(object.payload + 2 * i, 2).value_or(0);
      if (unit == 0) return fail("a string contains a zero character");
      const bool low = unit >= 0xDC00 && unit <= 0xDFFF;
      if (low != halfPair) return fail("a string is not well formed");
      halfPair = unit >= 0xD800 && unit <= 0xDBFF;
    }
    return !halfPair || fail("a string is not well formed");
  }

  const ByteReader reader_;
  const char* problem_ = nullptr;
  std::size_t offsetWidth_ = 0, referenceWidth_ = 0;
  std::uint64_t objectCount_ = 0, root_ = 0;
  std::size_t table_ = 0;
  std::uint64_t objects_ = 0, expanded_ = 0, ancestors_ = 0;
  std::vector<Level> levels_;
  std::vector<bool> open_;
};

}  // namespace

bool isBinaryPlist(std::span<const std::byte> document) {
  return document.size() >= kMagic.size() &&
         std::equal(kMagic.begin(), kMagic.end(), document.begin(),
                    [](char a, std::byte b) { return static_cast<std::byte>(a) == b; });
}

Status checkBinaryPlist(std::span<const std::byte> document) { return Guard(document).check(); }

}  // namespace tally
