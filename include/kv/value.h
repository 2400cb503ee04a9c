// The property value model: dynamically typed, reference-counted values shared by reference.
#pragma once

#include <algorithm>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#if __has_include(<ext/atomicity.h>)
#include <ext/atomicity.h>
#endif

#include "kv/arena.h"
#include "kv/export.h"
#include "kv/items.h"
#include "kv/ref.h"

namespace tally {

enum class KvType : std::uint8_t { String, Number, Boolean, Date, Data, Array, Dictionary };

// True while the process has had one thread only, so that counting references needs no locked
// instruction, which would be half the cost of copying a small dictionary.
inline bool kvSingleThreaded() noexcept {
#if __has_include(<ext/atomicity.h>)
  return __gnu_cxx::__is_single_threaded();
#else
  return false;
#endif
}

// Base of all values. Created only through the create functions of the concrete types, which
// return an owning KvRef. Reference counting is safe from any thread; changing a container is not.
class TALLY_API KvObject {
 public:
  KvObject(const KvObject&) = delete;
  KvObject& operator=(const KvObject&) = delete;

  KvType type() const noexcept { return type_; }
  void retain() const noexcept {
    if (kvSingleThreaded()) {
      references_.store(references_.load(std::memory_order_relaxed) + 1, std::memory_order_relaxed);
    } else {
      references_.fetch_add(1, std::memory_order_relaxed);
    }
  }
  void release() const noexcept {
    if (kvSingleThreaded()) {
      const std::uint32_t left = references_.load(std::memory_order_relaxed) - 1;
      references_.store(left, std::memory_order_relaxed);
      if (left == 0) destroy();
    } else if (references_.fetch_sub(1, std::memory_order_acq_rel) == 1) {
      destroy();
    }
  }

 protected:
  explicit KvObject(KvType type) noexcept : type_(type) {}
  ~KvObject() = default;

 private:
  void destroy() const noexcept;
  mutable std::atomic<std::uint32_t> references_{1};
  const KvType type_;
  bool inArena_ = false;
  friend class KvMaker;
};

// The value as a T, or null when it is null or of another type.
template <class T>
T* kvCast(KvObject* object) noexcept {
  return object != nullptr && object->type() == T::kType ? static_cast<T*>(object) : nullptr;
}
template <class T>
const T* kvCast(const KvObject* object) noexcept {
  return object != nullptr && object->type() == T::kType ? static_cast<const T*>(object) : nullptr;
}

// Immutable text. Always valid UTF-8: bytes that are not become U+FFFD when it is created.
class TALLY_API KvString final : public KvObject {
 public:
  static constexpr KvType kType = KvType::String;
  static KvRef<KvString> create(std::string_view text);
  // A zero byte follows it, so that C can read it; there may be others in it.
  std::string_view view() const noexcept {
    return {reinterpret_cast<const char*>(this + 1), size_};  // the text follows the object
  }

 private:
  friend class KvObject;
  friend class KvDictionary;
  friend class KvMaker;
  KvString() noexcept : KvObject(kType) {}
  std::uint32_t hash_ = 0;
  std::size_t size_ = 0;
};

// The width and signedness that a number was created with; kept through copies and documents.
enum class KvNumberKind : std::uint8_t { Int8, Int32, Int64, UInt32, UInt64, Float, Double };

class TALLY_API KvNumber final : public KvObject {
 public:
  static constexpr KvType kType = KvType::Number;
  static KvRef<KvNumber> int8(std::int8_t value);
  static KvRef<KvNumber> int32(std::int32_t value);
  static KvRef<KvNumber> int64(std::int64_t value);
  static KvRef<KvNumber> uint32(std::uint32_t value);
  static KvRef<KvNumber> uint64(std::uint64_t value);
  static KvRef<KvNumber> float32(float value);
  static KvRef<KvNumber> float64(double value);

