// The health summary and its extracts, of a dictionary that is there already.
#pragma once

#include "kv/value.h"

namespace tally {

KvRef<KvDictionary> healthOfNandInfo(const KvDictionary& info);
// Of a summary.
KvRef<KvDictionary> fixlineExtract(const KvDictionary& health);
KvRef<KvDictionary> internalLabExtract(const KvDictionary& health);
KvRef<KvDictionary> otaExtract(const KvDictionary& health);

}  // namespace tally
