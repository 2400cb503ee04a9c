#include "tools/report/log_diff.h"

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>
#include <optional>

#include "base/natural_order.h"
#include "base/number_text.h"
#include "tools/frame/table.h"
#include "tools/report/log_view.h"

namespace tally::tools {
namespace {

constexpr std::string_view kParts[] = {"TBScalars", "TBDistributions", "TBDistributionsHistogram",
                                       "TBMetadata"};

// The document without the parts that are compared key by key.
KvRef<KvDictionary> besideParts(const DailyLog& log) {
  auto rest = KvDictionary::create();
  for (const auto& entry : log.document()) {
    const auto* part = std::ranges::find(kParts, entry.key->view());
    if (part == std::end(kParts)) rest->set(entry.key, entry.value);
  }
  return rest;
}

// After minus before; empty when either is missing or the difference has no 64 bits.
std::optional<std::int64_t> deltaOf(const Difference& difference) {
  const auto* before = kvCast<KvNumber>(difference.before);
  const auto* after = kvCast<KvNumber>(difference.after);
  std::int64_t delta = 0;
  if (before == nullptr || after == nullptr ||
      __builtin_sub_overflow(after->asInt64(), before->asInt64(), &delta)) {
    return std::nullopt;
  }
  return delta;
}

// Of a bucket, from its label: "(-90, -80]".
double lowerBoundOf(const Difference& bucket) {
  const std::string_view label = bucket.key;
  const std::size_t begin = std::min<std::size_t>(1, label.size());
  const double bound = parseDouble(label.substr(begin, label.find(',') - begin)).value_or(0);
  return std::isnan(bound) ? 0 : bound;
}

Cell signOf(const Difference& difference) {
  if (difference.before == nullptr) return {"+", Ink::Good};
  if (difference.after == nullptr) return {"-", Ink::Bad};
  return {"~", Ink::Doubtful};
}

std::string scalarText(const KvObject* value) {
  const auto* number = kvCast<KvNumber>(value);
  return value == nullptr    ? ""
         : number != nullptr ? integerText(number->asInt64())
                             : valueText(value);
}

std::string signedText(std::int64_t value) { return (value > 0 ? "+" : "") + integerText(value); }

// Prints a heading that counts the changes; false when there are none.
bool printPart(const ToolContext& context, std::string_view title,
               const std::vector<Difference>& found) {
  std::size_t added = 0;
  std::size_t removed = 0;
  for (const Difference& difference : found) {
    added += difference.before == nullptr;
    removed += difference.after == nullptr;
  }
  if (found.empty()) {
    printHeading(context, fmt::format("{}: the same", title));
    return false;
  }
  printHeading(context, fmt::format("{}: {} added, {} removed, {} changed", title, added, removed,
                                    found.size() - added - removed));
  return true;
}

void printScalarDiff(const ToolContext& context, const DailyLog& before, const DailyLog& after) {
  const auto found = differences(before.scalars(), after.scalars());
  if (!printPart(context, "Scalars", found)) return;
  Table table({{""},
               {"key", Align::Left, true},
               {"before", Align::Right},
               {"after", Align::Right},
               {"delta", Align::Right}});
  for (const Difference& difference : found) {
    const auto delta = deltaOf(difference);
    table.add({signOf(difference), difference.key, scalarText(difference.before),
               scalarText(difference.after), delta ? signedText(*delta) : ""});
  }
  table.print(context);
}

void printDistributionDiff(const ToolContext& context, const DailyLog& before,
                           const DailyLog& after) {
  const auto found = differences(before.distributions(), after.distributions());
  if (!printPart(context, "Distributions", found)) return;
  Table table({{""},
               {"key", Align::Left, true},
               {"count", Align::Right},
               {"min", Align::Right},
               {"mean", Align::Right},
               {"std dev", Align::Right},
               {"max", Align::Right}});
  for (const Difference& difference : found) {
    Cell sign = signOf(difference);
    std::string key = difference.key;
    for (const KvObject* value : {difference.before, difference.after}) {
      if (value == nullptr) continue;
      const bool isLatter = value == difference.after && difference.before != nullptr;
      std::vector<Cell> row{isLatter ? Cell("") : sign, isLatter ? Cell("") : Cell(key)};
      if (const auto statistics = statisticsOf(value)) {
        for (const std::string& text :
             {integerText(statistics->count), realText(statistics->minimum),
              realText(statistics->mean), realText(statistics->standardDeviation()),
              realText(statistics->maximum)}) {
          row.emplace_back(text,
                           difference.before != nullptr && difference.after != nullptr && !isLatter
                               ? Ink::Faint
                               : Ink::Plain);
        }
      } else {
        row.emplace_back("damaged", Ink::Bad);
      }
      table.add(std::move(row));
    }
  }
  table.print(context);
}

void printHistogramDiff(const ToolContext& context, const DailyLog& before, const DailyLog& after) {
  const auto found = differences(before.histograms(), after.histograms());
  if (!printPart(context, "Histograms", found)) return;
  static const KvRef<KvDictionary> kEmpty = KvDictionary::create();
  const auto histogram = [](const KvObject* value) -> const KvDictionary& {
    const auto* dictionary = kvCast<KvDictionary>(value);
    return dictionary != nullptr ? *dictionary : *kEmpty;
  };
  for (const Difference& difference : found) {
    Table title({{""}, {"", Align::Left, true}});
    title.add({signOf(difference), difference.key});
    title.print(context);
    Table table({{"", Align::Right},
                 {"before", Align::Right},
                 {"after", Align::Right},
                 {"delta", Align::Right}});
    auto buckets = differences(histogram(difference.before), histogram(difference.after));
    std::ranges::stable_sort(buckets, {}, lowerBoundOf);
    for (const Difference& bucket : buckets) {
      const auto delta = deltaOf(bucket);
      table.add({bucket.key, scalarText(bucket.before), scalarText(bucket.after),
                 delta ? signedText(*delta) : ""});
    }
    print(context.out, table.render(context.output, 6));
  }
}

void printTextDiff(const ToolContext& context, std::string_view title,
                   const std::vector<Difference>& found) {
  if (!printPart(context, title, found)) return;
  Table table({{""},
               {"key", Align::Left, true},
               {"before", Align::Left, true},
               {"after", Align::Left, true}});
  for (const Difference& difference : found) {
    const auto text = [](const KvObject* value) {
      return value != nullptr ? valueText(value) : std::string();
    };
    table.add(
        {signOf(difference), difference.key, text(difference.before), text(difference.after)});
  }
  table.print(context);
}

Json jsonOfPart(const std::vector<Difference>& found, bool withDelta) {
  Json added = Json::object();
  Json removed = Json::object();
  Json changed = Json::object();
  for (const Difference& difference : found) {
    if (difference.before == nullptr) {
      addMember(added, difference.key, jsonOf(difference.after));
    } else if (difference.after == nullptr) {
      addMember(removed, difference.key, jsonOf(difference.before));
    } else {
      Json change = {{"before", jsonOf(difference.before)}, {"after", jsonOf(difference.after)}};
      const auto delta = withDelta ? deltaOf(difference) : std::nullopt;
      if (delta) change["delta"] = *delta;
      addMember(changed, difference.key, std::move(change));
    }
  }
  return {{"added", added}, {"removed", removed}, {"changed", changed}};
}

}  // namespace

std::vector<Difference> differences(const KvDictionary& before, const KvDictionary& after) {
  std::vector<Difference> found;
  for (const auto& entry : before) {
    const KvObject* now = after.get(entry.key->view());
    if (!kvEqual(entry.value.get(), now)) {
      found.push_back({std::string(entry.key->view()), entry.value.get(), now});
    }
  }
  for (const auto& entry : after) {
    if (!before.contains(entry.key->view())) {
      found.push_back({std::string(entry.key->view()), nullptr, entry.value.get()});
    }
  }
  std::ranges::sort(found, naturalLess, &Difference::key);
  return found;
}

void printLogDiff(const ToolContext& context, const DailyLog& before, const DailyLog& after) {
  printScalarDiff(context, before, after);
  printDistributionDiff(context, before, after);
  printHistogramDiff(context, before, after);
  printTextDiff(context, "Metadata", differences(before.metadata(), after.metadata()));
  const auto restBefore = besideParts(before);
  const auto restAfter = besideParts(after);
  printTextDiff(context, "Document", differences(*restBefore, *restAfter));
}

Json jsonOfLogDiff(const DailyLog& before, const DailyLog& after) {
  const auto restBefore = besideParts(before);
  const auto restAfter = besideParts(after);
  return {
      {"scalars", jsonOfPart(differences(before.scalars(), after.scalars()), true)},
      {"distributions",
       jsonOfPart(differences(before.distributions(), after.distributions()), false)},
      {"histograms", jsonOfPart(differences(before.histograms(), after.histograms()), false)},
      {"metadata", jsonOfPart(differences(before.metadata(), after.metadata()), false)},
      {"document", jsonOfPart(differences(*restBefore, *restAfter), false)},
  };
}

}  // namespace tally::tools
