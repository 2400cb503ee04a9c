#include "tools/privacy/privacy_view.h"

#include <fmt/format.h>
#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>

#include "base/time_text.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

std::string bitsText(double bits) {
  constexpr double kMany = 1000;
  return bits < kMany ? fmt::format("{:.1f}", bits) : integerText(std::llround(bits));
}

// Two decimals are more than the ranges are worth.
double jsonBits(double bits) { return std::round(bits * 100) / 100; }

Json jsonOfRange(const SeenRange& range, KeyKind kind) {
  if (!range.any) return nullptr;
  if (kind == KeyKind::Scalar) return {{"lowest", range.lowest}, {"highest", range.highest}};
  return {{"lowest", jsonOfReal(range.minimum)}, {"highest", jsonOfReal(range.maximum)}};
}

Json jsonOfDistinct(const DistinctCount& distinct) {
  return {{"count", distinct.count}, {"more", distinct.more}};
}

Json jsonOfEntry(const EntryExposure& entry) {
  Json notes = Json::array(), proposals = Json::array();
  for (const PrivacyNote& note : entry.notes) {
    notes.push_back(
        {{"concern", rowOf(note.concern).name}, {"count", note.count}, {"detail", note.detail}});
  }
  const auto orNull = [](const std::optional<double>& error) {
    return error ? jsonOfReal(*error) : Json(nullptr);
  };
  for (const PrivacyProposal& proposal : entry.proposals) {
    proposals.push_back({{"options", jsonOf(proposal.options.get())},
                         {"bits", jsonBits(proposal.bits)},
                         {"relativeError", orNull(proposal.relativeError)},
                         {"absoluteError", orNull(proposal.absoluteError)},
                         {"text", proposal.text}});
  }
  return {{"group", entry.group},
          {"section", sectionName(entry.section)},
          {"entry", entry.entry},
          {"options", jsonOf(entry.options.get())},
          {"keys", entry.keys},
          {"range", jsonOfRange(entry.range, entry.kind())},
          {"bits", jsonBits(entry.bits)},
          {"mostBits", jsonBits(entry.mostBits)},
          {"values", jsonOfDistinct(entry.values)},
          {"reported", jsonOfDistinct(entry.reported)},
          {"notes", std::move(notes)},
          {"proposals", std::move(proposals)}};
}

Json jsonOfKey(const KeyExposure& key, const PrivacyReport& report) {
  const EntryExposure& entry = report.entries[key.entry];
  Json json = {{"key", key.key},
               {"kind", kindName(key.kind)},
               {"group", entry.group},
               {"entry", entry.entry},
               {"days", key.days},
               {"range", jsonOfRange(key.range, key.kind)},
               {"bits", jsonBits(key.bits)},
               {"values", jsonOfDistinct(key.values)},
               {"reported", jsonOfDistinct(key.reported)}};
  if (key.kind == KeyKind::Distribution) json["mostSamples"] = key.mostSamples;
  return json;
}

std::string entryText(const EntryExposure& entry) {
  if (entry.group.empty() && entry.entry.empty()) return "what no entry admits";
  return fmt::format("{}{}, {} ({})", entry.entry, isPrefixSection(entry.section) ? "*" : "",
                     optionsText(*entry.options), entry.group);
}

void addEntry(Table& table, const EntryExposure& entry) {
  const bool seen = entry.range.any;
  table.add({Cell(seen ? bitsText(entry.bits) : "-", Ink::Strong), integerText(entry.keys),
             rangeText(entry.range, entry.kind()), seen ? distinctText(entry.values) : "-",
             seen ? distinctText(entry.reported) : "-", entryText(entry)});
}

void printNotes(const ToolContext& context, const EntryExposure& entry) {
  if (entry.notes.empty() && entry.proposals.empty()) return;
  printLine(context, "  " + entryText(entry), Ink::Strong);
  for (const PrivacyNote& note : entry.notes) {
    const bool isEntry = note.detail == entry.entry;  // said in the line above
    printLine(context, fmt::format("    {}{}", rowOf(note.concern).meaning,
                                   isEntry ? "" : ": " + note.detail));
  }
  for (const PrivacyProposal& proposal : entry.proposals) {
    printLine(context, fmt::format("    {} bits with {}", bitsText(proposal.bits), proposal.text),
              Ink::Faint);
  }
}

}  // namespace

Json jsonOf(const PrivacyReport& report) {
  Json entries = Json::array(), keys = Json::array();
  for (const EntryExposure& entry : report.entries) entries.push_back(jsonOfEntry(entry));
  for (const KeyExposure& key : report.keys) keys.push_back(jsonOfKey(key, report));
  const auto orNull = [](const std::optional<std::int32_t>& day) {
    return day ? Json(*day) : Json(nullptr);
  };
  return {{"bits", jsonBits(report.bits)},
          {"firstDay", orNull(report.firstDay)},
          {"lastDay", orNull(report.lastDay)},
          {"entries", std::move(entries)},
          {"keys", std::move(keys)}};
}

void printPrivacy(const ToolContext& context, const PrivacyReport& report) {
  constexpr std::size_t kMostShown = 100;
  printHeading(context, "What it can reveal");
  printLine(
      context,
      fmt::format("  at most {} bits a day, of {}{}", bitsText(report.bits),
                  counted(report.keys.size(), "key"),
                  report.firstDay ? fmt::format(", by what was recorded from {} to {}",
                                                dayText(*report.firstDay), dayText(*report.lastDay))
                                  : "; nothing that it admits has been recorded"));
  Table table({{"bits", Align::Right},
               {"keys", Align::Right},
               {"seen"},
               {"values", Align::Right},
               {"reported", Align::Right},
               {"entry", Align::Left, /*shrinks=*/true}});
  const std::size_t shown = std::min(report.entries.size(), kMostShown);
  for (std::size_t i = 0; i < shown; ++i) addEntry(table, report.entries[i]);
  if (!table.empty()) table.print(context);
  if (shown < report.entries.size()) {
    printLine(context, fmt::format("  {} more, which reveal less: --json",
                                   counted(report.entries.size() - shown, "entry")));
  }
  const auto isRemarkable = [](const EntryExposure& entry) {
    return !entry.notes.empty() || !entry.proposals.empty();
  };
  if (std::ranges::none_of(report.entries, isRemarkable)) return;
  printHeading(context, "Remarks and coarser options");
  for (std::size_t i = 0; i < shown; ++i) printNotes(context, report.entries[i]);
}

}  // namespace tally::tools
