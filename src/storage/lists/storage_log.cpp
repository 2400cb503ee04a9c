// The daily dump: from the write amplification to the handlers of the lists.
#include "storage/lists/storage_log.h"

#include <cstdio>

#include "platform/platform.h"
#include "storage/controller/statistics_fetch.h"
#include "storage/lists/defects_list.h"
#include "storage/lists/storage_lists.h"
#include "storage/lists/telemetry_list.h"
#include "storage/lists/validity_list.h"
#include "storage/lists/write_amplification.h"
#include "storage/storage_log.h"

namespace tally {

std::uint8_t gForceCollectionSet = 0;
std::uint8_t gNeedValidityList = 0;

namespace {

constexpr std::string_view kStorageStatusTypeCode = "165";

bool handleValidityList(const StorageList& list) {
  if (gNeedValidityList == 0) return true;
  const auto validity = readValidityList(list.bytes);
  if (!validity) return false;
  NLW_WriteLog(kStorageStatusTypeCode, storageStatusOf(*validity).get());
  return true;
}

bool handleDefectsList(const StorageList& list) { return readDefectsList(list, logStorageRecord); }

}  // namespace

bool dumpStorageLists(bool requestFlag, std::FILE* notices) {
  const WriteAmplification measured = measureWriteAmplification();
  gCurrentSysWamp = measured.intermediate;
  gCurrentUserWamp = measured.user;
  gNeedValidityList =
      gForceCollectionSet != 0 || measured.user > writeAmplificationThreshold() ? 1 : 0;

  const auto handleTelemetryList = [notices](const StorageList& list) {
    return readTelemetryList(list.bytes, list.characteristics, notices, logStorageRecord);
  };
  const ListRequest requests[] = {
      {kValidityList, handleValidityList},      {kTelemetryList, handleTelemetryList, 0},
      {kTelemetryList, handleTelemetryList, 1}, {kTelemetryList, handleTelemetryList, 2},
      {kDefectsList, handleDefectsList},
  };
  return fetchLists(requests, requestFlag);
}

KvRef<KvBoolean> DumpStorageStructuredLog(const KvBoolean& requestFlag) {
  return KvBoolean::of(dumpStorageLists(requestFlag.value(), stdout));
}

void CopyDictionary(const KvRef<KvString>& key, const KvRef<KvObject>& value,
                    KvDictionary& target) {
  target.set(key, value);
}

void DumpNANDInfo(KvDictionary& target) {
  const LoadedStatistics statistics;
  if (!statistics) return;
  const auto info = buildNandInfo(statistics.context(), true);
  if (!info) return;
  for (const auto& [key, value] : *info) CopyDictionary(key, value, target);
}

}  // namespace tally
