#include "tools/page/page_log.h"

#include <map>
#include <nlohmann/json.hpp>
#include <tuple>
#include <unordered_map>
#include <utility>

#include "base/natural_order.h"
#include "base/time_text.h"
#include "config/rounding_range.h"
#include "platform/platform.h"
#include "tools/page/page_facts.h"
#include "tools/page/page_words.h"
#include "tools/report/log_diff.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {
namespace {

// Above this, the numbers of JavaScript have gaps; such integers go as text.
constexpr std::int64_t kLargestExact = (std::int64_t{1} << 53) - 1;

Json jsonOfInteger(std::int64_t value) {
  if (value >= -kLargestExact && value <= kLargestExact) return value;
  return std::to_string(value);
}

Json jsonOfStatistics(const KvObject* value) {
  const auto statistics = statisticsOf(value);
  if (!statistics) return nullptr;
  return {statistics->count, jsonOfReal(statistics->minimum), jsonOfReal(statistics->maximum),
          jsonOfReal(statistics->mean), jsonOfReal(statistics->standardDeviation())};
}

// [[label, samples], ...]; null without a histogram.
Json jsonOfHistogram(const KvObject* value) {
  const auto* histogram = kvCast<KvDictionary>(value);
  if (histogram == nullptr) return nullptr;
  Json buckets = Json::array();
  for (const auto& bucket : *histogram) {
    const auto* count = kvCast<KvNumber>(bucket.value.get());
    buckets.push_back(
        {bucket.key->view(), count != nullptr ? jsonOfInteger(count->asInt64()) : Json(nullptr)});
  }
  return buckets;
}

// Rows that several keys share, numbered in the order of their first use.
template <class Identity>
class SharedRows {
 public:
  // The number of the row of this identity; made by the function at its first use.
  template <class Make>
  int numberOf(const Identity& identity, const Make& make) {
    const auto [found, isNew] = numbers_.try_emplace(identity, static_cast<int>(rows_.size()));
    if (isNew) rows_.push_back(make());
    return found->second;
  }
  Json take() { return std::move(rows_); }

 private:
  std::map<Identity, int> numbers_;
  Json rows_ = Json::array();
};

constexpr int kNone = -1;

class BlockBuilder {
 public:
  BlockBuilder(const PageSources& sources, const PageLog& log) : sources_(sources), log_(log) {
    const auto* digest =
        log.content ? log.content->document().getAs<KvString>("TBWhitelistDigest") : nullptr;
    sameWhitelist_ =
        sources.whitelist && digest != nullptr && digest->view() == sources.file.digest;
  }

  Json build() {
    Json block = {{"notes", log_.notes}, {"facts", pageFacts(sources_, log_)}};
    if (log_.content) {
      addWhitelistNote(block["notes"]);
      block["applications"] = pageApplications(*log_.content);
      block["before"] =
          log_.before && log_.before->day() ? Json(dayText(*log_.before->day())) : Json(nullptr);
      block["scalars"] = scalars();
      block["distributions"] = distributions();
      block["removed"] = std::move(removed_);
    }
    block["metrics"] = metrics_.take();
    block["entries"] = entries_.take();
    block["ranges"] = ranges_.take();
    block["groups"] = groups_.take();
    return block;
  }

 private:
  void addWhitelistNote(Json& notes) const {
    if (sameWhitelist_) return;
    notes.push_back(sources_.whitelist
                        ? "This log was made under another whitelist than the one that is "
                          "installed now. Which group admitted a key and how it was rounded is "
                          "therefore not known."
                        : "The whitelist cannot be read now, so which group admitted a key and how "
                          "it was rounded is not known: " +
                              sources_.file.fault + ".");
  }

  int metricOf(std::string_view key) {
    const Metric* const metric = sources_.metrics.find(key);
    if (metric == nullptr) return kNone;
    return metrics_.numberOf(metric, [metric] {
      return Json({metric->type ? nameOf(*metric->type) : "", metric->unit, metric->description});
    });
  }

  int groupOf(std::string_view group) {
    return groups_.numberOf(std::string(group), [&] {
      const OffSwitch off = groupSwitch(*sources_.context.platform, group);
      return Json({group, off.command, off.note});
    });
  }

  // The entry that admits a key now, if it is the one that did.
  int entryOf(const WhitelistMatch& match, KeyKind kind) {
    if (!sameWhitelist_ || match.options == nullptr) return kNone;
    // Thousands of keys may be listed one by one: they share a row where the group and the options
    // are the same.
    const bool isListed = match.entry != nullptr;
    const std::string_view group = isListed ? match.entry->group->view() : "";
    const bool isPrefix = match.kind == WhitelistMatchKind::Prefix;
    const std::string_view prefix = isPrefix ? match.entry->key->view() : "";
    const std::string options = optionsText(*match.options);
    return entries_.numberOf(
        {kind, isListed, std::string(group), std::string(prefix), options}, [&] {
          inverses_.emplace_back(*match.options);
          return Json({isListed ? groupOf(group) : kNone, isPrefix ? Json(prefix) : Json(nullptr),
                       kind == KeyKind::Scalar ? roundingWords(*match.options) : "", options});
        });
  }

