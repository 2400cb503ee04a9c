#include "tools/whitelist/refused_keys.h"

#include <algorithm>
#include <chrono>
#include <iterator>

#include "host/ingress/recorder_client.h"
#include "kv/plist_codec.h"
#include "recorder/refusal.h"

namespace tally::tools {
namespace {

std::optional<KeyKind> kindOfName(std::optional<std::string_view> name) {
  for (const KeyKind kind : {KeyKind::Scalar, KeyKind::Distribution}) {
    if (name == kindName(kind)) return kind;
  }
  return std::nullopt;
}

}  // namespace

std::vector<RefusedKey> refusedKeys(const DeviceRoot& root, std::int32_t day) {
  constexpr std::chrono::seconds kPatience{2};
  const auto answer = askRecorder(root, "status", kPatience);
  if (!answer) return {};
  const auto value = decodePlist(*answer);
  const auto* const status = value ? kvCast<KvDictionary>(value->get()) : nullptr;
  const auto* const rows = status != nullptr ? status->getAs<KvArray>("refused_keys") : nullptr;
  std::vector<RefusedKey> keys;
  for (std::size_t i = 0; rows != nullptr && i < rows->size(); ++i) {
    const auto* const row = rows->getAs<KvDictionary>(i);
    if (row == nullptr || row->getInt64("day") != day) continue;
    const auto key = row->getString("key");
    const auto* const reason =
        std::ranges::find(kRefusals, row->getString("reason").value_or(""), &RefusalRow::name);
    if (!key || reason == std::end(kRefusals)) continue;
    keys.push_back({std::string(*key), kindOfName(row->getString("kind")), reason->meaning});
  }
  return keys;
}

}  // namespace tally::tools
