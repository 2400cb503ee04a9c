// The purgeable space of the user's volume, from its service.
#include "storage/reclaim.h"

#include "platform/platform.h"
#include "storage/nand_info/nand_info_failure.h"

namespace tally {
namespace {

bool copyFigure(const KvDictionary& answer, std::string_view from, KvDictionary& to,
                std::string_view key) {
  KvObject* const figure = answer.get(from);
  if (figure == nullptr) return false;
  to.set(key, KvRef<KvObject>::share(figure));
  return true;
}

}  // namespace

bool addReclaimFigures(KvDictionary& dictionary) {
  PurgeableSpace& service = *platform().purgeableSpace;
  if (!service.isAvailable()) return false;
  const auto options = KvDictionary::create({{"RECLAIM_VOLUME", KvString::create("/private/var")}});
  const auto answer = service.copyItemizedPurgeableSpace(*options);
  if (!answer) return false;
  if (copyFigure(*answer, "RECLAIM_ERROR", dictionary, kNANDInfoReclaimErrorKey)) return false;
  const bool purgeable =
      copyFigure(*answer, "RECLAIM_TOTAL_AVAILABLE", dictionary, kNANDInfoReclaimTotalPurgeableKey);
  const bool nonPurgeable = copyFigure(*answer, "RECLAIM_NONPURGEABLE_AMOUNT", dictionary,
                                       kNANDInfoReclaimTotalNonPurgeableKey);
  return purgeable && nonPurgeable;
}

KvRef<KvDictionary> CopyReclaimNANDInfo() {
  auto info = KvDictionary::create();
  if (!addReclaimFigures(*info)) {
    setFailure(*info, kNANDInfoReclaimErrorKey, kNANDInfoReclaimErrorMessageKey,
               "Unable to parse reclaim counters.");
  }
  return info;
}

}  // namespace tally
