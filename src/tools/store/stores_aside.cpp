#include "tools/store/stores_aside.h"

#include <fmt/format.h>

#include "host/store/store_aside.h"
#include "tools/frame/output.h"

namespace tally::tools {

std::string describeStoresAside(const DeviceRoot& root) {
  const StoreFile file = metricsStoreFile(root);
  const auto aside = storesSetAside(file);
  if (aside.empty()) return {};
  std::uint64_t bytes = 0;
  for (const StoreSetAside& store : aside) bytes += store.bytes;
  return fmt::format(
      "{} of a newer version set aside in {}, {} up to {}; a program that knows it reads it with "
      "tallyctl store dump --aside {}",
      counted(aside.size(), "store"), file.directory.text(), byteText(bytes), aside.back().name,
      aside.back().number);
}

}  // namespace tally::tools
