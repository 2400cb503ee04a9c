#include "host/kernel/findings.h"

#include <algorithm>

namespace tally {

std::uint32_t Findings::addFile(KernelSource source, std::string path, FileParser parse,
                                FileLayout layout) {
  files_.push_back({std::move(path), source, parse, std::move(layout)});
  return static_cast<std::uint32_t>(files_.size() - 1);
}

void Findings::addSimple(std::span<const ChannelRow> rows, const FoundDevice& device,
                         std::uint32_t file, std::uint32_t firstField) {
  for (const ChannelRow& row : rows) {
    addChannel({&row, device, 1, {{file, firstField++}}, {}});
  }
}

void Findings::addNumbers(const SystemTree& tree, const std::string& directory,
                          std::span<const ChannelRow> rows, const FoundDevice& device,
                          FileParser parse) {
  for (const ChannelRow& row : rows) {
    const std::string path = directory + "/" + std::string(fileName(row.file));
    if (!tree.exists(path)) continue;
    addChannel({&row, device, 1, {{addFile(row.source, path, parse, {{""}, 1}), 0}}, {}});
  }
}

void Findings::addArray(const ChannelRow& row, const FoundDevice& device, std::uint32_t file,
                        std::uint32_t firstField, std::size_t count, std::string item) {
  constexpr std::size_t kMostElements = UINT16_MAX;
  count = std::min(count, kMostElements * element::kSlotCount);
  FoundChannel channel{&row, device, 0, {}, {}, std::move(item)};
  channel.elements =
      static_cast<std::uint16_t>((count + element::kSlotCount - 1) / element::kSlotCount);
  if (count == 0) return;
  for (std::size_t i = 0; i < count; ++i) {
    channel.slots.push_back({file, firstField + static_cast<std::uint32_t>(i),
                             static_cast<std::uint16_t>(i / element::kSlotCount),
                             static_cast<std::uint16_t>(i % element::kSlotCount)});
  }
  addChannel(std::move(channel));
}

void Findings::addResidencies(const ChannelRow& row, const FoundDevice& device, std::string path,
                              FileParser parse, FileLayout layout) {
  constexpr std::size_t kMostStates = 4096;
  if (layout.labels.size() > kMostStates) layout.labels.resize(kMostStates);
  FoundChannel channel{&row, device, static_cast<std::uint16_t>(layout.labels.size()), {}, {}};
  if (channel.elements == 0) return;
  const std::size_t columns = layout.columns;
  for (std::uint16_t i = 0; i < channel.elements; ++i) {
    channel.constants.push_back({i, state_slot::kID, stateID(layout.labels[i])});
    channel.slots.push_back({static_cast<std::uint32_t>(files_.size()),
                             static_cast<std::uint32_t>(i * columns), i, state_slot::kResidency});
  }
  addFile(row.source, std::move(path), parse, std::move(layout));
  addChannel(std::move(channel));
}

std::uint64_t stateID(std::string_view name) {
  std::uint64_t id = 0;
  int left = 8;
  for (const char letter : name) {
    if (letter < ' ' || letter > '~' || left == 0) continue;
    id = id << 8 | static_cast<unsigned char>(letter);
    --left;
  }
  return id;
}

}  // namespace tally