  // [how far below the value the true one can be, how far above, whether with gaps].
  int rangeOf(std::int64_t value, int entry) {
    if (entry == kNone) return kNone;
    const RoundingInverse& inverse = inverses_[static_cast<std::size_t>(entry)];
    const auto found = inverse.trueValues(value);
    if (!found) return kNone;
    // As unsigned differences, which are right over the whole range.
    const std::uint64_t below =
        static_cast<std::uint64_t>(value) - static_cast<std::uint64_t>(found->lowest);
    const std::uint64_t above =
        static_cast<std::uint64_t>(found->highest) - static_cast<std::uint64_t>(value);
    return ranges_.numberOf({below, above, found->hasGaps}, [&] {
      return Json({std::to_string(below), std::to_string(above), found->hasGaps});
    });
  }

  using Changes = std::unordered_map<std::string_view, const Difference*>;
  // Marks what is gone; the differences are borrowed.
  Changes changesOf(const std::vector<Difference>& differences, KeyKind kind) {
    Changes changes;
    for (const Difference& difference : differences) {
      changes.emplace(difference.key, &difference);
      if (difference.after != nullptr) continue;
      const auto* number = kvCast<KvNumber>(difference.before);
      removed_.push_back({kindName(kind), difference.key,
                          number != nullptr ? jsonOfInteger(number->asInt64())
                                            : jsonOfStatistics(difference.before),
                          metricOf(difference.key)});
    }
    return changes;
  }

  // True: the same as before; null: new; else the former value.
  template <class Convert>
  static Json formerOf(const Changes& changes, std::string_view key, const Convert& convert) {
    const auto change = changes.find(key);
    if (change == changes.end()) return true;
    return change->second->before != nullptr ? convert(change->second->before) : Json(nullptr);
  }

  Json scalars() {
    const KvDictionary& scalars = log_.content->scalars();
    std::vector<Difference> differing;
    if (log_.before) differing = differences(log_.before->scalars(), scalars);
    const Changes changes = changesOf(differing, KeyKind::Scalar);
    Json keys = Json::array(), values = keys, metrics = keys, entries = keys, ranges = keys,
         former = keys;
    const auto integer = [](const KvObject* value) {
      const auto* number = kvCast<KvNumber>(value);
      return number != nullptr ? jsonOfInteger(number->asInt64()) : Json("?");
    };
    for (const auto* entry : entriesByName(scalars)) {
      const std::string_view key = entry->key->view();
      const auto* number = kvCast<KvNumber>(entry->value.get());
      const int admitted = sameWhitelist_
                               ? entryOf(sources_.whitelist->matchScalarKey(key), KeyKind::Scalar)
                               : kNone;
      keys.push_back(key);
      values.push_back(integer(entry->value.get()));
      metrics.push_back(metricOf(key));
      entries.push_back(admitted);
      ranges.push_back(number != nullptr ? rangeOf(number->asInt64(), admitted) : kNone);
      if (log_.before) former.push_back(formerOf(changes, key, integer));
    }
    return {{"key", std::move(keys)},       {"value", std::move(values)},
            {"metric", std::move(metrics)}, {"entry", std::move(entries)},
            {"range", std::move(ranges)},   {"former", std::move(former)}};
  }

  Json distributions() {
    const DailyLog& log = *log_.content;
    std::vector<Difference> differing;
    if (log_.before) differing = differences(log_.before->distributions(), log.distributions());
    const Changes changes = changesOf(differing, KeyKind::Distribution);
    Json keys = Json::array(), values = keys, metrics = keys, entries = keys, histograms = keys,
         former = keys;
    for (const auto* entry : entriesByName(log.distributions())) {
      const std::string_view key = entry->key->view();
      keys.push_back(key);
      values.push_back(jsonOfStatistics(entry->value.get()));
      metrics.push_back(metricOf(key));
      entries.push_back(sameWhitelist_ ? entryOf(sources_.whitelist->matchDistributionKey(key),
                                                 KeyKind::Distribution)
                                       : kNone);
      histograms.push_back(jsonOfHistogram(log.histograms().get(key)));
      if (log_.before) former.push_back(formerOf(changes, key, jsonOfStatistics));
    }
    return {{"key", std::move(keys)},
            {"value", std::move(values)},
            {"metric", std::move(metrics)},
            {"entry", std::move(entries)},
            {"histogram", std::move(histograms)},
            {"former", std::move(former)}};
  }

  const PageSources& sources_;
  const PageLog& log_;
  bool sameWhitelist_ = false;
  SharedRows<const Metric*> metrics_;
  SharedRows<std::tuple<KeyKind, bool, std::string, std::string, std::string>> entries_;
  SharedRows<std::tuple<std::uint64_t, std::uint64_t, bool>> ranges_;
  SharedRows<std::string> groups_;
  std::vector<RoundingInverse> inverses_;  // one for each entry
  Json removed_ = Json::array();
};

}  // namespace

PageSources::PageSources(const ToolContext& tool)
    : context(tool),
      metrics(knownMetrics(tool)),
      file(loadWhitelistFile(*tool.platform)),
      whitelist(Whitelist::fromFile(*tool.platform, file)),
      submissionAllowed(tool.platform->crashReporting->isDiagnosticSubmissionEnabled()) {}

Json pageBlock(const PageSources& sources, const PageLog& log) {
  return BlockBuilder(sources, log).build();
}

}  // namespace tally::tools
