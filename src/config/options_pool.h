// OptionsPool: the options of whitelisted keys, each once.
#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "base/hash.h"
#include "config/whitelist_options.h"
#include "kv/value.h"

namespace tally {

struct PooledOptions {
  KvRef<KvDictionary> read;        // as the file has them
  KvRef<KvDictionary> wellFormed;  // those that can be applied; the same object if all can
};

// Most keys of a whitelist have the same few options.
class OptionsPool {
 public:
  // The number of these options. They must not be changed any more.
  std::uint32_t add(const KvRef<KvDictionary>& options);
  const PooledOptions& operator[](std::uint32_t number) const { return pool_[number]; }

 private:
  std::uint32_t addUnlessKnown(const KvRef<KvDictionary>& options);
  struct Recent {
    KvRef<KvDictionary> options;  // kept, so that no other object gets its address
    std::uint32_t number = 0;
  };
  std::array<Recent, 64> recent_;
  std::vector<PooledOptions> pool_;
  HashIndex byContent_;
};

}  // namespace tally
