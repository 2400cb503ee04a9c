// What is known of metrics: their types, units and meanings, as property lists beside the whitelist
// give them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "config/key_table.h"
#include "kv/value.h"

namespace tally {

// The table of the device, and the directory of those that packages bring.
inline constexpr std::string_view kMetricsFolder = "/Library/Application Support/Tallybook";
inline constexpr std::string_view kMetricsName = "Metrics.plist";
inline constexpr std::string_view kMetricsDropIns = "Metrics.d";

enum class MetricType : std::uint8_t { Counter, Gauge, Distribution };
// The types' names in a table, in the order of MetricType.
std::span<const std::string_view> metricTypeNames();
std::string_view nameOf(MetricType type);
// Counters and gauges are scalars of the store.
constexpr bool isScalarType(MetricType type) { return type != MetricType::Distribution; }

// One entry. What it does not say is empty.
struct Metric {
  KvRef<KvString> key;  // the whole key, or a prefix
  std::optional<MetricType> type;
  std::string unit, description;
  std::string source;  // the table that it is from, for messages
};

// Receives what is wrong with a table, in words that name the file and the entry.
using MetricFaultHandler = std::function<void(const std::string& message)>;

inline std::string_view keyText(const Metric& metric) { return metric.key->view(); }

class MetricTable {
 public:
  // Reads Metrics.plist, then the files of Metrics.d in the order of their names; a later entry
  // replaces an earlier one of the same key. A missing file is an empty one. What is malformed is
  // reported and left out, the rest is used.
  static MetricTable load(const DeviceRoot& root, const MetricFaultHandler& onFault);

  // Adds the entries of one file.
  void parse(std::string_view bytes, const std::string& source, const MetricFaultHandler& onFault);
  void add(Metric metric, bool isPrefix);
  // Must be called after the last addition and before any question.
  void finish();

  // The metric of this whole key; null if there is none.
  const Metric* exact(std::string_view key) const { return keys_.exact(key); }
  // The longest prefix that the key begins with; null if there is none.
  const Metric* prefixOf(std::string_view key) const { return prefixes_.longestPrefix(key); }
  const Metric* find(std::string_view key) const {
    const Metric* const metric = exact(key);
    return metric != nullptr ? metric : prefixOf(key);
  }
  // How many whole keys and prefixes begin with the text, and how many of them are known to be
  // scalars or distributions. Takes logarithmic time.
  struct Below {
    std::size_t metrics = 0, scalars = 0, distributions = 0;
  };
  Below below(std::string_view prefix) const;

  std::size_t keyCount() const { return keys_.entries().size(); }
  std::size_t prefixCount() const { return prefixes_.entries().size(); }
  bool empty() const { return keyCount() == 0 && prefixCount() == 0; }
  // The files that were used.
  const std::vector<std::string>& files() const { return files_; }

 private:
  class Reader;
  struct Sorted {
    std::string_view text;
    Below before;  // of the entries before it
  };
  KeyTable<Metric> keys_, prefixes_;
  std::vector<Sorted> sorted_ =
      std::vector<Sorted>(1);  // keys and prefixes; one more at the end, for the sums
  std::vector<std::string> files_;
};

}  // namespace tally
