#include "tools/privacy/measure_privacy.h"

#include <fmt/format.h>
#include <algorithm>
#include <cmath>
#include <limits>
#include <map>
#include <memory>
#include <utility>

#include "platform/tables/measured_metrics.h"
#include "report/distribution_summary.h"
#include "tools/privacy/exposure_bits.h"
#include "tools/privacy/key_identifiers.h"
#include "tools/privacy/key_states.h"
#include "tools/privacy/proposals.h"

namespace tally::tools {
namespace {

constexpr std::uint32_t kNoEntry = std::numeric_limits<std::uint32_t>::max();
constexpr std::size_t kExamples = 3;

std::uint64_t mixed(std::uint64_t hash, std::uint64_t word) {
  return std::rotl((hash ^ word) * 0x9e3779b97f4a7c15U, 29);
}

// What is known of an entry's histograms.
struct EntryHistogram {
  explicit EntryHistogram(const ScalarOptions& options)
      : intervals(*options.getAs<KvArray>(kOptionIntervals)), counts(intervals.bucketCount()) {
    totals.bounds = risingBounds(options);
    totals.samples.resize(counts.size());
    isRising = totals.bounds.size() + 1 == counts.size();
  }
  HistogramIntervals intervals;
  std::vector<std::uint64_t> counts;  // of the distribution in hand
  BucketTotals totals;
  bool isRising = false;  // so that the bounds are those of the buckets
  std::uint64_t used = 0, lone = 0;
  double narrowest = std::numeric_limits<double>::infinity();  // of the lone ones
};

// "a, b, c, …"
class Examples {
 public:
  void add(std::string_view text) {
    if (++count_ <= kExamples) text_ += fmt::format("{}{}", count_ > 1 ? ", " : "", text);
  }
  std::uint64_t count() const { return count_; }
  std::string text() const { return count_ > kExamples ? text_ + ", …" : text_; }

 private:
  std::uint64_t count_ = 0;
  std::string text_;
};

class Measurer {
 public:
  Measurer(const ToolContext& context, const WhitelistJudge& judge, const KnownMetrics& metrics)
      : context_(context),
        judge_(judge),
        metrics_(metrics),
        names_(deviceNames(*context.platform->files)) {
    if (judge.index() == nullptr) return;
    for (const KeyCandidate& candidate : judge.index()->all()) {
      if (candidate.state == GroupState::InForce) addEntry(candidate);
    }
    histograms_.resize(report_.entries.size());
  }

  void readScalars(HistoryStore& history);
  void readDistributions(HistoryStore& history);
  PrivacyReport finish();

 private:
  using Place = std::pair<WhitelistSection, std::string_view>;

  void addEntry(const KeyCandidate& candidate);
  std::uint32_t entryOf(const WhitelistMatch& match, KeyKind kind);
  KeyState newState(std::string_view key, KeyKind kind);
  void sawDay(KeyState& state, std::int32_t day);
  EntryHistogram* histogramOf(const KeyState& state);
  void addDistribution(KeyState& state, DistributionValues& values);
  void countBuckets(EntryHistogram& histogram) const;
  void addMeasured();
  void takeKeys(KeyStates& states);
  void setBits(KeyExposure& key) const;
  void addToEntry(const KeyExposure& key);
  void addNotes(std::uint32_t number, std::span<const KeyExposure* const> keys);
  void addNameNotes(EntryExposure& entry, std::span<const KeyExposure* const> keys) const;
  void addHistogramNotes(EntryExposure& entry, const EntryHistogram& histogram,
                         std::span<const KeyExposure* const> keys) const;
  void sortEntries();

