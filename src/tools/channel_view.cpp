#include "tools/channel_view.h"

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>

#include "hwreport/channel.h"
#include "hwreport/descriptions.h"
#include "hwreport/values.h"
#include "tools/channel_filter.h"
#include "tools/table.h"

namespace tally::tools {
namespace {

constexpr std::size_t kBarWidth = 30;

std::string textOr(const KvString* text, std::string_view substitute) {
  return std::string(text != nullptr ? text->view() : substitute);
}

bool isMissing(std::int64_t value) {
  return static_cast<std::uint64_t>(value) == kHwReportInvalidValue;
}

std::string valueText(std::int64_t value) { return isMissing(value) ? "-" : integerText(value); }

Json valueJson(std::int64_t value) { return isMissing(value) ? Json() : Json(value); }
Json valueJson(std::uint64_t value) {
  return value == kHwReportInvalidValue ? Json() : Json(value);
}

std::string withUnit(std::string value, KvDictionary* channel) {
  const KvString* const unit = HwReportChannelGetUnitLabel(channel);
  return unit != nullptr && !unit->view().empty() ? value + " " + std::string(unit->view()) : value;
}

// Four to an element of the sample.
std::int32_t arraySize(const KvDictionary* channel) {
  const auto* raw = channel->getAs<KvData>("RawElements");
  constexpr std::size_t kElementSize = 64;
  return raw != nullptr ? static_cast<std::int32_t>(raw->bytes().size() / kElementSize * 4) : 0;
}

std::string stateName(KvDictionary* channel, std::int32_t index) {
  if (const KvString* name = HwReportStateGetNameForIndex(channel, index)) {
    return std::string(name->view());
  }
  return "state " + std::to_string(index);
}

std::string bucketName(KvDictionary* channel, std::int32_t index) {
  std::int64_t lower = 0, upper = 0;
  if (HwReportHistogramGetBucketBounds(channel, index, &lower, &upper) != 0) {
    return "bucket " + std::to_string(index);
  }
  return integerText(lower) + " to " + integerText(upper);
}

Table stateTable(const ToolContext& context, KvDictionary* channel) {
  Table table({{"state"},
               {"share", Align::Right},
               {""},
               {"residency", Align::Right},
               {"entered", Align::Right}});
  const std::int32_t current = HwReportStateGetCurrent(channel);
  for (std::int32_t i = 0; i < HwReportStateGetCount(channel); ++i) {
    const double share = HwReportStateGetDutyCycle(channel, i);
    const auto residency = static_cast<std::int64_t>(HwReportStateGetResidency(channel, i));
    const auto entered = static_cast<std::int64_t>(HwReportStateGetInTransitions(channel, i));
    table.add({Cell(stateName(channel, i), i == current ? Ink::Strong : Ink::Plain),
               Cell(std::isnan(share) ? "-" : fmt::format("{:.1f} %", share * 100)),
               Cell(std::isnan(share) ? "" : bar(context.output, share, kBarWidth)),
               Cell(withUnit(valueText(residency), channel)), Cell(valueText(entered))});
  }
  return table;
}

Table histogramTable(const ToolContext& context, KvDictionary* channel) {
  Table table({{"bucket", Align::Right},
               {"hits", Align::Right},
               {""},
               {"smallest", Align::Right},
               {"largest", Align::Right}});
  const std::int32_t count = HwReportHistogramGetBucketCount(channel);
  const auto hitsOf = [channel](std::int32_t i) {
    const std::uint64_t hits = HwReportHistogramGetBucketHits(channel, i);
    return hits == kHwReportInvalidValue ? 0.0 : static_cast<double>(hits);
  };
  double most = 1;
  for (std::int32_t i = 0; i < count; ++i) most = std::max(most, hitsOf(i));
  for (std::int32_t i = 0; i < count; ++i) {
    const auto hits = static_cast<std::int64_t>(HwReportHistogramGetBucketHits(channel, i));
    const bool seen = hitsOf(i) > 0;
    table.add(
        {Cell(bucketName(channel, i)), Cell(valueText(hits)),
         Cell(bar(context.output, hitsOf(i) / most, kBarWidth)),
         Cell(seen ? valueText(HwReportHistogramGetBucketMinValue(channel, i)) : std::string("-")),
         Cell(seen ? valueText(HwReportHistogramGetBucketMaxValue(channel, i))
                   : std::string("-"))});
  }
  return table;
}

Table arrayTable(KvDictionary* channel) {
  Table table({{"number", Align::Right}, {"value", Align::Right}});
  for (std::int32_t i = 0; i < arraySize(channel); ++i) {
    const std::int64_t value = HwReportArrayGetValueAtIndex(channel, i);
    if (!isMissing(value)) table.add({Cell(std::to_string(i)), Cell(valueText(value))});
  }
  return table;
}

Json statesJson(KvDictionary* channel) {
  Json states = Json::array();
  for (std::int32_t i = 0; i < HwReportStateGetCount(channel); ++i) {
    states.push_back({{"name", stateName(channel, i)},
                      {"entered", valueJson(HwReportStateGetInTransitions(channel, i))},
                      {"residency", valueJson(HwReportStateGetResidency(channel, i))},
                      {"share", jsonOfReal(HwReportStateGetDutyCycle(channel, i))}});
  }
  return states;
}

Json bucketsJson(KvDictionary* channel) {
  Json buckets = Json::array();
  for (std::int32_t i = 0; i < HwReportHistogramGetBucketCount(channel); ++i) {
    std::int64_t lower = 0, upper = 0;
    const bool bounded = HwReportHistogramGetBucketBounds(channel, i, &lower, &upper) == 0;
    buckets.push_back({{"lower", bounded ? Json(lower) : Json()},
                       {"upper", bounded ? Json(upper) : Json()},
                       {"hits", valueJson(HwReportHistogramGetBucketHits(channel, i))},
                       {"minimum", valueJson(HwReportHistogramGetBucketMinValue(channel, i))},
                       {"maximum", valueJson(HwReportHistogramGetBucketMaxValue(channel, i))},
                       {"sum", valueJson(HwReportHistogramGetBucketSum(channel, i))}});
  }
  return buckets;
}

std::string channelName(KvDictionary* channel) {
  return textOr(HwReportChannelGetChannelName(channel), "(no name)");
}

std::string placeOf(KvDictionary* channel) {
  std::string place = textOr(HwReportChannelGetDriverName(channel), "(no driver)");
  if (const KvString* group = HwReportChannelGetGroup(channel)) {
    place += ", " + std::string(group->view());
  }
  if (const KvString* subgroup = HwReportChannelGetSubGroup(channel)) {
    place += ", " + std::string(subgroup->view());
  }
  return place;
}

}  // namespace

Json channelIdentity(KvDictionary* channel) {
  const std::uint8_t format = HwReportChannelGetFormat(channel);
  return {{"driver", jsonOf(HwReportChannelGetDriverName(channel))},
          {"group", jsonOf(HwReportChannelGetGroup(channel))},
          {"subgroup", jsonOf(HwReportChannelGetSubGroup(channel))},
          {"id", HwReportChannelGetChannelID(channel)},
          {"name", jsonOf(HwReportChannelGetChannelName(channel))},
          {"format", formatName(format)},
          {"categories", HwReportChannelGetCategories(channel)},
          {"unit", jsonOf(HwReportChannelGetUnitLabel(channel))}};
}

Json sampledChannel(KvDictionary* channel) {
  Json result = channelIdentity(channel);
  switch (HwReportChannelGetFormat(channel)) {
    case kHwReportFormatSimple:
      result["value"] = valueJson(HwReportSimpleGetIntegerValue(channel));
      break;
    case kHwReportFormatState:
      result["states"] = statesJson(channel);
      break;
    case kHwReportFormatHistogram:
      result["buckets"] = bucketsJson(channel);
      break;
    case kHwReportFormatSimpleArray: {
      Json& values = result["values"] = Json::array();
      for (std::int32_t i = 0; i < arraySize(channel); ++i) {
        values.push_back(valueJson(HwReportArrayGetValueAtIndex(channel, i)));
      }
      break;
    }
    default:
      break;
  }
  return result;
}

void ChannelPrinter::add(KvDictionary* channel) {
  if (std::string place = placeOf(channel); place != place_) {
    finish();
    place_ = std::move(place);
    printHeading(context_, place_);
  }
  if (HwReportChannelGetFormat(channel) == kHwReportFormatSimple) {
    simple_.emplace_back(channelName(channel),
                         withUnit(valueText(HwReportSimpleGetIntegerValue(channel)), channel));
    return;
  }
  finish();
  printLine(context_, "  " + withUnit(channelName(channel), channel), Ink::Strong);
  switch (HwReportChannelGetFormat(channel)) {
    case kHwReportFormatState:
      stateTable(context_, channel).print(context_);
      break;
    case kHwReportFormatHistogram:
      histogramTable(context_, channel).print(context_);
      break;
    case kHwReportFormatSimpleArray:
      arrayTable(channel).print(context_);
      break;
    default:
      printLine(context_, "  of a format that nobody knows", Ink::Faint);
      break;
  }
}

void ChannelPrinter::finish() {
  if (simple_.empty()) return;
  Table table({{""}, {"", Align::Right}});
  for (const auto& [name, value] : simple_) table.add({Cell(name), Cell(value)});
  table.print(context_);
  simple_.clear();
}

}  // namespace tally::tools
