// The value types: creation, reading, destruction.
#include "kv/value.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <limits>
#include <new>

#include "base/hash.h"
#include "base/large_memory.h"
#include "base/utf8.h"
#include "kv/array_changes.h"
#include "kv/maker.h"

namespace tally {

void KvObject::destroy() const noexcept {
  auto* self = const_cast<KvObject*>(this);
  const bool inArena = inArena_;
  switch (type_) {
    case KvType::String:
      static_cast<KvString*>(self)->~KvString();
      break;
    case KvType::Number:
      static_cast<KvNumber*>(self)->~KvNumber();
      break;
    case KvType::Boolean:
      static_cast<KvBoolean*>(self)->~KvBoolean();
      break;
    case KvType::Date:
      static_cast<KvDate*>(self)->~KvDate();
      break;
    case KvType::Data:
      static_cast<KvData*>(self)->~KvData();
      break;
    case KvType::Array:
      static_cast<KvArray*>(self)->~KvArray();
      break;
    case KvType::Dictionary:
      static_cast<KvDictionary*>(self)->~KvDictionary();
      break;
  }
  if (inArena) {
    KvArena::release(self);
  } else {
    ::operator delete(self);
  }
}

void* kvAllocateItems(std::size_t size) { return allocateSized(size); }

void kvFreeItems(void* memory, std::size_t size) noexcept { freeSized(memory, size); }

KvRef<KvString> KvString::create(std::string_view text) {
  std::string repaired;
  if (!isValidUtf8(text)) text = repaired = repairUtf8(text);
  auto string = KvMaker::make<KvString>(nullptr, text.size() + 1);
  string->hash_ = hashBytes(text);
  string->size_ = text.size();
  auto* const bytes = reinterpret_cast<char*>(string.get() + 1);
  *std::ranges::copy(text, bytes).out = '\0';
  return string;
}

KvRef<KvNumber> KvNumber::makeInteger(KvNumberKind kind, std::int64_t bits) {
  auto* number = new KvNumber(kind);
  number->integer_ = bits;
  return KvRef<KvNumber>::adopt(number);
}

KvRef<KvNumber> KvNumber::makeReal(KvNumberKind kind, double value) {
  auto* number = new KvNumber(kind);
  number->real_ = value;
  return KvRef<KvNumber>::adopt(number);
}

KvRef<KvNumber> KvNumber::int8(std::int8_t value) { return makeInteger(KvNumberKind::Int8, value); }
KvRef<KvNumber> KvNumber::int32(std::int32_t value) {
  return makeInteger(KvNumberKind::Int32, value);
}
KvRef<KvNumber> KvNumber::int64(std::int64_t value) {
  return makeInteger(KvNumberKind::Int64, value);
}
KvRef<KvNumber> KvNumber::uint32(std::uint32_t value) {
  return makeInteger(KvNumberKind::UInt32, value);
}
KvRef<KvNumber> KvNumber::uint64(std::uint64_t value) {
  return makeInteger(KvNumberKind::UInt64, static_cast<std::int64_t>(value));
}
KvRef<KvNumber> KvNumber::float32(float value) {
  return makeReal(KvNumberKind::Float, static_cast<double>(value));
}
KvRef<KvNumber> KvNumber::float64(double value) { return makeReal(KvNumberKind::Double, value); }

namespace {

template <class T>
T truncated(double value) {
  if (std::isnan(value)) return 0;
  // Both ends as doubles: 2 to the power of the value bits is exact, the maximum itself is not.
  const double end = std::ldexp(1.0, std::numeric_limits<T>::digits);
  if (value >= end) return std::numeric_limits<T>::max();
  const double start = std::is_signed_v<T> ? -end : 0.0;
  if (value <= start) return std::numeric_limits<T>::min();
  return static_cast<T>(value);
}

}  // namespace

std::int32_t KvNumber::asInt32() const noexcept {
  return isReal() ? truncated<std::int32_t>(real_) : static_cast<std::int32_t>(integer_);
}
std::int64_t KvNumber::asInt64() const noexcept {
  return isReal() ? truncated<std::int64_t>(real_) : integer_;
}
std::uint32_t KvNumber::asUInt32() const noexcept {
  return isReal() ? truncated<std::uint32_t>(real_) : static_cast<std::uint32_t>(integer_);
}
std::uint64_t KvNumber::asUInt64() const noexcept {
  return isReal() ? truncated<std::uint64_t>(real_) : static_cast<std::uint64_t>(integer_);
}
double KvNumber::asDouble() const noexcept {
  if (isReal()) return real_;
  return kind_ == KvNumberKind::UInt64 ? static_cast<double>(static_cast<std::uint64_t>(integer_))
                                       : static_cast<double>(integer_);
}

KvRef<KvBoolean> KvBoolean::of(bool value) {
  // Never freed: these two references outlive every other.
  static KvBoolean* const values[2] = {new KvBoolean(false), new KvBoolean(true)};
  return KvRef<KvBoolean>::share(values[value ? 1 : 0]);
}

KvRef<KvDate> KvDate::create(double secondsSince1970) {
  return KvRef<KvDate>::adopt(new KvDate(secondsSince1970));
}

KvRef<KvData> KvData::create(std::span<const std::byte> bytes, KvArena* arena) {
  auto data = KvMaker::make<KvData>(arena, bytes.size(), bytes.size());
  if (!bytes.empty()) std::memcpy(static_cast<void*>(data.get() + 1), bytes.data(), bytes.size());
  return data;
}

KvRef<KvArray> KvArray::create(std::size_t capacity) {
  auto array = KvMaker::makeContainer<KvArray, KvRef<KvObject>>(nullptr, capacity);
  array->items_.reserve(capacity);
  return array;
}

KvRef<KvArray> KvArray::create(std::initializer_list<KvRef<KvObject>> items) {
  auto array = create(items.size());
  for (const auto& item : items) array->append(item);
  return array;
}

void KvArray::append(KvRef<KvObject> item) {
  if (item) items_.push_back(std::move(item));
}

void KvArray::removeAt(std::size_t index) {
  kvNoteArrayChange();
  if (index < items_.size()) items_.removeAt(index);
}

void KvArray::replaceAt(std::size_t index, KvRef<KvObject> item) {
  kvNoteArrayChange();
  if (index < items_.size() && item) items_[index] = std::move(item);
}

void KvArray::removeAt(std::span<const std::size_t> indexes) {
  kvNoteArrayChange();
  std::size_t index = 0;
  items_.removeIf([&](const auto&) {
    const bool removed = !indexes.empty() && indexes.front() == index;
    ++index;
    if (removed) indexes = indexes.subspan(1);
    return removed;
  });
}

KvRef<KvArray> KvArray::copy() const {
  auto array = create(items_.size());
  array->items_.appendWithinRoom(items_);
  return array;
}

}  // namespace tally