  KvNumberKind kind() const noexcept { return kind_; }
  bool isReal() const noexcept { return kind_ >= KvNumberKind::Float; }
  bool isUnsigned() const noexcept {
    return kind_ == KvNumberKind::UInt32 || kind_ == KvNumberKind::UInt64;
  }
  // Integers keep their low bits when they are read in a narrower type; reals are truncated
  // toward zero and saturate at the type's ends, and a NaN reads as 0.
  std::int32_t asInt32() const noexcept;
  std::int64_t asInt64() const noexcept;
  std::uint32_t asUInt32() const noexcept;
  std::uint64_t asUInt64() const noexcept;
  double asDouble() const noexcept;

 private:
  friend class KvObject;
  explicit KvNumber(KvNumberKind kind) noexcept : KvObject(kType), kind_(kind) {}
  static KvRef<KvNumber> makeInteger(KvNumberKind kind, std::int64_t bits);
  static KvRef<KvNumber> makeReal(KvNumberKind kind, double value);
  const KvNumberKind kind_;
  union {
    std::int64_t integer_;  // UInt64 keeps its bits here
    double real_;
  };
};

class TALLY_API KvBoolean final : public KvObject {
 public:
  static constexpr KvType kType = KvType::Boolean;
  // One of the two shared values.
  static KvRef<KvBoolean> of(bool value);
  bool value() const noexcept { return value_; }

 private:
  friend class KvObject;
  explicit KvBoolean(bool value) noexcept : KvObject(kType), value_(value) {}
  const bool value_;
};

class TALLY_API KvDate final : public KvObject {
 public:
  static constexpr KvType kType = KvType::Date;
  // Seconds since 1970-01-01 00:00 UTC.
  static KvRef<KvDate> create(double secondsSince1970);
  double secondsSince1970() const noexcept { return seconds_; }

 private:
  friend class KvObject;
  explicit KvDate(double seconds) noexcept : KvObject(kType), seconds_(seconds) {}
  const double seconds_;
};

class TALLY_API KvData final : public KvObject {
 public:
  static constexpr KvType kType = KvType::Data;
  static KvRef<KvData> create(std::span<const std::byte> bytes, KvArena* arena = nullptr);
  std::span<const std::byte> bytes() const noexcept {
    return {reinterpret_cast<const std::byte*>(this + 1), size_};  // they follow the object
  }

 private:
  friend class KvObject;
  friend class KvMaker;
  explicit KvData(std::size_t size) noexcept : KvObject(kType), size_(size) {}
  const std::size_t size_;
};

class TALLY_API KvArray final : public KvObject {
 public:
  static constexpr KvType kType = KvType::Array;
  static KvRef<KvArray> create(std::size_t capacity = 0);
  static KvRef<KvArray> create(std::initializer_list<KvRef<KvObject>> items);

  std::size_t size() const noexcept { return items_.size(); }
  bool empty() const noexcept { return items_.empty(); }
  // Borrowed; null past the end.
  KvObject* get(std::size_t index) const noexcept {
    return index < items_.size() ? items_[index].get() : nullptr;
  }
  template <class T>
  T* getAs(std::size_t index) const noexcept {
    return kvCast<T>(get(index));
  }
  // A null item is not added: an array never holds an absent value.
  void append(KvRef<KvObject> item);
  // Puts an item in the place of another; an index past the end or a null item changes nothing.
  void replaceAt(std::size_t index, KvRef<KvObject> item);
  void removeAt(std::size_t index);
  // Removes many at once, in one pass. REQUIRES: the indexes ascend; those past the end are
  // ignored.
  void removeAt(std::span<const std::size_t> indexes);
  auto begin() const noexcept { return items_.begin(); }
  auto end() const noexcept { return items_.end(); }
  // A new array of the same items.
  KvRef<KvArray> copy() const;

 private:
  friend class KvObject;
  friend class KvMaker;
  explicit KvArray(std::uint32_t capacity) noexcept : KvObject(kType), items_(this + 1, capacity) {}
  KvItems<KvRef<KvObject>> items_;
};

// Where the entries of a dictionary come from that are made when they are first asked for.
struct KvPending {
  const class KvDictionarySource* source;
  std::uint32_t row;    // which of the source's dictionaries it is
  std::uint32_t marks;  // the source's notes about it
};

// String keys to values, enumerated in the order of first insertion. A small dictionary is a flat
// vector; a larger one carries a hash index. The entries of one of very many may be made only when
// they are asked for, so reading may allocate, and one thread at a time may do it.
class TALLY_API KvDictionary final : public KvObject {
 public:
  static constexpr KvType kType = KvType::Dictionary;
  struct Entry {
    KvRef<KvString> key;
    KvRef<KvObject> value;
  };