  const ToolContext& context_;
  const WhitelistJudge& judge_;
  const KnownMetrics& metrics_;
  const DeviceNames names_;
  PrivacyReport report_;
  std::map<Place, std::uint32_t> places_;  // of entries; the texts are the judge's
  std::vector<std::unique_ptr<EntryHistogram>> histograms_;  // of entries, where there is one
  KeyStates scalars_, distributions_;
};

void Measurer::addEntry(const KeyCandidate& candidate) {
  const std::string_view text = candidate.entry.key;
  const auto [place, isNew] = places_.try_emplace(
      Place(candidate.section, text), static_cast<std::uint32_t>(report_.entries.size()));
  if (isNew) report_.entries.emplace_back();
  EntryExposure& entry = report_.entries[place->second];  // the last one of the file decides
  entry.section = candidate.section;
  entry.group = candidate.entry.group;
  entry.entry = text;
  entry.options = candidate.entry.options;
}

std::uint32_t Measurer::entryOf(const WhitelistMatch& match, KeyKind kind) {
  if (match.options == nullptr) return kNoEntry;
  const bool prefix = match.kind != WhitelistMatchKind::Exact;
  const auto section = kind == KeyKind::Scalar ? (prefix ? WhitelistSection::ScalarKeyPrefixes
                                                         : WhitelistSection::ScalarKeys)
                                               : (prefix ? WhitelistSection::DistributionKeyPrefixes
                                                         : WhitelistSection::DistributionKeys);
  const std::string_view text = match.entry != nullptr ? match.entry->key() : std::string_view();
  const auto [place, isNew] =
      places_.try_emplace(Place(section, text), static_cast<std::uint32_t>(report_.entries.size()));
  if (isNew) {  // an internal device reports what no entry admits
    EntryExposure& entry = report_.entries.emplace_back();
    entry.section = section;
    entry.options = KvDictionary::create();
    histograms_.emplace_back();
  }
  return place->second;
}

KeyState Measurer::newState(std::string_view key, KeyKind kind) {
  KeyState state;
  const WhitelistMatch match = judge_.match(key, kind);
  state.options = match.options;
  state.exposure.key = key;
  state.exposure.kind = kind;
  state.exposure.entry = entryOf(match, kind);
  return state;
}

void Measurer::sawDay(KeyState& state, std::int32_t day) {
  ++state.exposure.days;
  report_.firstDay = std::min(report_.firstDay.value_or(day), day);
  report_.lastDay = std::max(report_.lastDay.value_or(day), day);
}

void Measurer::readScalars(HistoryStore& history) {
  history.enumerateScalars(
      "", std::numeric_limits<std::int32_t>::min(), std::numeric_limits<std::int32_t>::max(),
      [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
        KeyState& state = scalars_.at(
            key, [this](std::string_view name) { return newState(name, KeyKind::Scalar); });
        if (state.options == nullptr) return;
        sawDay(state, day);
        SeenRange& range = state.exposure.range;
        range.lowest = range.any ? std::min(range.lowest, value) : value;
        range.highest = range.any ? std::max(range.highest, value) : value;
        range.any = true;
        state.values.add(static_cast<std::uint64_t>(value));
        state.reported.add(static_cast<std::uint64_t>(roundScalar(value, *state.options)));
      });
}

EntryHistogram* Measurer::histogramOf(const KeyState& state) {
  if (state.options->getAs<KvArray>(kOptionIntervals) == nullptr) return nullptr;
  auto& histogram = histograms_[state.exposure.entry];
  if (!histogram) histogram = std::make_unique<EntryHistogram>(*state.options);
  return histogram.get();
}

void Measurer::countBuckets(EntryHistogram& histogram) const {
  ++histogram.totals.distributions;
  for (std::size_t i = 0; i < histogram.counts.size(); ++i) {
    const std::uint64_t count = histogram.counts[i];
    if (count == 0) continue;
    ++histogram.used;
    histogram.totals.samples[i] += count;
    if (count > 1) continue;
    ++histogram.lone;
    const auto& bounds = histogram.totals.bounds;
    if (!histogram.isRising || i == 0 || i == bounds.size()) continue;
    histogram.narrowest = std::min(histogram.narrowest, bounds[i] - bounds[i - 1]);
  }
}

void Measurer::addDistribution(KeyState& state, DistributionValues& values) {
  constexpr std::size_t kBatch = 1024;
  KeyExposure& key = state.exposure;
  EntryHistogram* const histogram = histogramOf(state);
  if (histogram != nullptr) std::ranges::fill(histogram->counts, 0);
  DistributionSummary summary;
  double batch[kBatch];
  while (const std::size_t count = values.nextValues(batch, nullptr, kBatch)) {
    const std::span<const double> samples(batch, count);
    summary.add(samples, values.weights(), histogram != nullptr ? &histogram->intervals : nullptr,
                histogram != nullptr ? std::span(histogram->counts) : std::span<std::uint64_t>());
    key.whole = key.whole && std::ranges::all_of(samples, [](double sample) {
                  return std::isfinite(sample) && std::trunc(sample) == sample;
                });
    for (std::size_t i = 0; i < count && !state.values.isFull(); ++i) {
      state.values.add(std::bit_cast<std::uint64_t>(batch[i]));
    }
  }
  if (summary.count == 0) return;
  key.mostSamples = std::max(key.mostSamples, summary.count);
  std::uint64_t hash = mixed(0, static_cast<std::uint64_t>(summary.count));
  for (const double number :
       {summary.minimum, summary.maximum, summary.mean, summary.squaredDeviations}) {
    hash = mixed(hash, std::bit_cast<std::uint64_t>(number));
  }
  if (histogram != nullptr) {
    for (const std::uint64_t count : histogram->counts) hash = mixed(hash, count);
    countBuckets(*histogram);
  }
  state.reported.add(hash);
  if (std::isnan(summary.minimum) || std::isnan(summary.maximum)) return;
  SeenRange& range = key.range;
  range.minimum = range.any ? std::min(range.minimum, summary.minimum) : summary.minimum;
  range.maximum = range.any ? std::max(range.maximum, summary.maximum) : summary.maximum;
  range.any = true;
}

void Measurer::readDistributions(HistoryStore& history) {
  history.enumerateDistributions(
      "", std::numeric_limits<std::int32_t>::min(), std::numeric_limits<std::int32_t>::max(),
      [&](std::string_view key, std::int32_t day, DistributionValues& values, bool&) {
        KeyState& state = distributions_.at(
            key, [this](std::string_view name) { return newState(name, KeyKind::Distribution); });
        if (state.options == nullptr) return;
        sawDay(state, day);
        addDistribution(state, values);
      });
}

void Measurer::addMeasured() {
  for (const MeasuredMetric& metric : kMeasuredMetrics) {
    (void)scalars_.at(metric.key,
                      [this](std::string_view name) { return newState(name, KeyKind::Scalar); });
  }
}

void Measurer::setBits(KeyExposure& key) const {
  if (!key.range.any) return;
  const KvDictionary& options = *report_.entries[key.entry].options;
  if (key.kind == KeyKind::Scalar) {
    key.bits = scalarBits(key.range.lowest, key.range.highest, options);
    return;
  }
  const bool hasHistogram = options.getAs<KvArray>(kOptionIntervals) != nullptr;
  const EntryHistogram* const histogram = histograms_[key.entry].get();
  const std::size_t buckets =
      hasHistogram && histogram != nullptr
          ? bucketsReached(histogram->totals.bounds, key.range.minimum, key.range.maximum)
          : 0;
  key.bits =
      distributionBits({key.range.minimum, key.range.maximum, key.mostSamples, key.whole}, buckets);
}

void Measurer::takeKeys(KeyStates& states) {
  for (KeyState& state : states.all()) {
    if (state.options == nullptr) continue;
    KeyExposure& key = state.exposure;
    key.values = state.values.count();
    key.reported = state.reported.count();
    setBits(key);
    report_.keys.push_back(std::move(key));
  }
  states.all().clear();
}

void Measurer::addToEntry(const KeyExposure& key) {
  EntryExposure& entry = report_.entries[key.entry];
  ++entry.keys;
  entry.bits += key.bits;
  entry.mostBits = std::max(entry.mostBits, key.bits);
  report_.bits += key.bits;
  if (key.values.count >= entry.values.count) entry.values = key.values;
  if (key.reported.count >= entry.reported.count) entry.reported = key.reported;
  if (!key.range.any) return;
  SeenRange& range = entry.range;
  if (!range.any) {
    range = key.range;
    return;
  }
  range.lowest = std::min(range.lowest, key.range.lowest);
  range.highest = std::max(range.highest, key.range.highest);
  range.minimum = std::min(range.minimum, key.range.minimum);
  range.maximum = std::max(range.maximum, key.range.maximum);
}

void Measurer::addNameNotes(EntryExposure& entry, std::span<const KeyExposure* const> keys) const {
  Examples identifying, unlisted;
  const auto look = [&](std::string_view key) {
    if (const auto found = identifierIn(key, names_)) {
      identifying.add(fmt::format("{} ({} in {})", found->part, found->kind, key));
    }
  };
  for (const KeyExposure* key : keys) {
    look(key->key);
    if (isPrefixSection(entry.section) && metrics_.find(key->key) == nullptr) {
      unlisted.add(key->key);
    }
  }
  if (keys.empty()) look(entry.entry);
  if (identifying.count() > 0) {
    entry.notes.push_back(
        {PrivacyConcern::IdentifierInKey, identifying.count(), identifying.text()});
  }
  if (unlisted.count() > 0) {
    entry.notes.push_back({PrivacyConcern::UnlistedKeys, unlisted.count(), unlisted.text()});
  }
}

void Measurer::addHistogramNotes(EntryExposure& entry, const EntryHistogram& histogram,
                                 std::span<const KeyExposure* const> keys) const {
  if (histogram.lone == 0) return;
  std::string detail =
      fmt::format("{} of {} that had samples", histogram.lone, counted(histogram.used, "bucket"));
  if (std::isfinite(histogram.narrowest)) {
    detail += fmt::format("; the narrowest is {} wide", realText(histogram.narrowest));
  }
  entry.notes.push_back({PrivacyConcern::LoneSamples, histogram.lone, std::move(detail)});
  if (histogram.isRising) entry.proposals = proposalsForHistogram(entry, keys, histogram.totals);
}

void Measurer::addNotes(std::uint32_t number, std::span<const KeyExposure* const> keys) {
  EntryExposure& entry = report_.entries[number];
  constexpr double kSame = 1e-9;  // of two logarithms
  Examples exact;
  for (const KeyExposure* key : keys) {
    const auto width =
        static_cast<double>(key->range.highest) - static_cast<double>(key->range.lowest);
    const bool isExact = entry.kind() == KeyKind::Distribution
                             ? key->range.any
                             : !haveEffect(*entry.options) ||
                                   (width > 0 && key->bits > std::log2(width + 1) - kSame);
    if (isExact) exact.add(key->key);
  }
  if (exact.count() > 0) {
    entry.notes.push_back({entry.kind() == KeyKind::Scalar ? PrivacyConcern::ExactNumber
                                                           : PrivacyConcern::ExactExtremes,
                           exact.count(), exact.text()});
  }
  if (entry.kind() == KeyKind::Scalar) {
    entry.proposals = proposalsForScalars(entry, keys);
  } else if (const auto& histogram = histograms_[number]) {
    addHistogramNotes(entry, *histogram, keys);
  }
  addNameNotes(entry, keys);
}

void Measurer::sortEntries() {
  std::vector<std::uint32_t> order(report_.entries.size());
  for (std::uint32_t i = 0; i < order.size(); ++i) order[i] = i;
  std::ranges::stable_sort(order, std::greater<>(), [this](std::uint32_t i) {
    const EntryExposure& entry = report_.entries[i];
    return std::pair(entry.range.any, entry.bits);
  });
  std::vector<std::uint32_t> places(order.size());
  std::vector<EntryExposure> sorted;
  sorted.reserve(order.size());
  for (std::uint32_t i = 0; i < order.size(); ++i) {
    places[order[i]] = i;
    sorted.push_back(std::move(report_.entries[order[i]]));
  }
  report_.entries = std::move(sorted);
  for (KeyExposure& key : report_.keys) key.entry = places[key.entry];
}

PrivacyReport Measurer::finish() {
  addMeasured();
  takeKeys(scalars_);
  takeKeys(distributions_);
  std::ranges::sort(report_.keys, [](const KeyExposure& one, const KeyExposure& other) {
    const int compared = one.key.compare(other.key);
    return compared != 0 ? compared < 0 : one.kind < other.kind;
  });
  std::vector<std::vector<const KeyExposure*>> keysOfEntry(report_.entries.size());
  for (const KeyExposure& key : report_.keys) {
    addToEntry(key);
    keysOfEntry[key.entry].push_back(&key);
  }
  for (std::uint32_t i = 0; i < report_.entries.size(); ++i) addNotes(i, keysOfEntry[i]);
  sortEntries();
  return std::move(report_);
}

}  // namespace

PrivacyReport measurePrivacy(const ToolContext& context, const WhitelistJudge& judge,
                             const KnownMetrics& metrics) {
  Measurer measurer(context, judge, metrics);
  const auto history = context.platform->metricsStore->openHistory();
  measurer.readScalars(*history);
  measurer.readDistributions(*history);
  return measurer.finish();
}

}  // namespace tally::tools
