// The keys that the recorder refused lately, as it tells them.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {

struct RefusedKey {
  std::string key;
  std::optional<KeyKind> kind;  // empty: the recorder could not tell
  std::string_view meaning;     // why, a row's of kRefusals
};

// Those of the day, as far as the recorder remembers them; none when no recorder answers, or this
// user may not ask it.
std::vector<RefusedKey> refusedKeys(const DeviceRoot& root, std::int32_t day);

}  // namespace tally::tools
