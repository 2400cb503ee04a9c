// The health summary and its extracts, of every kind of NAND info dictionary.
#include <gtest/gtest.h>

#include "storage/auxiliary/health.h"

namespace tally {
namespace {

constexpr std::string_view kInfoPrefix = "vellum.NANDInfo.";

KvRef<KvDictionary> nandInfo(
    std::initializer_list<std::pair<std::string_view, KvRef<KvObject>>> entries) {
  auto info = KvDictionary::create();
  for (const auto& [name, value] : entries) info->set(std::string(kInfoPrefix).append(name), value);
  return info;
}

// "name=value" in order; wide numbers carry an L.
std::string textOfHealth(const KvDictionary& dictionary) {
  std::string all;
  for (const auto& [key, value] : dictionary) {
    const auto* number = kvCast<KvNumber>(value.get());
    all.append(key->view().substr(kInfoPrefix.size())).append("=").append(kvText(value.get()));
    all.append(number != nullptr && number->kind() == KvNumberKind::Int64 ? "L " : " ");
  }
  return all;
}

TEST(Health, SummaryAndExtracts) {
  const auto info = nandInfo({{"fwUpdatesPercentUsed", KvNumber::int64(3)},
                              {"UserPartitionPEPercentUsed", KvNumber::int64(41)},
                              {"E2E_H2F_VL_UECC", KvNumber::int64(12)},
                              {"E2E_F2H_SL_UECC", KvNumber::int64(0x100000002)},
                              {"ueccReads", KvNumber::int64(5)},
                              {"raidSmartErrors", KvNumber::int64(-1)},
                              {"numGrownBad", KvNumber::int64(9)},
                              {"spareAvailablePercent", KvNumber::int64(2)},
                              {"other", KvNumber::int64(1)}});
  const auto health = healthOfNandInfo(*info);
  EXPECT_EQ(textOfHealth(*health),
            "fwUpdatesPercentUsed=3 IntermediatePartitionPEPercentUsed=0 "
            "UserPartitionPEPercentUsed=41 Health.MaxPercentageNANDUsed=41 "
            "E2E_H2F_VL_LBA=0L E2E_H2F_VL_Corr=0L E2E_H2F_VL_UECC=12L E2E_H2F_SL_LBA=0L "
            "E2E_H2F_SL_Corr=0L E2E_H2F_SL_UECC=0L E2E_F2H_VL_LBA=0L E2E_F2H_VL_Corr=0L "
            "E2E_F2H_VL_UECC=0L E2E_F2H_SL_LBA=0L E2E_F2H_SL_Corr=0L E2E_F2H_SL_UECC=2L "
            "Health.MaxE2EErrors=12 ueccReads=5L raidSmartErrors=-1L Health.HostReadErrors=-1 "
            "numGrownBad=9 spareAvailablePercent=2 ");
  EXPECT_EQ(textOfHealth(*fixlineExtract(*health)),
            "Health.MaxPercentageNANDUsed=41 Health.HostReadErrors=-1 numGrownBad=9 "
            "Health.MaxE2EErrors=12 Health.IsNANDRefurbishable=1 ");
  EXPECT_EQ(textOfHealth(*internalLabExtract(*health)),
            "Health.MaxPercentageNANDUsed=41 Health.HostReadErrors=-1 numGrownBad=9 "
            "Health.MaxE2EErrors=12 spareAvailablePercent=2 Health.IsNANDRetirable=1 ");
  EXPECT_EQ(textOfHealth(*otaExtract(*health)),
            "Health.MaxPercentageNANDUsed=41 Health.HostReadErrors=-1 numGrownBad=9 "
            "E2E_H2F_VL_LBA=0 E2E_H2F_VL_Corr=0 E2E_H2F_VL_UECC=12 E2E_H2F_SL_LBA=0 "
            "E2E_H2F_SL_Corr=0 E2E_H2F_SL_UECC=0 E2E_F2H_VL_LBA=0 E2E_F2H_VL_Corr=0 "
            "E2E_F2H_VL_UECC=0 E2E_F2H_SL_LBA=0 E2E_F2H_SL_Corr=0 E2E_F2H_SL_UECC=2 ");
}

TEST(Health, SparePercentageDecidesRetirement) {
  const struct {
    KvRef<KvObject> spare;
    int retirable;
  } cases[] = {
      {nullptr, 1}, {KvNumber::int64(2), 1}, {KvNumber::int64(3), 0}, {KvNumber::int64(-1), 0}};
  for (const auto& c : cases) {
    const auto lab =
        internalLabExtract(*healthOfNandInfo(*nandInfo({{"spareAvailablePercent", c.spare}})));
    EXPECT_EQ(lab->getInt64("vellum.NANDInfo.Health.IsNANDRetirable"), c.retirable);
  }
}

// A value that is no number counts as 0 and is said to be one, in the summary and what comes of it.
TEST(Health, ValuesThatAreNoNumbers) {
  for (const char* key : {"UserPartitionPEPercentUsed", "E2E_H2F_VL_LBA", "numGrownBad"}) {
    SCOPED_TRACE(key);
    const auto health = healthOfNandInfo(*nandInfo({{key, KvString::create("7")}}));
    EXPECT_EQ(health->getInt64(std::string(kInfoPrefix) + key), 0);
    EXPECT_EQ(health->getInt64("vellum.NANDInfo.Error"), 1);
    for (const auto& extract :
         {fixlineExtract(*health), internalLabExtract(*health), otaExtract(*health)}) {
      EXPECT_EQ(extract->getInt64("vellum.NANDInfo.Error"), 1);
    }
  }
  const auto failed = nandInfo({{"Error", KvString::create("1")}});
  EXPECT_FALSE(healthOfNandInfo(*failed)->contains("vellum.NANDInfo.Error"));
}

}  // namespace
}  // namespace tally
