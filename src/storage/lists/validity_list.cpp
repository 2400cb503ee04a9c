#include "storage/lists/validity_list.h"

#include <array>
#include <cstdio>
#include <string>

#include "base/byte_reader.h"
#include "base/number_text.h"
#include "storage/storage_log.h"

namespace tally {
namespace {

// 32-bit words, little endian: the number of records, the number of entries before them, an unused
// one; then the entries, then the records, which begin with a list index and a value.
constexpr std::size_t kEntryCountOffset = 4, kHeaderBytes = 12;
constexpr std::uint64_t kEntryBytes = 8, kRecordBytes = 20;
constexpr std::size_t kValueOffset = 4;
constexpr std::size_t kLists = 16;

}  // namespace

KvRef<KvDictionary> readValidityList(std::span<const std::byte> list) {
  const ByteReader words(list);
  const std::uint64_t records = words.read<std::uint32_t>(0).value_or(0);
  const std::uint64_t entries = words.read<std::uint32_t>(kEntryCountOffset).value_or(0);
  const std::uint64_t first = kHeaderBytes + entries * kEntryBytes;
  if (records == 0 || first + records * kRecordBytes > list.size()) {
    std::fputs("data cannot be parsed", stderr);
    return nullptr;
  }
  std::array<KvRef<KvArray>, kLists> values;
  for (std::uint64_t i = 0; i < records; ++i) {
    const std::size_t at = static_cast<std::size_t>(first + i * kRecordBytes);
    const std::uint32_t index = words.read<std::uint32_t>(at).value_or(kLists);
    if (index >= kLists) continue;
    if (!values[index]) values[index] = KvArray::create();
    values[index]->append(KvNumber::int32(words.read<std::int32_t>(at + kValueOffset).value_or(0)));
  }
  auto validity = KvDictionary::create();
  for (std::size_t index = 0; index < kLists; ++index) {
    if (!values[index]) continue;
    std::string key = "ValidityList[";
    appendUInt64(key, index);
    key += ']';
    validity->set(key, std::move(values[index]));
  }
  return validity;
}

KvRef<KvDictionary> storageStatusOf(const KvDictionary& validity) {
  auto status = KvDictionary::create();
  status->set("IntermediateWamp", KvNumber::float64(gCurrentSysWamp));
  status->set("UserWamp", KvNumber::float64(gCurrentUserWamp));
  DumpNANDInfo(*status);
  status->merge(validity);
  return status;
}

}  // namespace tally
