#include "tools/storage/wear_view.h"

#include <fmt/core.h>

#include <nlohmann/json.hpp>

#include "base/time_text.h"
#include "tools/frame/table.h"
#include "tools/storage/nand_devices.h"
#include "tools/storage/wear_forecast.h"

namespace tally::tools {
namespace {

// Nobody plans further ahead.
constexpr double kFarthestYears = 100, kDaysOfYear = 365.25;

std::vector<WearRow> seriesOf(const ToolContext& context, const FlashDisk& disk) {
  MetricsStore& store = *context.platform->metricsStore;
  const auto now = wearRowOf(*disk.wear, store.TBDaysSince1970());
  if (!now) return {};
  const auto history =
      disk.identity.empty() ? std::vector<WearRow>() : store.wearHistory(disk.identity);
  return wearSeries(history, *now);
}

std::string endText(double day, std::int32_t today) {
  if (day - today > kFarthestYears * kDaysOfYear) {
    return fmt::format("more than {} years from now", kFarthestYears);
  }
  return dayText(static_cast<std::int32_t>(day));
}

void printSteps(const ToolContext& context, const std::vector<WearRow>& series) {
  constexpr std::size_t kMostRows = 12, kBarColumns = 40;
  std::vector<const WearRow*> shown;
  for (std::size_t i = 0; i < series.size(); ++i) {
    const bool isStep = i == 0 || series[i].used != series[i - 1].used;
    if (isStep || i + 1 == series.size()) shown.push_back(&series[i]);
  }
  if (shown.size() > kMostRows) shown.erase(shown.begin(), shown.end() - kMostRows);
  Table table({{""}, {"", Align::Right}, {""}});
  for (const WearRow* row : shown) {
    table.add(
        {dayText(row->day), rangeText(row->used),
         Cell::bar(std::min(row->used.least, kRatedPercent) / double{kRatedPercent}, kBarColumns)});
  }
  table.print(context);
}

void printForecast(const ToolContext& context, const WearForecast& forecast, const WearRow& now) {
  if (now.used.least >= kRatedPercent) {
    printLine(context, "The rated life is used up.", Ink::Bad);
  } else if (!forecast.perDay) {
    printLine(context, fmt::format("Not enough history for a forecast: {} of the 2 steps it needs.",
                                   forecast.steps));
  } else {
    const Estimate &rate = *forecast.perDay, &end = *forecast.endDay;
    printLine(context, fmt::format("{} to {} % a day, most likely {} %.", realText(rate.least),
                                   realText(rate.most), realText(rate.likely)));
    printLine(context, fmt::format("100 % is reached between {} and {}, most likely {}.",
                                   endText(end.least, now.day), endText(end.most, now.day),
                                   endText(end.likely, now.day)));
  }
  if (forecast.bytesPerDay) {
    const auto bytes = static_cast<std::uint64_t>(*forecast.bytesPerDay);
    printLine(context, byteText(bytes) + " are written to it a day.");
  }
  if (forecast.writeAmplification) {
    printLine(context, fmt::format("Each byte that is written to it is {} bytes of the flash.",
                                   realText(*forecast.writeAmplification)));
  }
}

Json estimateJson(const std::optional<Estimate>& estimate) {
  if (!estimate) return nullptr;
  return {{"least", estimate->least}, {"likely", estimate->likely}, {"most", estimate->most}};
}

}  // namespace

void printWear(const ToolContext& context, const FlashDisk& disk) {
  if (!disk.wear) return;
  const auto series = seriesOf(context, disk);
  if (series.empty()) return;  // of raw NAND the rated life is not known
  printHeading(context, "Wear over time, " + disk.name);
  printSteps(context, series);
  printForecast(context, forecastOf(series), series.back());
}

Json wearJson(const ToolContext& context, const FlashDisk& disk) {
  Json object = {{"device", disk.name}, {"history", Json::array()}};
  const auto series = disk.wear ? seriesOf(context, disk) : std::vector<WearRow>();
  for (const WearRow& row : series) {
    Json item = {{"day", row.day}, {"used", rangeJson(row.used)}};
    if (row.hostBytes) item["hostBytes"] = *row.hostBytes;
    if (row.flashBytes) item["flashBytes"] = *row.flashBytes;
    object["history"].push_back(std::move(item));
  }
  const WearForecast forecast = forecastOf(series);
  object["steps"] = forecast.steps;
  object["percentPerDay"] = estimateJson(forecast.perDay);
  object["endDay"] = estimateJson(forecast.endDay);
  if (forecast.bytesPerDay) object["bytesPerDay"] = *forecast.bytesPerDay;
  if (forecast.writeAmplification) object["writeAmplification"] = *forecast.writeAmplification;
  return object;
}

}  // namespace tally::tools
