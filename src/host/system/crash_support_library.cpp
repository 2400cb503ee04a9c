#include "host/system/crash_support_library.h"

#include <algorithm>

namespace tally {

bool LinuxCrashSupportLibrary::open(std::string_view) {
  const auto* described = description_->getAs<KvDictionary>(Described::CrashSupport);
  return described == nullptr || !described->getBool("Absent").value_or(false);
}

bool LinuxCrashSupportLibrary::hasSymbol(std::string_view name) {
  const auto* described = description_->getAs<KvDictionary>(Described::CrashSupport);
  const auto* missing =
      described != nullptr ? described->getAs<KvArray>("MissingSymbols") : nullptr;
  return missing == nullptr ||
         std::none_of(missing->begin(), missing->end(), [&](const auto& item) {
           const auto* symbol = kvCast<KvString>(item.get());
           return symbol != nullptr && symbol->view() == name;
         });
}

}  // namespace tally
