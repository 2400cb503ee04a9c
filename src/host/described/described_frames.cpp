#include "host/described/described_frames.h"

#include <algorithm>
#include <limits>
#include <string_view>

namespace tally {
namespace {

// The element count of a type word is 16 bits wide.
constexpr std::size_t kMostElements = std::numeric_limits<std::uint16_t>::max();

constexpr struct {
  std::string_view key;
  std::size_t slot;
} kSlotNames[] = {{"ID", state_slot::kID},
                  {"InTransitions", state_slot::kInTransitions},
                  {"Residency", state_slot::kResidency},
                  {"Hits", bucket_slot::kHits},
                  {"Minimum", bucket_slot::kMinimum},
                  {"Maximum", bucket_slot::kMaximum},
                  {"Sum", bucket_slot::kSum}};

// A slot may be signed; a real gives its integer part, as in a legend.
std::uint64_t slotOf(const KvNumber& number) {
  const bool isNegativeReal = number.isReal() && number.asDouble() < 0;
  return isNegativeReal ? static_cast<std::uint64_t>(number.asInt64()) : number.asUInt64();
}

// A state's id may be given as its name of up to eight characters.
std::optional<std::uint64_t> slotValue(const KvObject& value) {
  if (const auto* number = kvCast<KvNumber>(&value)) return slotOf(*number);
  const auto* text = kvCast<KvString>(&value);
  if (text == nullptr || text->view().empty() || text->view().size() > 8) return std::nullopt;
  std::uint64_t id = 0;
  for (const char character : text->view()) id = id << 8 | static_cast<unsigned char>(character);
  return id;
}

std::optional<ElementValues> parseElement(const KvDictionary& description) {
  ElementValues element;
  element.time = static_cast<std::uint64_t>(description.getInt64("Time").value_or(0));
  for (const auto& [key, slot] : kSlotNames) {
    const KvObject* const value = description.get(key);
    if (value == nullptr) continue;
    const auto number = slotValue(*value);
    if (!number) return std::nullopt;
    element.slots[slot] = *number;
  }
  return element;
}

std::optional<std::vector<ElementValues>> parseElements(const KvArray& items) {
  std::vector<ElementValues> elements;
  std::size_t numbers = 0;
  for (const auto& item : items) {
    if (const auto* number = kvCast<KvNumber>(item.get())) {
      const std::size_t slot = numbers++ % element::kSlotCount;
      if (slot == 0) elements.emplace_back();
      elements.back().slots[slot] = slotOf(*number);
    } else if (const auto* dictionary = kvCast<KvDictionary>(item.get())) {
      const auto element = parseElement(*dictionary);
      if (!element) return std::nullopt;
      elements.push_back(*element);
    } else {
      return std::nullopt;
    }
  }
  if (elements.empty() || elements.size() > kMostElements) return std::nullopt;
  return elements;
}

std::optional<std::vector<ElementValues>> parseFrame(const KvObject& frame) {
  if (const auto* number = kvCast<KvNumber>(&frame)) {
    ElementValues simple;
    simple.slots[simple_slot::kValue] = slotOf(*number);
    return std::vector{simple};
  }
  const auto* items = kvCast<KvArray>(&frame);
  return items != nullptr ? parseElements(*items) : std::nullopt;
}

}  // namespace

std::optional<ChannelFrames> parseChannelFrames(const KvDictionary& description) {
  ChannelFrames channel;
  channel.type = static_cast<std::uint64_t>(description.getInt64("Type").value_or(0));
  const auto add = [&channel](const KvObject& frame) {
    auto elements = parseFrame(frame);
    if (elements) channel.frames.push_back(std::move(*elements));
    return elements.has_value();
  };
  if (const auto* frames = description.getAs<KvArray>("Frames")) {
    for (const auto& frame : *frames) {
      if (!add(*frame)) return std::nullopt;
    }
  } else if (const KvObject* value = description.get("Value")) {
    if (!add(*value)) return std::nullopt;
  }
  if (channel.frames.empty()) return std::nullopt;
  for (const auto& frame : channel.frames) {
    channel.elementCount = std::max(channel.elementCount, frame.size());
  }
  return channel;
}

}  // namespace tally
