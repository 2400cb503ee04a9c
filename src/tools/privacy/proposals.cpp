#include "tools/privacy/proposals.h"

#include <fmt/format.h>
#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

#include "config/whitelist_options.h"
#include "tools/privacy/exposure_bits.h"

namespace tally::tools {
namespace {

constexpr std::string_view kFigures = "sig_fig", kInterval = "bucket_interval";

// The options without those of the kind, which others replace.
KvRef<KvDictionary> without(const KvDictionary& options, bool forScalars) {
  auto rest = KvDictionary::create();
  for (const auto& [name, value] : options) {
    const WhitelistOption* const known = whitelistOption(name->view());
    if (known != nullptr && known->effect.isForScalars() == forScalars) continue;
    rest->set(name->view(), value);
  }
  return rest;
}

// Whether it is worth a change.
bool revealsLess(const PrivacyProposal& proposal, const EntryExposure& entry) {
  constexpr double kShare = 0.9, kBits = 1;
  return proposal.bits <= entry.bits * kShare && proposal.bits <= entry.bits - kBits;
}

void addScalar(const EntryExposure& entry, std::span<const KeyExposure* const> keys,
               std::string_view option, std::uint32_t setting, PrivacyProposal proposal,
               std::vector<PrivacyProposal>& proposals) {
  proposal.options = without(*entry.options, true);
  proposal.options->set(option, KvNumber::int64(setting));
  for (const KeyExposure* key : keys) {
    if (!key->range.any) continue;
    proposal.bits += scalarBits(key->range.lowest, key->range.highest, *proposal.options);
  }
  if (revealsLess(proposal, entry)) proposals.push_back(std::move(proposal));
}

// 1, 2 or 5 times a power of ten, at or above the number.
double roundNumber(double number) {
  const double power = std::pow(10, std::floor(std::log10(number)));
  for (const double factor : {1.0, 2.0, 5.0}) {
    if (number <= factor * power) return factor * power;
  }
  return 10 * power;
}

// Whether another boundary follows is decided by the samples since the last one.
std::vector<double> mergedBounds(const BucketTotals& totals) {
  constexpr std::uint64_t kSamples = 10;  // of a distribution, on average
  std::vector<double> bounds;
  std::uint64_t samples = 0;
  for (std::size_t i = 0; i < totals.bounds.size(); ++i) {
    samples += totals.samples[i];
    if (samples < kSamples * totals.distributions) continue;
    bounds.push_back(totals.bounds[i]);
    samples = 0;
  }
  // What is above the last boundary needs as many.
  samples += totals.samples.back();
  if (!bounds.empty() && samples < kSamples * totals.distributions) bounds.pop_back();
  return bounds;
}

double bitsWith(std::span<const double> bounds, bool hasHistogram,
                std::span<const KeyExposure* const> keys) {
  double bits = 0;
  for (const KeyExposure* key : keys) {
    if (!key->range.any) continue;
    const std::size_t buckets =
        hasHistogram ? bucketsReached(bounds, key->range.minimum, key->range.maximum) : 0;
    bits += distributionBits({key->range.minimum, key->range.maximum, key->mostSamples, key->whole},
                             buckets);
  }
  return bits;
}

// As a person would write it into the whitelist.
KvRef<KvNumber> numberOf(double number) {
  constexpr double kExact = 9007199254740992.0;  // 2 to the 53rd
  const bool whole = std::trunc(number) == number && std::fabs(number) < kExact;
  return whole ? KvNumber::int64(static_cast<std::int64_t>(number)) : KvNumber::float64(number);
}

}  // namespace

std::vector<PrivacyProposal> proposalsForScalars(const EntryExposure& entry,
                                                 std::span<const KeyExposure* const> keys) {
  constexpr double kFewBits = 4, kIntervals = 32;
  std::vector<PrivacyProposal> proposals;
  if (entry.mostBits <= kFewBits) return proposals;
  for (const std::uint32_t figures : {3U, 2U, 1U}) {
    PrivacyProposal proposal;
    // The first figure may be 1, and the next ones are off by half a unit of the last.
    proposal.relativeError = 5 * std::pow(10, -static_cast<double>(figures));
    proposal.text =
        fmt::format("{} {}: at most {:g} % off", kFigures, figures, *proposal.relativeError * 100);
    addScalar(entry, keys, kFigures, figures, std::move(proposal), proposals);
  }
  const double width =
      static_cast<double>(entry.range.highest) - static_cast<double>(entry.range.lowest);
  const double interval = roundNumber(std::max(width / kIntervals, 1.0));
  if (interval >= 2 && interval <= std::numeric_limits<std::uint32_t>::max()) {
    PrivacyProposal proposal;
    // Negative values are rounded towards 0, after half of it was added.
    const double half = std::floor(interval / 2);
    proposal.absoluteError = entry.range.lowest < 0 ? interval + half - 1 : half;
    proposal.text =
        fmt::format("{} {:.0f}: at most {:.0f} off", kInterval, interval, *proposal.absoluteError);
    addScalar(entry, keys, kInterval, static_cast<std::uint32_t>(interval), std::move(proposal),
              proposals);
  }
  std::ranges::stable_sort(proposals, std::greater<>(), &PrivacyProposal::bits);
  return proposals;
}

std::vector<PrivacyProposal> proposalsForHistogram(const EntryExposure& entry,
                                                   std::span<const KeyExposure* const> keys,
                                                   const BucketTotals& totals) {
  std::vector<PrivacyProposal> proposals;
  const std::vector<double> bounds = mergedBounds(totals);
  if (!bounds.empty() && bounds.size() < totals.bounds.size()) {
    PrivacyProposal proposal;
    proposal.options = without(*entry.options, false);
    auto array = KvArray::create();
    for (const double bound : bounds) array->append(numberOf(bound));
    proposal.options->set(kOptionIntervals, std::move(array));
    for (std::size_t i = 1; i < bounds.size(); ++i) {
      const double width = bounds[i] - bounds[i - 1];
      if (!std::isfinite(width)) continue;  // as if there were no boundary
      proposal.absoluteError = std::max(proposal.absoluteError.value_or(0), width);
    }
    proposal.bits = bitsWith(bounds, true, keys);
    constexpr std::size_t kShown = 8;
    std::string shown;
    for (std::size_t i = 0; i < std::min(bounds.size(), kShown); ++i) {
      shown += fmt::format("{}{}", i > 0 ? ", " : "", realText(bounds[i]));
    }
    proposal.text =
        fmt::format("{} [{}{}]{}", kOptionIntervals, shown, bounds.size() > kShown ? ", …" : "",
                    proposal.absoluteError
                        ? fmt::format(": buckets up to {} wide", realText(*proposal.absoluteError))
                        : "");
    proposals.push_back(std::move(proposal));
  }
  PrivacyProposal none;
  none.options = without(*entry.options, false);
  none.bits = bitsWith({}, false, keys);
  none.text = fmt::format("no {}: no histogram", kOptionIntervals);
  proposals.push_back(std::move(none));
  return proposals;
}

}  // namespace tally::tools
