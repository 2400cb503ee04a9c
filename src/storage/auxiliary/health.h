// The health summary of a given dictionary, and its extracts.
#pragma once

#include <span>
#include <string_view>

#include "kv/value.h"

namespace tally {

KvRef<KvDictionary> healthOfNandInfo(const KvDictionary& info);
// Of a summary.
KvRef<KvDictionary> fixlineExtract(const KvDictionary& health);
KvRef<KvDictionary> internalLabExtract(const KvDictionary& health);
KvRef<KvDictionary> otaExtract(const KvDictionary& health);

// The keys of the NAND info dictionary that a figure of the summary is the largest of; empty when
// it is copied under its own key.
std::span<const std::string_view> countersOfHealthFigure(std::string_view key);

}  // namespace tally
