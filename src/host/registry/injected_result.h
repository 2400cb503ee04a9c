// Failures that a description asks for.
#pragma once

#include <string_view>

#include "host/registry/registry_source.h"

namespace tally {

// The code under the key, in its low 32 bits; success when there is none.
inline RegistryResult injectedResult(const KvDictionary* description, std::string_view key) {
  if (description == nullptr) return kRegistrySuccess;
  return static_cast<RegistryResult>(description->getInt64(key).value_or(kRegistrySuccess));
}

}  // namespace tally
