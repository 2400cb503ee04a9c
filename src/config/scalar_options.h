// The option dictionaries of the whitelist: their keys, and how each is read.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Options of one whitelisted key; an empty dictionary reports the key unchanged.
using ScalarOptions = KvDictionary;

constexpr std::string_view kOptionSignificantFigures = "sig_fig";
constexpr std::string_view kOptionBucketInterval = "bucket_interval";
constexpr std::string_view kOptionIntervals = "intervals";

// A non-negative integer of 32 bits; empty when the option is missing or anything else.
std::optional<std::uint32_t> unsignedOption(const ScalarOptions& options, std::string_view key);

// True when the value may stand under that option key. Keys that nobody reads may hold anything.
bool isWellFormedOption(std::string_view key, const KvObject& value);

}  // namespace tally
