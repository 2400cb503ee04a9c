#include "kv/plist_binary_reader.h"

#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>
#include <span>
#include <utility>
#include <vector>

#include "base/byte_reader.h"
#include "base/utf8.h"
#include "kv/common_values.h"
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

// Dates are seconds since 2001. The first and the last instant that has a text form (years 1 to
// 9999).
constexpr double kSecondsFrom1970To2001 = 978307200;
constexpr double kFirstDate = -63114076800.0;
constexpr double kLastDate = 252423993599.0;

constexpr bool isContainer(unsigned marker) { return marker == kArray || marker == kDictionary; }

struct Object {
  unsigned marker = 0;
  unsigned low = 0;
  std::uint64_t count = 0;  // bytes, characters, items or entries
  std::size_t payload = 0;  // where the content starts
};

// A container on the way from the root to the object that is read; one of the first two is set.
struct Level {
  KvRef<KvArray> array;
  KvRef<KvDictionary> dictionary;
  std::uint64_t object = 0;
  std::size_t references = 0;  // where they start; those of all keys precede those of the values
  std::uint64_t count = 0;     // of items or entries
  std::uint64_t next = 0;
};

class BinaryReader {
 public:
  explicit BinaryReader(std::span<const std::byte> document)
      : document_(document), reader_(document) {}

