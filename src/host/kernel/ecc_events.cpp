#include "host/kernel/ecc_events.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "base/number_text.h"
#include "host/kernel/daily_amounts.h"

namespace tally {
namespace {

constexpr std::string_view kNextEvent = "kern.next_ecc_event";
constexpr std::size_t kRecordSize = 72, kCountOffset = 1, kRegistersOffset = 8;
constexpr std::uint8_t kCounterWidth = 32;

}  // namespace

int EccEvents::readKernelValue(std::string_view name, std::span<std::byte> buffer,
                               std::size_t* length) {
  const int error = values_->readKernelValue(name, buffer, length);
  if (error != ENOENT || name != kNextEvent) return error;
  if (!looked_) findEvents();
  if (events_.empty()) return ENOENT;
  if (std::min(buffer.size(), *length) < kRecordSize) return ENOMEM;
  const Event event = events_.back();
  events_.pop_back();
  const std::int64_t registers[] = {event.corrected, event.uncorrected};
  std::fill_n(buffer.begin(), kRecordSize, std::byte{0});
  buffer[0] = std::byte{event.controller};
  buffer[kCountOffset] = std::byte{std::size(registers)};
  std::memcpy(buffer.data() + kRegistersOffset, registers, sizeof registers);
  *length = kRecordSize;
  return 0;
}

void EccEvents::findEvents() {
  looked_ = true;
  const std::string controllers = "/sys/devices/system/edac/mc/";
  const auto names = tree_->list(controllers);
  if (names.empty()) return;
  const std::string boot = tree_->text("/proc/sys/kernel/random/boot_id").value_or("");
  const auto states = store_->counterStates();
  // Nothing when the counter was never kept: since when it counts is not known. Events are read
  // once, by the sweep, so what is read is forwarded, and the counter is kept as of now.
  const auto riseOfCounter = [&](const std::string& name, const char* file, const char* channel) {
    const auto value = tree_->number(controllers + name + "/" + file);
    if (!value || *value < 0) return std::int64_t{0};
    const std::string key = eventKey("edac." + name + "." + channel);
    const auto kept = std::ranges::find(states, key, &CounterState::key);
    const CounterReading reading{static_cast<std::uint64_t>(*value), boot, kCounterWidth};
    store_->setCounterState({key, boot, reading.value, 0, store_->TBDaysSince1970(), {}});
    if (kept == states.end()) return std::int64_t{0};
    const std::uint64_t rise = kept->sum + riseOf(*kept, reading);
    return static_cast<std::int64_t>(std::min<std::uint64_t>(rise, INT64_MAX));
  };
  for (std::size_t i = names.size(); i-- > 0;) {
    const std::string& name = names[i];
    const auto number =
        parseInt64(std::string_view(name).substr(std::min<std::size_t>(2, name.size())));
    if (!name.starts_with("mc") || !number || *number < 0 || *number > UINT8_MAX) continue;
    const Event event{static_cast<std::uint8_t>(*number),
                      riseOfCounter(name, "ce_count", "corrected"),
                      riseOfCounter(name, "ue_count", "uncorrected")};
    if (event.corrected != 0 || event.uncorrected != 0) events_.push_back(event);
  }
}

}  // namespace tally
