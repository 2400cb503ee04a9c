// Prints how worn the flash storage of a device is (TALLYRUN_ROOT, or /); fails when nobody knows.
#include <storage/nand_info.h>

#include <cstdio>

int main() {
  using namespace tally;
  const auto info = CopyNANDInfo();
  const auto used = info->getInt64("vellum.NANDInfo.UserPartitionPEPercentUsed");
  if (info->contains(kNANDInfoErrorKey) || !used) {
    std::fprintf(stderr, "%s\n", kvText(info->get(kNANDInfoErrorMessageKey)).c_str());
    return 1;
  }
  std::printf("%lld %% used\n", static_cast<long long>(*used));
  return 0;
}