  Result<KvRef<KvObject>> read() {
    if (reader_.size() < kMagic.size() + kTrailerSize) return Error{"the document is cut short"};
    KvRef<KvObject> root;
    if (!readTrailer() || !readValue(root_, root)) return Error{problem_};
    while (!levels_.empty()) {
      if (!step()) return Error{problem_};
    }
    return root;
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

  // Gives the value of the object; a container is still empty and becomes the innermost level.
  bool readValue(std::uint64_t number, KvRef<KvObject>& value) {
    Object object;
    if (!countObject() || !readObject(number, object)) return false;
    if (isContainer(object.marker)) return enter(number, object, value);
    return readLeaf(object, value);
  }

  bool readKey(std::uint64_t number, KvRef<KvString>& key) {
    Object object;
    if (!countObject() || !readObject(number, object)) return false;
    if (object.marker != kAscii && object.marker != kUtf16) {
      return fail("a dictionary key is not a string");
    }
    KvRef<KvObject> value;
    if (!readLeaf(object, value)) return false;
    key = KvRef<KvString>::share(kvCast<KvString>(value.get()));
    return true;
  }

  bool countObject() {
    return ++objects_ <= kPlistMaximumObjects || fail("it expands to more than 4000000 values");
  }

  bool enter(std::uint64_t number, const Object& object, KvRef<KvObject>& value) {
    const bool isDictionary = object.marker == kDictionary;
    if (!checkExtent(object, (isDictionary ? 2 : 1) * referenceWidth_)) return false;
    const auto index = static_cast<std::size_t>(number);
    if (open_[index]) return fail("a container contains itself");
    if (levels_.size() == static_cast<std::size_t>(kMaximumDepth)) return fail(kTooDeep);
    open_[index] = true;
    Level level{nullptr, nullptr, number, object.payload, object.count, 0};
    if (isDictionary) {
      value = level.dictionary = KvDictionary::create();
    } else {
      value = level.array = KvArray::create();
    }
    levels_.push_back(std::move(level));
    return true;
  }

  std::uint64_t referenceOf(const Level& level, std::uint64_t index) const {
    const std::size_t at = level.references + static_cast<std::size_t>(index) * referenceWidth_;
    return reader_.readBigEndian(at, referenceWidth_).value_or(UINT64_MAX);
  }

  // Reads the next part of the innermost open container, or closes it.
  bool step() {
    Level& level = levels_.back();
    if (level.next == level.count) {
      open_[static_cast<std::size_t>(level.object)] = false;
      levels_.pop_back();
      return true;
    }
    const std::uint64_t index = level.next++;
    KvRef<KvObject> value;
    if (level.array) {
      const auto array = level.array;  // the level may move
      if (!readValue(referenceOf(level, index), value)) return false;
      array->append(std::move(value));
      return true;
    }
    const auto dictionary = level.dictionary;
    KvRef<KvString> key;
    if (!readKey(referenceOf(level, index), key)) return false;
    if (!readValue(referenceOf(level, level.count + index), value)) return false;
    dictionary->set(key, std::move(value));
    return true;
  }

  bool readLeaf(const Object& object, KvRef<KvObject>& value) {
    switch (object.marker) {
      case kSimple:
        if (object.low != kFalse && object.low != kTrue) break;
        value = KvBoolean::of(object.low == kTrue);
        return true;
      case kInteger:
        return makeInteger(object, value);
      case kReal:
        return makeReal(object, value);
      case kDate:
        return makeDate(object, value);
      case kData:
        return makeData(object, value);
      case kAscii:
      case kUtf16:
        return makeString(object, value);
      case kUid:
        return fail("archives of objects are not accepted");
    }
    return fail("an object has no known type");
  }

  // REQUIRES: the extent has been checked.
  std::span<const std::byte> bytesOf(const Object& object, std::size_t unit) const {
    return document_.subspan(object.payload, static_cast<std::size_t>(object.count) * unit);
  }

  // An object that is referred to often is repeated in memory.
  bool expand(std::uint64_t bytes) {
    expanded_ += bytes;
    return expanded_ <= kPlistMaximumBytes || fail("it expands to more than 64 MiB");
  }

  // The number in an object of so many bytes that is a power of two.
  bool readNumber(const Object& object, std::size_t width, std::uint64_t& bits) {
    if (!holds(object.payload, width)) return fail("a length exceeds the document");
    bits = reader_.readBigEndian(object.payload, width).value_or(0);
    return true;
  }

  bool makeInteger(const Object& object, KvRef<KvObject>& value) {
    const std::size_t width = std::size_t{1} << object.low;
    if (width > 16) return fail("an integer has an impossible width");
    if (!holds(object.payload, width)) return fail("a length exceeds the document");
    // The widest form is that of unsigned integers past the signed ones; its upper half is empty.
    // Those of eight bytes are signed, the narrower ones are not.
    const bool isWidest = width == 16;
    if (isWidest && reader_.readBigEndian(object.payload, 8) != 0) {
      return fail("an integer does not fit in 64 bits");
    }
    const std::size_t skipped = isWidest ? 8 : 0;
    const std::uint64_t bits =
        reader_.readBigEndian(object.payload + skipped, width - skipped).value_or(0);
    constexpr auto kLargest = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
    if (bits < CommonValues::kSmallIntegers) {
      value = common_.smallInteger(static_cast<std::size_t>(bits));
    } else if (isWidest && bits > kLargest) {
      value = KvNumber::uint64(bits);
    } else {
      value = KvNumber::int64(static_cast<std::int64_t>(bits));
    }
    return true;
  }

  bool makeReal(const Object& object, KvRef<KvObject>& value) {
    const std::size_t width = std::size_t{1} << object.low;
    std::uint64_t bits = 0;
    if (width != 4 && width != 8) return fail("a real number has an impossible width");
    if (!readNumber(object, width, bits)) return false;
    value = KvNumber::float64(
        width == 8 ? std::bit_cast<double>(bits)
                   : static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(bits))));
    return true;
  }

  bool makeDate(const Object& object, KvRef<KvObject>& value) {
    const std::size_t width = std::size_t{1} << object.low;
    std::uint64_t bits = 0;
    if (width != 8) return fail("a date has an impossible width");
    if (!readNumber(object, width, bits)) return false;
    const auto seconds = std::bit_cast<double>(bits);
    if (!(seconds >= kFirstDate && seconds <= kLastDate)) return fail("a date is out of range");
    value = KvDate::create(kSecondsFrom1970To2001 + std::trunc(seconds));
    return true;
  }

  bool makeData(const Object& object, KvRef<KvObject>& value) {
    if (!checkExtent(object, 1) || !expand(object.count)) return false;
    value = KvData::create(bytesOf(object, 1));
    return true;
  }

  bool makeString(const Object& object, KvRef<KvObject>& value) {
    const std::size_t unit = object.marker == kUtf16 ? 2 : 1;
    if (!checkExtent(object, unit) || !expand(object.count * unit)) return false;
    const auto bytes = bytesOf(object, unit);
    std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    std::string converted;
    if (object.marker == kUtf16) {
      if (!appendUtf16(converted, bytes, std::endian::big)) {
        return fail("a string is not well formed");
      }
      text = converted;
    }
    if (text.find('\0') != text.npos) return fail("a string contains a zero character");
    value = common_.string(text);
    return true;
  }

  const std::span<const std::byte> document_;
  const ByteReader reader_;
  const char* problem_ = nullptr;
  std::size_t offsetWidth_ = 0, referenceWidth_ = 0;
  std::uint64_t objectCount_ = 0, root_ = 0;
  std::size_t table_ = 0;
  std::uint64_t objects_ = 0, expanded_ = 0;
  std::vector<Level> levels_;
  std::vector<bool> open_;  // by object: on the way to the one that is read
  CommonValues common_;
};

}  // namespace

bool isBinaryPlist(std::string_view document) { return document.starts_with(kMagic); }

Result<KvRef<KvObject>> readBinaryPlist(std::string_view document) {
  return BinaryReader(std::as_bytes(std::span(document))).read();
}

}  // namespace tally
