// What the whitelist lets the reported values of a device reveal.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "config/whitelist_file.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {

enum class PrivacyConcern : std::uint8_t {
  ExactNumber,
  ExactExtremes,
  LoneSamples,
  IdentifierInKey,
  UnlistedKeys,
};

// One row each, in the order of the enumerators. The name is for programs.
struct PrivacyConcernRow {
  std::string_view name, meaning;
};
inline constexpr PrivacyConcernRow kPrivacyConcerns[] = {
    {"exact_number", "numbers are reported exactly"},
    {"exact_extremes", "minimum and maximum are samples, reported exactly; no option rounds them"},
    {"lone_samples", "buckets with one sample show where it is"},
    {"identifier_in_key", "the key itself may name a device, a network, an interface or a user"},
    {"unlisted_keys", "the prefix admits keys that neither an entry nor a metrics table names"},
};
static_assert(std::size(kPrivacyConcerns) == std::size_t(PrivacyConcern::UnlistedKeys) + 1);

constexpr const PrivacyConcernRow& rowOf(PrivacyConcern concern) {
  return kPrivacyConcerns[static_cast<std::size_t>(concern)];
}

struct PrivacyNote {
  PrivacyConcern concern;
  std::uint64_t count = 1;  // of keys; of buckets for LoneSamples
  std::string detail;       // a clause about them, with examples
};

// How many different values there were, up to a bound.
struct DistinctCount {
  static constexpr std::uint32_t kMost = 32;
  std::uint32_t count = 0;
  bool more = false;  // more than the count, which is kMost
};
// "7", "more than 32".
std::string distinctText(const DistinctCount& distinct);

// The lowest and highest value seen, of scalars or samples.
struct SeenRange {
  bool any = false;
  std::int64_t lowest = 0, highest = 0;  // of scalars
  double minimum = 0, maximum = 0;       // of samples
};
// "3 to 1,200", "-"; of a scalar or of samples.
std::string rangeText(const SeenRange& range, KeyKind kind);

// One key that is reported, over the days of the store.
struct KeyExposure {
  std::string key;
  KeyKind kind = KeyKind::Scalar;
  std::uint32_t entry = 0;  // of PrivacyReport::entries
  std::uint32_t days = 0;   // on which it has values; 0: the report measures it
  SeenRange range;
  // Of a distribution: the most samples of a day, and whether all are whole numbers.
  std::int64_t mostSamples = 0;
  bool whole = true;
  double bits = 0;         // that its report of a day can have; see docs/whitelist-privacy.md
  DistinctCount values;    // scalars or samples, as they were recorded
  DistinctCount reported;  // scalars, or statistics with histogram, as a log has them
};

// Other options for an entry.
struct PrivacyProposal {
  KvRef<KvDictionary> options;
  double bits = 0;  // of the entry with them
  // The error that they make: a share of the value, or in the key's unit. Of a histogram, the width
  // of its widest bucket that has two ends, if there is one.
  std::optional<double> relativeError, absoluteError;
  std::string text;  // "sig_fig 2: at most 5 % off"
};

// An entry that is in force and decides about keys, or may.
struct EntryExposure {
  WhitelistSection section = WhitelistSection::ScalarKeys;
  std::string group, entry;        // both empty: what an internal device reports without an entry
  KvRef<KvDictionary> options;     // never null
  std::uint32_t keys = 0;          // that it decides, of the store or measured by the report
  SeenRange range;                 // of all its keys
  double bits = 0;                 // of a day, of all its keys
  double mostBits = 0;             // of one of them
  DistinctCount values, reported;  // of the key that has most
  std::vector<PrivacyNote> notes;
  std::vector<PrivacyProposal> proposals;  // that reveal less, the finest first

  KeyKind kind() const {
    return isScalarSection(section) ? KeyKind::Scalar : KeyKind::Distribution;
  }
};

struct PrivacyReport {
  std::vector<EntryExposure> entries;  // those that reveal most first
  std::vector<KeyExposure> keys;       // by key, scalars first
  double bits = 0;                     // of a day, at most
  // The days of the store that were looked at; empty if it has none.
  std::optional<std::int32_t> firstDay, lastDay;

  // Null when the key is not reported as that kind, or has no values in the store.
  const KeyExposure* find(std::string_view key, KeyKind kind) const;
};

}  // namespace tally::tools
