// Labels of units: a prefix for the scale and a label for the quantity.
#include "hwreport/descriptions.h"

#include <string>
#include <string_view>

#include "hwreport/channel.h"
#include "hwreport/channels/keys.h"
#include "hwreport/values/unit_word.h"

namespace tally {
namespace {

struct Prefix {
  std::uint32_t scale;
  std::uint32_t factor;
  std::string_view text;
};

constexpr Prefix kPrefixes[] = {
    {0x000073, 0, "p"},   {0x000076, 0, "n"},    {0x000079, 0, "u"},    {0x00007C, 0, "m"},
    {0x000082, 0, "k"},   {0x000085, 0, "M"},    {0x000088, 0, "G"},    {0x00008B, 0, "T"},
    {0x008900, 0, "Ki"},  {0x009300, 0, "Mi"},   {0x009D00, 0, "Gi"},   {0x00A700, 0, "Ti"},
    {0x008C00, 0, "KiB"}, {0x008C00, 4, "4KiB"}, {0x008C00, 8, "8KiB"}, {0x009600, 0, "MiB"},
    {0x00A000, 0, "GiB"}, {0x00AA00, 0, "TiB"},
};

// Units whose label does not depend on the quantity.
constexpr Prefix kWholeLabels[] = {
    {0x000076, 1, "1Gticks"},
    {0x000079, 0x80000018, "24Mticks"},
    {0x010000, 0, "hwticks?"},
    {0x020000, 0, "hwpage?"},
};

struct Quantity {
  std::uint8_t code;
  std::string_view text;
};

constexpr std::uint8_t kData = 9;  // counted in bits
constexpr std::uint32_t kByteScale = 0x008200;
constexpr Quantity kQuantities[] = {
    {0, ""},  {1, "s"}, {2, "W"},  {3, "J"},  {4, "A"},        {5, "V"},
    {6, "F"}, {7, "H"}, {8, "Hz"}, {10, "C"}, {100, "events"}, {101, "packets"},
};

template <std::size_t Size>
const Prefix* find(const Prefix (&table)[Size], const UnitWord& unit) {
  for (const Prefix& entry : table) {
    if (entry.scale == unit.scale() && entry.factor == unit.factor()) return &entry;
  }
  return nullptr;
}

std::string_view quantityLabel(const UnitWord& unit) {
  if (unit.quantity() == kData) {
    // Otherwise the prefix names the byte.
    if (unit.factor() != 0) return "";
    return unit.scale() == kByteScale ? "B" : unit.scale() == 0 ? "b" : "";
  }
  for (const Quantity& quantity : kQuantities) {
    if (quantity.code == unit.quantity()) return quantity.text;
  }
  return "??";
}

std::string labelOf(const UnitWord& unit) {
  if (const Prefix* const whole = find(kWholeLabels, unit)) return std::string(whole->text);
  const Prefix* const prefix = find(kPrefixes, unit);
  return std::string(prefix != nullptr ? prefix->text : "").append(quantityLabel(unit));
}

}  // namespace

KvString* HwReportChannelGetUnitLabel(KvDictionary* channel) {
  if (channel == nullptr) return nullptr;
  if (auto* cached = channel->getAs<KvString>(*keys().unitLabel)) return cached;
  const std::uint64_t unit = HwReportChannelGetUnit(channel);
  if (unit == kHwReportInvalidValue) return nullptr;
  auto label = KvString::create(labelOf({unit}));
  channel->set(keys().unitLabel, label);
  return label.get();  // the channel owns it
}

}  // namespace tally
