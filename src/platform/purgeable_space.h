// The purgeable-space service, which a product may ship without.
#pragma once

#include "kv/value.h"

namespace tally {

class PurgeableSpace {
 public:
  virtual ~PurgeableSpace() = default;
  virtual bool isAvailable() = 0;
  // What can be purged, by item; null when there is no answer.
  virtual KvRef<KvDictionary> copyItemizedPurgeableSpace(const KvDictionary& options) = 0;
};

}  // namespace tally
