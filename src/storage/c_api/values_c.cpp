// Names and values for C.
#include "storage/storage_c.h"

#include <algorithm>

#include "base/utf8.h"
#include "storage/c_api/handles.h"

namespace tally {
namespace {

const tallystorage_values::Entry* entryOfValues(const tallystorage_values* values,
                                                std::size_t index) noexcept {
  if (cHandle(values) == nullptr) {
    cBadArgument("not a set of values");
    return nullptr;
  }
  if (index < values->list.size()) return &values->list[index];
  cBadArgument("there is no value of that index");
  return nullptr;
}

int otherKind() { return cFailure(TALLYSTORAGE_NO_VALUE, "the value is of another kind"); }

// Stores what take makes of the value's number; take returns false when the type cannot hold it.
template <class T, class Take>
int storeNumber(const tallystorage_values* values, std::size_t index, T* out, Take take) noexcept {
  if (!cClear(out)) return cBadArgument("the value's output is NULL");
  const auto* const entry = entryOfValues(values, index);
  if (entry == nullptr) return kCBadArgument;
  const auto* const number = kvCast<KvNumber>(entry->value.get());
  return number != nullptr && take(*number, out) ? kCOk : otherKind();
}

// Whether the number is a whole one whose 64 bits mean the same with and without a sign.
bool isBelowSign(const KvNumber& number) { return number.asInt64() >= 0; }

}  // namespace
}  // namespace tally

using namespace tally;

size_t tallystorage_value_count(const tallystorage_values* values) {
  return cHandle(values) != nullptr ? values->list.size() : 0;
}

int tallystorage_find(const tallystorage_values* values, const char* name, size_t* index) {
  if (!cClear(index)) return cBadArgument("the index's output is NULL");
  if (cHandle(values) == nullptr) return cBadArgument("not a set of values");
  if (name == nullptr || !isValidUtf8(name)) return cBadArgument("the name is NULL or not UTF-8");
  const auto found = std::ranges::find(values->list, std::string_view(name),
                                       [](const auto& entry) { return entry.name->view(); });
  if (found == values->list.end()) return cFailure(kCNotFound, "there is no value of that name");
  *index = static_cast<std::size_t>(found - values->list.begin());
  return kCOk;
}

int tallystorage_value_name(const tallystorage_values* values, size_t index, const char** name) {
  if (!cClear(name, "")) return cBadArgument("the name's output is NULL");
  const auto* const entry = entryOfValues(values, index);
  if (entry == nullptr) return kCBadArgument;
  *name = entry->name->view().data();
  return kCOk;
}

int tallystorage_value_kind(const tallystorage_values* values, size_t index, int* kind) {
  if (!cClear(kind)) return cBadArgument("the kind's output is NULL");
  const auto* const entry = entryOfValues(values, index);
  if (entry == nullptr) return kCBadArgument;
  const auto* const number = kvCast<KvNumber>(entry->value.get());
  *kind = number == nullptr      ? TALLYSTORAGE_TEXT
          : number->isReal()     ? TALLYSTORAGE_DOUBLE
          : number->isUnsigned() ? TALLYSTORAGE_UINT64
                                 : TALLYSTORAGE_INT64;
  return kCOk;
}

int tallystorage_value_int64(const tallystorage_values* values, size_t index, int64_t* value) {
  return storeNumber(values, index, value, [](const KvNumber& number, int64_t* out) {
    if (number.isReal() || (number.isUnsigned() && !isBelowSign(number))) return false;
    *out = number.asInt64();
    return true;
  });
}

int tallystorage_value_uint64(const tallystorage_values* values, size_t index, uint64_t* value) {
  return storeNumber(values, index, value, [](const KvNumber& number, uint64_t* out) {
    if (number.isReal() || (!number.isUnsigned() && !isBelowSign(number))) return false;
    *out = number.asUInt64();
    return true;
  });
}

int tallystorage_value_double(const tallystorage_values* values, size_t index, double* value) {
  return storeNumber(values, index, value, [](const KvNumber& number, double* out) {
    *out = number.asDouble();
    return true;
  });
}

int tallystorage_value_text(const tallystorage_values* values, size_t index, const char** text) {
  if (!cClear(text, "")) return cBadArgument("the text's output is NULL");
  const auto* const entry = entryOfValues(values, index);
  if (entry == nullptr) return kCBadArgument;
  const auto* const found = kvCast<KvString>(entry->value.get());
  if (found == nullptr) return otherKind();
  *text = found->view().data();
  return kCOk;
}
