// The validity list: values of up to sixteen lists.
#pragma once

#include <cstddef>
#include <span>

#include "kv/value.h"

namespace tally {

// The values of the records, by list index: "ValidityList[%d]" to an array, for each index from 0
// to 15 that occurs. Null, after a line on standard error, when records that the list announces are
// missing.
KvRef<KvDictionary> readValidityList(std::span<const std::byte> list);

// The storage-status dictionary: the write amplification last measured, the NAND info dictionary,
// and the validity list.
KvRef<KvDictionary> storageStatusOf(const KvDictionary& validity);

}  // namespace tally
