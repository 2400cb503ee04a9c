// Why the recorder did not record something, as it counts, shows and reports it.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <string_view>

#include "platform/tables/own_metrics.h"

namespace tally {

enum class Refusal : std::uint8_t {
  Malformed,
  Name,
  Value,
  Type,
  Set,
  SampleRate,
  Event,
  Owner,
  Permission,
  MetricsPerSecond,
  KeysOfUser,
  KeysOfDay,
  Memory,
  Truncated,
  LongLine,
  SocketOverflow,
  NoCredentials,
  Connections,
};

// One row each, in the order of the enumerators. The key is the day's scalar that counts them.
struct RefusalRow {
  std::string_view name, key, meaning;
};
inline constexpr RefusalRow kRefusals[] = {
    {"malformed", "vellum.tallyd.refused.malformed", "a line without a name, a value or a type"},
    {"name", "vellum.tallyd.refused.name",
     "a name that is empty, longer than 512 bytes, not UTF-8, or has control characters"},
    {"value", "vellum.tallyd.refused.value",
     "a value that is missing, not a finite number, or negative where a duration is meant"},
    {"type", "vellum.tallyd.refused.type", "a type that is not known"},
    {"set", "vellum.tallyd.refused.set", "a set (type s), which the store cannot hold"},
    {"sample_rate", "vellum.tallyd.refused.sample_rate", "a sample rate outside (0, 1]"},
    {"event", "vellum.tallyd.refused.event", "an event or a service check"},
    {"owner", "vellum.tallyd.refused.owner", "a key that another user recorded first that day"},
    {"permission", "vellum.tallyd.refused.permission", "a key that the user may not record"},
    {"metrics_per_second", "vellum.tallyd.refused.metrics_per_second",
     "more metrics than a user may send"},
    {"keys_of_user", "vellum.tallyd.refused.keys_of_user",
     "more keys than a user may record a day"},
    {"keys_of_day", "vellum.tallyd.refused.keys_of_day", "more keys than a day may have"},
    {"memory", "vellum.tallyd.refused.memory", "no memory left within the limit"},
    {"truncated", "vellum.tallyd.refused.truncated", "the rest of a datagram above 64 KiB"},
    {"long_line", "vellum.tallyd.refused.long_line", "a line of a stream above 64 KiB"},
    {"socket_overflow", "vellum.tallyd.refused.socket_overflow",
     "datagrams that the kernel dropped, the UDP socket's buffer being full"},
    {"no_credentials", "vellum.tallyd.refused.no_credentials",
     "datagrams whose sender the kernel does not name"},
    {"connections", "vellum.tallyd.refused.connections", "more connections than are served"},
};
static_assert(std::ranges::all_of(kRefusals, [](const RefusalRow& row) {
  return row.key.starts_with(kRefusalKeys);
}));
inline constexpr std::size_t kRefusalCount = std::size(kRefusals);
static_assert(kRefusalCount == std::size_t(Refusal::Connections) + 1);

using RefusalCounts = std::array<std::uint64_t, kRefusalCount>;

// What is counted beside refusals.
enum class RecorderCount : std::uint8_t {
  SamplesThinned,
  RatesBounded,
  ValuesClamped,
  SectionsSkipped,
  KeysOfTwoTypes,
  UndatedDropped,
  ChangesDropped,
  ClientMetricsDropped,
  ClientPacketsDropped,
  ClientBytesDropped,
};
inline constexpr RefusalRow kRecorderCounts[] = {
    {"samples_thinned", "vellum.tallyd.samples_thinned",
     "samples left out for lack of memory; those that remain count for them"},
    {"rates_bounded", "vellum.tallyd.rates_bounded",
     "metrics whose sample rate was below 0.000001 and is taken as that"},
    {"values_clamped", "vellum.tallyd.values_clamped", "scalars beyond 64 bits, kept at the end"},
    {"sections_skipped", "vellum.tallyd.sections_skipped",
     "unknown sections of lines that were recorded without them"},
    {"keys_of_two_types", "vellum.tallyd.keys_of_two_types", "keys recorded as two types in a day"},
    {"undated_dropped", "vellum.tallyd.undated_dropped",
     "changes recorded before the clock was set that nothing could date"},
    {"changes_dropped", "vellum.tallyd.changes_dropped",
     "changes of former days that took too much memory while the store could not be written"},
    {"client_metrics_dropped", "vellum.tallyd.client.metrics_dropped",
     "metrics that clients say they had to drop"},
    {"client_packets_dropped", "vellum.tallyd.client.packets_dropped",
     "packets that clients say they had to drop"},
    {"client_bytes_dropped", "vellum.tallyd.client.bytes_dropped",
     "bytes that clients say they had to drop"},
};
inline constexpr std::size_t kRecorderCountCount = std::size(kRecorderCounts);
// No count goes beyond what a scalar can hold.
constexpr std::uint64_t kMostCounted = std::numeric_limits<std::int64_t>::max();

using RecorderCounts = std::array<std::uint64_t, kRecorderCountCount>;
static_assert(kRecorderCountCount == std::size_t(RecorderCount::ClientBytesDropped) + 1);

}  // namespace tally