  static KvRef<KvDictionary> create(std::size_t capacity = 0, KvArena* arena = nullptr);
  static KvRef<KvDictionary> create(
      std::initializer_list<std::pair<std::string_view, KvRef<KvObject>>> entries);

  std::size_t size() const { return entries().size(); }
  bool empty() const { return entries().empty(); }
  bool contains(std::string_view key) const { return get(key) != nullptr; }
  // Borrowed; null when the key is missing. The second is faster where the dictionaries' own keys
  // are the same object.
  KvObject* get(std::string_view key) const;
  KvObject* get(const KvString& key) const;
  // Null when the key is missing or its value is of another type.
  template <class T>
  T* getAs(std::string_view key) const {
    return kvCast<T>(get(key));
  }
  template <class T>
  T* getAs(const KvString& key) const {
    return kvCast<T>(get(key));
  }
  // Empty when the key is missing or its value is not a number (string, boolean).
  std::optional<std::int64_t> getInt64(std::string_view key) const;
  std::optional<double> getDouble(std::string_view key) const;
  std::optional<bool> getBool(std::string_view key) const;
  std::optional<std::string_view> getString(std::string_view key) const;

  // Replaces in place or adds at the end; a null value removes the key.
  void set(std::string_view key, KvRef<KvObject> value);
  // The same with a key object that is shared instead of copied.
  void set(const KvRef<KvString>& key, KvRef<KvObject> value);
  // Keeps the order of the others; costs the length of the dictionary.
  bool remove(std::string_view key);
  // Removes every entry of which the predicate is true, in one pass.
  template <class Predicate>
  void removeIf(Predicate predicate) {
    if (entries().removeIf(predicate) != 0) rebuildIndex();
  }
  // Sets every entry of other in this dictionary.
  void merge(const KvDictionary& other);
  auto begin() const { return entries().begin(); }
  auto end() const { return entries().end(); }
  // A new dictionary of the same keys and values, with capacity for some more.
  KvRef<KvDictionary> copy(std::size_t more = 0, KvArena* arena = nullptr) const;

 private:
  friend class KvObject;
  friend class KvMaker;
  friend class KvPendingAccess;
  explicit KvDictionary(std::uint32_t capacity) noexcept;
  // Takes over a reference to the source.
  explicit KvDictionary(const KvPending* pending) noexcept;
  ~KvDictionary();
  std::size_t find(std::string_view key, std::uint32_t hash) const;
  std::size_t find(std::string_view key) const;
  std::size_t find(const KvString& key) const;
  void append(KvRef<KvString> key, KvRef<KvObject> value);
  void rebuildIndex();
  KvItems<Entry>& entries() const {
    if (isPending_) fill();
    return entries_;
  }
  void fill() const;
  mutable bool isPending_ = false;
  union {
    mutable KvItems<Entry> entries_;
    mutable KvPending pending_;  // instead of entries
  };
  std::unique_ptr<class HashIndex> index_;  // null while the dictionary is small
};

// Same type and same content, at any depth to 512. Numbers compare by exact value, whatever their
// kind.
TALLY_API bool kvEqual(const KvObject* a, const KvObject* b);
// The same, except that an integer never equals a real, nor 0.0 equals -0.0, and that a NaN equals
// a NaN: what a property list can tell apart.
TALLY_API bool kvIdentical(const KvObject* a, const KvObject* b);

// The one text form of a value, as messages and labels show it: a string is itself, integers are
// decimal, reals the shortest text that reads back equal ("inf", "-inf", "nan"), booleans "1" and
// "0", containers indented over several lines. Null gives "(null)".
TALLY_API std::string kvText(const KvObject* value);

}  // namespace tally
