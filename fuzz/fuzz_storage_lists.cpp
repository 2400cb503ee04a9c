// The validity list and the defects list: the same bytes as either.
#include "storage/lists/defects_list.h"
#include "storage/lists/validity_list.h"

#include "fuzz.h"

using namespace tally;
using fuzz::require;

FUZZ_TARGET(storage_lists)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const bool plainReasons = input.takeFlag();
  const auto bytes = input.takeRest();

  if (const auto validity = readValidityList(bytes)) {
    std::size_t values = 0;
    for (const auto& entry : *validity) values += kvCast<KvArray>(entry.value.get())->size();
    require(validity->size() <= 16 && values * 20 <= bytes.size(), "each value has a record");
  }

  std::size_t records = 0;
  const auto characteristics = KvDictionary::create({{"nand-device-desc", KvNumber::int32(7)}});
  const bool whole = readDefectsList(
      {bytes, characteristics.get(), plainReasons ? "SPXStorage" : "SPXOther"},
      [&](const KvDictionary& record) {
        require(record.size() == (records == 0 ? 2 : 8), "a record has all of its fields");
        ++records;
      });
  require(!whole || records >= 1, "a list that is whole has its summary");
  require(records <= 1 || (records - 1) * 32 + 12 <= bytes.size(), "each defect has a record");
  return 0;
}
