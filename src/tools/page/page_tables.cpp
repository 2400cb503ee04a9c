#include "tools/page/page_tables.h"

#include <fmt/format.h>

#include <cmath>

#include "platform/platform.h"
#include "tools/page/page_words.h"

namespace tally::tools {

int PageTables::metricOf(std::string_view key) {
  const Metric* const metric = sources_.metrics.find(key);
  if (metric == nullptr) return kNone;
  return metrics_.numberOf(metric, [metric] {
    return Json({metric->type ? nameOf(*metric->type) : "", metric->unit, metric->description});
  });
}

int PageTables::groupOf(std::string_view group) {
  return groups_.numberOf(std::string(group), [&] {
    const OffSwitch off = groupSwitch(*sources_.context.platform, group);
    return Json({group, off.command, off.note});
  });
}

int PageTables::entryOf(const WhitelistMatch& match, KeyKind kind) {
  if (match.options == nullptr) return kNone;
  // Thousands of keys may be listed one by one: they share a row where the group and the options
  // are the same.
  const bool isListed = match.entry != nullptr;
  const std::string_view group = isListed ? match.group : "";
  const bool isPrefix = match.kind == WhitelistMatchKind::Prefix;
  const std::string_view prefix = isPrefix ? match.entry->key() : "";
  const std::string options = optionsText(*match.options);
  return entries_.numberOf({kind, isListed, std::string(group), std::string(prefix), options}, [&] {
    inverses_.emplace_back(*match.options);
    return Json({isListed ? groupOf(group) : kNone, isPrefix ? Json(prefix) : Json(nullptr),
                 kind == KeyKind::Scalar ? roundingWords(*match.options) : "", options});
  });
}

// [how far below the value the true one can be, how far above, whether with gaps].
int PageTables::rangeOf(std::int64_t value, int entry) {
  if (entry == kNone) return kNone;
  const auto found = inverses_[static_cast<std::size_t>(entry)].trueValues(value);
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

// [bits, days, range seen, different values, different reports, exposure of the entry].
int PageTables::revealOf(std::string_view key, KeyKind kind) {
  const KeyExposure* const found = sources_.privacy.find(key, kind);
  if (found == nullptr || !found->range.any) return kNone;
  Json row = {std::round(found->bits * 10) / 10, found->days,
              rangeText(found->range, kind),     distinctText(found->values),
              distinctText(found->reported),     exposureOf(found->entry)};
  const std::string identity = row.dump(-1, ' ', false, Json::error_handler_t::replace);
  return reveals_.numberOf(identity, [&row] { return std::move(row); });
}

// [[notes: how serious, text], [proposals]] of a whitelist entry.
int PageTables::exposureOf(std::uint32_t entry) {
  return exposures_.numberOf(entry, [&] {
    const EntryExposure& exposure = sources_.privacy.entries[entry];
    Json notes = Json::array(), proposals = Json::array();
    for (const PrivacyNote& note : exposure.notes) {
      // That numbers are exact is in every row; the others are surprises.
      const bool isPlain = note.concern == PrivacyConcern::ExactNumber ||
                           note.concern == PrivacyConcern::ExactExtremes;
      notes.push_back({!isPlain, fmt::format("{}: {}", rowOf(note.concern).meaning, note.detail)});
    }
    for (const PrivacyProposal& proposal : exposure.proposals) {
      proposals.push_back(fmt::format("{:.1f} bits with {}", proposal.bits, proposal.text));
    }
    return Json({std::move(notes), std::move(proposals)});
  });
}

int PageTables::reasonOf(const AbsenceReason& reason) {
  return reasons_.numberOf({reason.absence, reason.detail}, [&] {
    // The page shows the row's meaning, to which this detail adds nothing.
    const bool isPlain = reason.detail == "it is not listed";
    return Json({rowOf(reason.absence).name, isPlain ? "" : reason.detail});
  });
}

void PageTables::moveInto(Json& block) {
  block["metrics"] = metrics_.take();
  block["groups"] = groups_.take();
  block["entries"] = entries_.take();
  block["ranges"] = ranges_.take();
  block["reveals"] = reveals_.take();
  block["exposures"] = exposures_.take();
  block["reasons"] = reasons_.take();
}

}  // namespace tally::tools
