#include "recorder/key_rules.h"

#include <algorithm>

#include "base/utf8.h"
#include "recorder/statsd_line.h"

namespace tally {
namespace {

constexpr std::size_t kLongestName = 512;

struct ClientLossRow {
  std::string_view name;
  RecorderCount count;
};
constexpr ClientLossRow kClientLosses[] = {
    {"tallyclient.dropped", RecorderCount::ClientMetricsDropped},
    {"datadog.dogstatsd.client.metric_dropped_on_receive", RecorderCount::ClientMetricsDropped},
    // The sum of those lost in the client's queue and on the way, which it reports as well.
    {"datadog.dogstatsd.client.packets_dropped", RecorderCount::ClientPacketsDropped},
    {"datadog.dogstatsd.client.bytes_dropped", RecorderCount::ClientBytesDropped},
};

}  // namespace

bool isRecordableName(std::string_view name) {
  constexpr unsigned char kFirstPrintable = 0x20, kDelete = 0x7f;
  return !name.empty() && name.size() <= kLongestName && std::ranges::none_of(name, [](char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte < kFirstPrintable || byte == kDelete;
  }) && isValidUtf8(name);
}

std::string_view KeyRules::identityOf(std::string_view name, std::string_view tags,
                                      std::string& buffer) const {
  if (settings_.tags.empty() || tags.empty()) return name;
  buffer = name;
  for (const std::string& tag : settings_.tags) {
    if (const auto value = tagValue(tags, tag)) {
      buffer += ',';
      buffer += tag;
      buffer += '=';
      buffer += *value;
    }
  }
  return buffer;
}

std::string KeyRules::keyOf(std::string_view name, std::string_view identity) const {
  const auto renamed = settings_.rename.find(name);
  std::string key =
      renamed != settings_.rename.end() ? renamed->second : settings_.prefix + std::string(name);
  key += identity.substr(name.size());
  return key;
}

bool KeyRules::mayRecord(std::int64_t user, std::string_view key) const {
  const RecorderSettings::Users* users = nullptr;
  // Prefixes are in rising order, so that a longer one comes after those that it begins with.
  for (const auto& [prefix, allowed] : settings_.allow) {
    if (prefix > key) break;
    if (key.starts_with(prefix)) users = &allowed;
  }
  return users == nullptr || users->everybody || users->numbers.contains(user);
}

bool KeyRules::isDurable(std::string_view key) const {
  return std::ranges::any_of(settings_.durable,
                             [&](const std::string& prefix) { return key.starts_with(prefix); });
}

std::optional<RecorderCount> clientLossOf(std::string_view name) {
  const auto* const row = std::ranges::find(kClientLosses, name, &ClientLossRow::name);
  return row != std::end(kClientLosses) ? std::optional(row->count) : std::nullopt;
}

}  // namespace tally
