// When a disk will have used its rated life, from the history of its wear.
#pragma once

#include <algorithm>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "platform/flash/wear_history.h"

namespace tally::tools {

// A figure with its uncertainty.
struct Estimate {
  double least = 0, likely = 0, most = 0;
};

struct WearForecast {
  std::size_t steps = 0;                     // changes of the percentage
  std::optional<Estimate> perDay;            // percent; needs two steps
  std::optional<Estimate> endDay;            // on which 100 % is reached, in days since 1970
  std::optional<double> bytesPerDay;         // written by the host
  std::optional<double> writeAmplification;  // bytes of the flash for each of the host
};

constexpr unsigned kRatedPercent = 100;

// The history that counts, with the row of now at its end: without days that are still to come, and
// since the percentage last fell, as that of another disk or another firmware would.
inline std::vector<WearRow> wearSeries(std::span<const WearRow> history, const WearRow& now) {
  std::vector<WearRow> series;
  const auto add = [&](const WearRow& row) {
    if (!series.empty() && row.used.least < series.back().used.least) series.clear();
    series.push_back(row);
  };
  for (const WearRow& row : history) {
    if (row.day < now.day) add(row);
  }
  add(now);
  return series;
}

inline void addTraffic(std::span<const WearRow> series, WearForecast& forecast) {
  const WearRow& now = series.back();
  const auto written = [&](auto member, const WearRow& since) -> std::optional<double> {
    if (!(now.*member) || !(since.*member) || *(now.*member) < *(since.*member)) return {};
    return static_cast<double>(*(now.*member) - *(since.*member));
  };
  const auto first =
      std::ranges::find_if(series, [](const WearRow& row) { return row.hostBytes.has_value(); });
  if (first == series.end()) return;
  const auto host = written(&WearRow::hostBytes, *first);
  if (host && now.day > first->day) forecast.bytesPerDay = *host / (now.day - first->day);
  const auto flash = written(&WearRow::flashBytes, *first);
  if (host && flash && *host > 0) {
    forecast.writeAmplification = *flash / *host;
  } else if (now.hostBytes && now.flashBytes && *now.hostBytes > 0) {  // of the whole life
    forecast.writeAmplification =
        static_cast<double>(*now.flashBytes) / static_cast<double>(*now.hostBytes);
  }
}

// At a step the percentage is the lower end of its range, some time after the row before. Now it
// may be anywhere in its range. So the life used since the first step, and the time it took, lie
// between two bounds each.
inline WearForecast forecastOf(std::span<const WearRow> series) {
  WearForecast forecast;
  if (series.empty()) return forecast;
  addTraffic(series, forecast);
  std::size_t first = 0, last = 0;
  for (std::size_t i = 1; i < series.size(); ++i) {
    if (series[i].used.least <= series[i - 1].used.least) continue;
    if (forecast.steps++ == 0) first = i;
    last = i;
  }
  if (forecast.steps < 2) return forecast;
  const WearRow& now = series.back();
  const double begin = series[first].used.least, used = now.used.least;
  // A percentage without a range is rounded down.
  const double above = std::max(now.used.most.value_or(now.used.least), now.used.least + 1);
  const double gained = used - begin;
  Estimate rate;
  rate.least = gained / (now.day - series[first - 1].day);
  rate.most = (above - begin) / (now.day - series[first].day);
  rate.likely = std::clamp(gained / (series[last].day - series[first].day), rate.least, rate.most);
  forecast.perDay = rate;
  if (used >= kRatedPercent) return forecast;
  Estimate end;
  end.least = now.day + std::max(0.0, kRatedPercent - above) / rate.most;
  end.most = now.day + (kRatedPercent - used) / rate.least;
  end.likely =
      std::clamp(series[last].day + (kRatedPercent - used) / rate.likely, end.least, end.most);
  forecast.endDay = end;
  return forecast;
}

}  // namespace tally::tools
