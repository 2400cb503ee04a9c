// The settings of the recorder that are numbers, and the names of the others: one row each. The
// recorder, its documents and its tests read this table.
#pragma once

#include <cstdint>
#include <string_view>

namespace tally {

// The domain of the settings, whose drop-ins lie in the directory of this name with ".d".
inline constexpr std::string_view kRecorderDomain = "tallyd";

enum class RecorderNumber : std::uint8_t {
  CommitInterval,
  MemoryLimit,
  MetricsPerSecond,
  KeysOfUser,
  KeysOfDay,
};

struct RecorderNumberRow {
  std::string_view name;
  std::int64_t fallback, least, most;
  std::string_view meaning;
};
// In the order of the enumerators.
inline constexpr RecorderNumberRow kRecorderNumbers[] = {
    {"CommitInterval", 900, 1, 86400,
     "seconds after which what was recorded is committed to the store; a crash loses at most that"},
    {"MemoryLimit", 32 << 20, 8 << 20, 1 << 30, "bytes of memory that the recorder may take"},
    {"MetricsPerSecond", 100'000, 1, 1'000'000'000,
     "metrics a second that a user may send, averaged over ten minutes"},
    {"KeysPerUser", 10'000, 1, 1'000'000, "keys that a user may record a day"},
    {"KeysPerDay", 20'000, 1, 1'000'000, "keys that all users may record a day"},
};

struct RecorderTextRow {
  std::string_view name, form, meaning;
};
inline constexpr std::string_view kSettingPrefix = "Prefix", kSettingRename = "Rename",
                                  kSettingTags = "Tags", kSettingDurable = "Durable",
                                  kSettingAllow = "Allow";
inline constexpr RecorderTextRow kRecorderTexts[] = {
    {kSettingPrefix, "text", "is put before every name"},
    {kSettingRename, "dictionary of texts", "the key of a name, which then gets no prefix"},
    {kSettingTags, "array of texts",
     "tags that become part of the key, as `NAME,TAG=VALUE`, in this order; none without it"},
    {kSettingDurable, "array of texts", "keys that begin so are committed at once"},
    {kSettingAllow, "dictionary of arrays of texts",
     "the users (names, numbers, `*`, `anonymous`) who may record keys that begin so; of several "
     "rows the longest decides, keys without a row are free"},
};

}  // namespace tally
