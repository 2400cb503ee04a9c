// Which registry entries a matching dictionary means.
#pragma once

#include "host/registry/registry_source.h"

namespace tally {

bool entryMatches(const RegistryEntry& entry, const KvDictionary& matching);

}  // namespace tally
