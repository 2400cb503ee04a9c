// Which registry entries a matching dictionary means.
#pragma once

#include "platform/device/registry_source.h"

namespace tally {

bool entryMatches(const RegistryEntry& entry, const KvDictionary& matching);

}  // namespace tally
