#include "config/metric_table.h"

#include <fmt/format.h>
#include <algorithm>
#include <cerrno>
#include <utility>

#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kMetrics = "Metrics", kKey = "Key", kPrefix = "Prefix", kType = "Type",
                           kUnit = "Unit", kDescription = "Description";
constexpr std::string_view kTypeNames[] = {"counter", "gauge", "distribution"};
// Of the texts, in bytes: they are shown beside every value.
constexpr std::size_t kLongestUnit = 32, kLongestDescription = 1024;

std::string_view textOf(const KvString* text) {
  return text != nullptr ? text->view() : std::string_view();
}

}  // namespace

std::span<const std::string_view> metricTypeNames() { return kTypeNames; }

std::string_view nameOf(MetricType type) { return kTypeNames[static_cast<std::size_t>(type)]; }

// Reads the entries of one file.
class MetricTable::Reader {
 public:
  Reader(MetricTable& table, const std::string& source, const MetricFaultHandler& onFault)
      : table_(table), source_(source), onFault_(onFault) {}

  void read(const KvArray& entries) {
    table_.keys_.reserve(entries.size());
    for (std::size_t i = 0; i < entries.size(); ++i) {
      place_ = fmt::format("entry {}", i + 1);
      if (const auto* const entry = entries.getAs<KvDictionary>(i)) {
        readEntry(*entry);
      } else {
        fault("is not a dictionary and is left out");
      }
    }
  }

 private:
  void fault(std::string_view what) { onFault_(fmt::format("{}: {} {}", source_, place_, what)); }

  void readEntry(const KvDictionary& entry) {
    const bool isPrefix = entry.contains(kPrefix);
    auto* const key = entry.getAs<KvString>(isPrefix ? kPrefix : kKey);
    if (key == nullptr || (!isPrefix && key->view().empty()) || entry.contains(kKey) == isPrefix) {
      return fault("has not exactly one of Key and Prefix, as a text, and is left out");
    }
    place_ += fmt::format(", {},", key->view());
    Metric metric{KvRef<KvString>::share(key), {}, {}, {}, source_};
    for (const auto& [name, value] : entry) readField(name->view(), *value, metric);
    table_.add(std::move(metric), isPrefix);
  }

  void readField(std::string_view name, const KvObject& value, Metric& metric) {
    if (name == kKey || name == kPrefix) return;
    const auto* const string = kvCast<KvString>(&value);
    const std::string_view text = textOf(string);
    if (name == kType) {
      const auto* const type = std::ranges::find(kTypeNames, text);
      if (type == std::end(kTypeNames)) {
        return fault(
            fmt::format("has a Type other than {}, which is ignored", fmt::join(kTypeNames, ", ")));
      }
      metric.type = static_cast<MetricType>(type - kTypeNames);
    } else if (name == kUnit) {
      readText(name, string, kLongestUnit, metric.unit);
    } else if (name == kDescription) {
      readText(name, string, kLongestDescription, metric.description);
    }
    // Other names are for other programs.
  }

  void readText(std::string_view name, const KvString* text, std::size_t longest,
                std::string& target) {
    if (text == nullptr || text->view().size() > longest) {
      return fault(fmt::format("has a {} that is not a text of at most {} bytes, which is ignored",
                               name, longest));
    }
    target = text->view();
  }

  MetricTable& table_;
  const std::string& source_;
  const MetricFaultHandler& onFault_;
  std::string place_;
};

void MetricTable::parse(std::string_view bytes, const std::string& source,
                        const MetricFaultHandler& onFault) {
  const auto value = decodePlist(bytes);
  if (!value) return onFault(fmt::format("{}: {}", source, value.error().message));
  const auto* const root = kvCast<KvDictionary>(value->get());
  const auto* const entries = root != nullptr ? root->getAs<KvArray>(kMetrics) : nullptr;
  if (entries == nullptr) {
    return onFault(fmt::format("{}: not a dictionary with an array {}", source, kMetrics));
  }
  files_.push_back(source);
  Reader(*this, source, onFault).read(*entries);
}

MetricTable MetricTable::load(const DeviceRoot& root, const MetricFaultHandler& onFault) {
  MetricTable table;
  const auto readOne = [&](const DeviceDirectory& directory, std::string_view name,
                           const std::string& source) {
    const auto bytes = directory.readFile(name, kPlistMaximumBytes);
    if (bytes) return table.parse(*bytes, source, onFault);
    if (bytes.error().systemError != ENOENT) onFault(bytes.error().message);
  };
  readOne(DeviceDirectory(root, std::string(kMetricsFolder)), kMetricsName,
          std::string(kMetricsName));
  const DeviceDirectory dropIns(root, fmt::format("{}/{}", kMetricsFolder, kMetricsDropIns));
  const auto names = dropIns.list();
  if (!names) onFault(names.error().message);
  for (const std::string& name : names ? *names : std::vector<std::string>()) {
    if (!name.ends_with(".plist")) continue;
    readOne(dropIns, name, fmt::format("{}/{}", kMetricsDropIns, name));
  }
  table.finish();
  return table;
}

void MetricTable::add(Metric metric, bool isPrefix) {
  (isPrefix ? prefixes_ : keys_).set(std::move(metric));
}

void MetricTable::finish() {
  prefixes_.buildPrefixIndex();
  struct Item {
    std::string_view text;
    std::optional<MetricType> type;
  };
  std::vector<Item> items;
  items.reserve(keyCount() + prefixCount());
  for (const auto* const table : {&keys_, &prefixes_}) {
    for (const Metric& metric : table->entries())
      items.push_back({metric.key->view(), metric.type});
  }
  std::ranges::sort(items, {}, &Item::text);
  sorted_.clear();
  Below sums;
  for (const Item& item : items) {
    sorted_.push_back({item.text, sums});
    ++sums.metrics;
    if (item.type) ++(isScalarType(*item.type) ? sums.scalars : sums.distributions);
  }
  sorted_.push_back({{}, sums});
}

MetricTable::Below MetricTable::below(std::string_view prefix) const {
  const auto end = sorted_.end() - 1;
  const auto first = std::lower_bound(
      sorted_.begin(), end, prefix,
      [](const Sorted& item, std::string_view wanted) { return item.text < wanted; });
  const auto last = std::partition_point(
      first, end, [prefix](const Sorted& item) { return item.text.starts_with(prefix); });
  return {last->before.metrics - first->before.metrics,
          last->before.scalars - first->before.scalars,
          last->before.distributions - first->before.distributions};
}

}  // namespace tally
