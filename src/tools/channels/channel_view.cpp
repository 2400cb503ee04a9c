#include "tools/channels/channel_view.h"

#include <algorithm>
#include <cmath>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "hwreport/channel.h"
#include "hwreport/descriptions.h"
#include "hwreport/values.h"
#include "platform/protocol/hub_protocol.h"
#include "tools/channels/channel_readings.h"

namespace tally::tools {
namespace {

constexpr std::size_t kBarWidth = 24;
constexpr std::size_t kElementIndent = 4;
constexpr std::uint64_t kSeconds = 0x0100000000000000;  // a unit word: seconds, unscaled
constexpr const char* kMissing = "missing";

std::string unitOf(KvDictionary& channel) { return textOf(HwReportChannelGetUnitLabel(&channel)); }

std::string withUnit(const std::string& number, KvDictionary& channel) {
  const std::string unit = unitOf(channel);
  return unit.empty() ? number : number + " " + unit;
}

std::string countText(std::uint64_t value) {
  const bool fits = value <= std::uint64_t{INT64_MAX};
  return fits ? integerText(static_cast<std::int64_t>(value)) : std::to_string(value);
}

Cell valueCell(std::optional<std::int64_t> value) {
  return value ? Cell(integerText(*value)) : Cell(kMissing, Ink::Doubtful);
}

Cell countCell(std::optional<std::uint64_t> value) {
  return value ? Cell(countText(*value)) : Cell(kMissing, Ink::Doubtful);
}

// In seconds if the unit is a time.
Cell residencyCell(const StateReading& state, KvDictionary& channel) {
  if (!state.residency) return Cell(kMissing, Ink::Doubtful);
  const std::uint64_t unit = HwReportChannelGetUnit(&channel);
  const double seconds = unit != kHwReportInvalidValue
                             ? HwReportScaleValue(*state.residency, unit, kSeconds)
                             : std::nan("");
  return std::isnan(seconds) ? withUnit(countText(*state.residency), channel)
                             : realText(seconds) + " s";
}

std::string rangeText(const BucketReading& bucket, std::size_t index) {
  if (!bucket.lower || !bucket.upper) return fmt::format("bucket {}", index);
  return integerText(*bucket.lower) + " to " + integerText(*bucket.upper);
}

Json hexadecimal(std::uint64_t word) {
  return word != kHwReportInvalidValue ? Json(fmt::format("{:#x}", word)) : Json();
}

Json jsonOfText(const KvString* text) { return text != nullptr ? Json(text->view()) : Json(); }

template <class T>
Json jsonOfOptional(std::optional<T> value) {
  return value ? Json(*value) : Json();
}

}  // namespace

ChannelPrinter::ChannelPrinter(const ToolContext& context, std::optional<double> seconds)
    : context_(context), seconds_(seconds), values_(emptyValues()) {}

Table ChannelPrinter::emptyValues() const {
  std::vector<Column> columns = {{"", Align::Left, true}, {"", Align::Right}, {""}};
  if (seconds_) columns.push_back({"", Align::Right});
  return Table(std::move(columns));
}

void ChannelPrinter::print(KvDictionary& channel) {
  printHeadings(channel);
  switch (HwReportChannelGetFormat(&channel)) {
    case kHwReportFormatSimple:
      return addValue(channel);
    case kHwReportFormatState:
      return printStates(channel);
    case kHwReportFormatHistogram:
      return printBuckets(channel);
    case kHwReportFormatSimpleArray:
      return printArray(channel);
    default:
      values_.add({channelName(channel), Cell("of a format that is not known", Ink::Doubtful)});
  }
}

void ChannelPrinter::printHeadings(const KvDictionary& channel) {
  const std::string driver = textOf(HwReportChannelGetDriverName(&channel));
  std::string group = textOf(HwReportChannelGetGroup(&channel));
  const std::string subgroup = textOf(HwReportChannelGetSubGroup(&channel));
  if (!subgroup.empty()) group += " / " + subgroup;
  if (driver == driver_ && group == group_) return;
  printValues();
  if (driver != driver_) printHeading(context_, driver);
  if (!group.empty()) printLine(context_, " " + group, Ink::Faint);
  driver_ = driver;
  group_ = group;
}

void ChannelPrinter::addValue(KvDictionary& channel) {
  const auto value = readSimple(channel);
  std::vector<Cell> row = {channelName(channel), valueCell(value), unitOf(channel)};
  if (seconds_ && value && *seconds_ > 0) {
    row.push_back({realText(static_cast<double>(*value) / *seconds_) + " a second", Ink::Faint});
  }
  values_.add(std::move(row));
}

void ChannelPrinter::printTitle(KvDictionary& channel) {
  printValues();
  printLine(context_, "  " + channelName(channel));
}

void ChannelPrinter::printTable(const Table& table) {
  tools::print(context_.out, table.render(context_.output, kElementIndent));
}

void ChannelPrinter::printStates(KvDictionary& channel) {
  printTitle(channel);
  Table table({{""}, {""}, {"", Align::Right}, {"", Align::Right}, {"", Align::Right}, {""}});
  for (const StateReading& state : readStates(channel)) {
    const bool known = !std::isnan(state.share);
    table.add({state.name, known ? Cell::bar(state.share, kBarWidth) : Cell(""),
               known ? fmt::format("{:.1f} %", state.share * 100) : "",
               residencyCell(state, channel), countCell(state.entries),
               std::string("entered") + (state.isCurrent ? ", now" : "")});
  }
  printTable(table);
}

// Leaves out empty buckets before the first and after the last that has hits.
void ChannelPrinter::printBuckets(KvDictionary& channel) {
  printTitle(channel);
  const auto buckets = readBuckets(channel);
  const auto isEmpty = [](const BucketReading& bucket) { return bucket.hits == std::uint64_t{0}; };
  const auto first = std::find_if_not(buckets.begin(), buckets.end(), isEmpty);
  if (first == buckets.end()) {
    return printLine(context_, std::string(kElementIndent, ' ') + "no hits", Ink::Faint);
  }
  const auto end = std::find_if_not(buckets.rbegin(), buckets.rend(), isEmpty).base();
  std::uint64_t most = 1;
  for (auto it = first; it != end; ++it) most = std::max(most, it->hits.value_or(0));
  const std::string unit = unitOf(channel);
  Table table({{"", Align::Right}, {""}, {"", Align::Right}, {""}});
  for (auto it = first; it != end; ++it) {
    const double share = static_cast<double>(it->hits.value_or(0)) / static_cast<double>(most);
    table.add({rangeText(*it, static_cast<std::size_t>(it - buckets.begin())),
               it->lower ? unit : "", countCell(it->hits), Cell::bar(share, kBarWidth)});
  }
  printTable(table);
}

void ChannelPrinter::printArray(KvDictionary& channel) {
  printTitle(channel);
  const auto values = readArray(channel);
  double most = 0;
  for (const auto& value : values) most = std::max(most, static_cast<double>(value.value_or(0)));
  Table table({{"", Align::Right}, {"", Align::Right}, {""}, {""}});
  for (std::size_t i = 0; i < values.size(); ++i) {
    const double share = most > 0 ? static_cast<double>(values[i].value_or(0)) / most : 0;
    table.add({fmt::format("[{}]", i), valueCell(values[i]), unitOf(channel),
               Cell::bar(share, kBarWidth)});
  }
  if (table.empty()) {
    return printLine(context_, std::string(kElementIndent, ' ') + "no values", Ink::Faint);
  }
  printTable(table);
}

void ChannelPrinter::printValues() {
  if (values_.empty()) return;
  values_.print(context_);
  values_ = emptyValues();
}

Json jsonOfChannel(KvDictionary& channel) {
  return {{"driver", jsonOfText(HwReportChannelGetDriverName(&channel))},
          {"driverID", hexadecimal(HwReportChannelGetDriverID(&channel))},
          {"name", jsonOfText(HwReportChannelGetChannelName(&channel))},
          {"id", hexadecimal(HwReportChannelGetChannelID(&channel))},
          {"format", formatName(HwReportChannelGetFormat(&channel))},
          {"categories", HwReportChannelGetCategories(&channel)},
          {"group", jsonOfText(HwReportChannelGetGroup(&channel))},
          {"subgroup", jsonOfText(HwReportChannelGetSubGroup(&channel))},
          {"unit", hexadecimal(HwReportChannelGetUnit(&channel))},
          {"unitLabel", jsonOfText(HwReportChannelGetUnitLabel(&channel))}};
}

void addDetails(Json& document, const KvDictionary& channel) {
  const KvDictionary* const details = channelDetails(channel);
  const auto textOfDetail = [&](std::string_view key) {
    return jsonOfText(details != nullptr ? details->getAs<KvString>(key) : nullptr);
  };
  const auto* const width = details != nullptr ? details->getAs<KvNumber>(kDetailWidth) : nullptr;
  document["semantics"] = textOfDetail(kDetailSemantics);
  document["scope"] = textOfDetail(kDetailScope);
  document["width"] = width != nullptr && width->asInt64() > 0 ? Json(width->asInt64()) : Json();
  document["file"] = textOfDetail(kDetailFile);
  document["description"] = textOfDetail(kDetailDescription);
}

std::string detailsText(const KvDictionary& channel) {
  Json details;
  addDetails(details, channel);
  std::vector<std::string> parts;
  for (const char* const key : {"description", "semantics", "file"}) {
    if (details[key].is_string()) parts.push_back(details[key].get<std::string>());
  }
  if (parts.empty()) return {};
  const Json& width = details["width"];
  if (width.is_number()) {
    parts.push_back(fmt::format("{} bits since {}", width.get<std::int64_t>(),
                                details["scope"].is_string() ? details["scope"].get<std::string>()
                                                             : std::string("a time unknown")));
  }
  return fmt::format("{}", fmt::join(parts, "; "));
}

Json jsonOfSample(KvDictionary& channel) {
  Json document = jsonOfChannel(channel);
  Json elements = Json::array();
  switch (HwReportChannelGetFormat(&channel)) {
    case kHwReportFormatSimple:
      document["value"] = jsonOfOptional(readSimple(channel));
      break;
    case kHwReportFormatState:
      for (const StateReading& state : readStates(channel)) {
        elements.push_back({{"name", state.name},
                            {"id", hexadecimal(state.id)},
                            {"entries", jsonOfOptional(state.entries)},
                            {"residency", jsonOfOptional(state.residency)},
                            {"share", std::isnan(state.share) ? Json() : Json(state.share)},
                            {"current", state.isCurrent}});
      }
      document["states"] = std::move(elements);
      break;
    case kHwReportFormatHistogram:
      for (const BucketReading& bucket : readBuckets(channel)) {
        elements.push_back({{"lower", jsonOfOptional(bucket.lower)},
                            {"upper", jsonOfOptional(bucket.upper)},
                            {"hits", jsonOfOptional(bucket.hits)},
                            {"minimum", jsonOfOptional(bucket.minimum)},
                            {"maximum", jsonOfOptional(bucket.maximum)},
                            {"sum", jsonOfOptional(bucket.sum)}});
      }
      document["buckets"] = std::move(elements);
      break;
    case kHwReportFormatSimpleArray:
      for (const auto& value : readArray(channel)) elements.push_back(jsonOfOptional(value));
      document["values"] = std::move(elements);
      break;
    default:
      break;
  }
  return document;
}

}  // namespace tally::tools
