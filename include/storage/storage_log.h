// The daily dump of the storage driver's lists: structured-data records for each flash bus and each
// defect, and now and then a storage-status log.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "kv/value.h"
#include "storage/nand_info.h"  // gCurrentUserWamp, gCurrentSysWamp

namespace tally {

// Not 0: the validity list is collected at any write amplification.
TALLY_API extern std::uint8_t gForceCollectionSet;
// Whether the last dump wanted the validity list.
TALLY_API extern std::uint8_t gNeedValidityList;

// Measures the write amplification, decides by it whether the validity list is wanted, fetches the
// validity, telemetry and defects lists and hands each to its handler. The flag is passed on to the
// driver. True when every list that was handled succeeded; each failure is a line on standard
// error.
TALLY_API KvRef<KvBoolean> DumpStorageStructuredLog(const KvBoolean& requestFlag);

// Adds every entry of a fresh NAND info dictionary, without versions and demo mode, to the target;
// nothing when the figures cannot be fetched.
TALLY_API void DumpNANDInfo(KvDictionary& target);
// Its step for one entry: stores the value under the key.
TALLY_API void CopyDictionary(const KvRef<KvString>& key, const KvRef<KvObject>& value,
                              KvDictionary& target);

// Submits the values as a short text log, unless one was submitted in the last seven days. Null
// values: nothing is written.
TALLY_API void NLW_WriteLog(std::string_view logTypeCode, const KvDictionary* values);

// The key that crash reports of this device carry, or "error".
TALLY_API std::string GetFaultDeskKey();

}  // namespace tally
