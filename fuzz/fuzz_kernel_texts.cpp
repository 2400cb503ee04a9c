// The texts of /proc and /sys that statistics and the wear of disks are read from, the names in
// them, and the health page of an NVMe disk.
#include <algorithm>
#include <string>
#include <vector>

#include "base/printable.h"
#include "fuzz.h"
#include "host/flash/emmc.h"
#include "host/flash/mount_table.h"
#include "host/flash/nvme.h"
#include "host/flash/raw_nand.h"
#include "host/flash/ufs.h"
#include "host/kernel/naming.h"
#include "host/kernel/sources/cpu/interrupts.h"
#include "host/kernel/sources/cpu/processor_time.h"
#include "host/kernel/sources/cpu/processors.h"
#include "host/kernel/sources/network/interfaces.h"
#include "host/kernel/sources/power/sleep.h"
#include "host/kernel/sources/power/supplies.h"
#include "host/kernel/sources/storage/disk.h"
#include "host/kernel/sources/system/pressure.h"
#include "host/kernel/sources/system/time.h"
#include "host/kernel/text_fields.h"

using namespace tally;
using fuzz::require;

namespace {

struct Parser {
  FileParser parse;
  bool mayBeNegative = false;
};
constexpr Parser kParsers[] = {
    {parseGauge, true}, {parseCounter},         {parseNumbers},        {parseNamedNumbers},
    {parseInterfaces},  {parsePressure},        {parseDiskStatistics}, {parseProcessorTime},
    {parseInterrupts},  {parseEnergy},          {parseTenths, true},   {parseCycles},
    {parseUptime},      {parseTimeInFrequency},
};

// Labels that are in the text, the last one first.
FileLayout layoutOf(std::string_view text, std::size_t columns) {
  constexpr std::size_t kMostLabels = 8;
  FileLayout layout{{}, columns};
  eachLine(text, [&](std::string_view line) {
    std::string_view word = takeWord(line);
    word = word.substr(0, word.find(':'));
    if (layout.labels.size() < kMostLabels)
      layout.labels.insert(layout.labels.begin(), std::string(word));
  });
  if (layout.labels.empty()) layout.labels.emplace_back();
  return layout;
}

void requireSound(const std::optional<Wear>& wear) {
  if (!wear) return;
  for (const auto& range : {wear->used, wear->fastUsed, wear->spare}) {
    require(!range || !range->value.most || range->value.least <= *range->value.most,
            "a range has a lower end");
  }
}

void readWear(std::span<const std::byte> bytes, std::string_view text) {
  const std::string_view word = trimmed(text.substr(0, text.find('\n')));
  requireSound(parseEmmc({"MMC", "0x8", word, word}));
  requireSound(parseExtendedRegisters(text));
  requireSound(parseUfs({word, word, word}));
  requireSound(parseRawNand({word, word, word, word, word, word, word, text}));
  requireSound(parseHealthPage(bytes));
  const auto mount = mountOf(text, "/var/mobile");
  if (mount) (void)ubiDeviceOf(mount->source);
}

}  // namespace

FUZZ_TARGET(kernel_texts)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const Parser& parser = kParsers[input.take<std::uint8_t>() % std::size(kParsers)];
  const std::size_t columns = input.take<std::uint8_t>() % 16 + 1u;
  const auto bytes = input.takeRest();
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());

  readWear(bytes, text);
  const FileLayout layout = layoutOf(text, columns);
  std::vector<std::int64_t> fields(layout.fields(), kNoReading), again = fields;
  parser.parse(text, layout, fields);
  parser.parse(text, layout, again);
  require(fields == again, "a text says the same again");
  require(parser.mayBeNegative ||
              std::ranges::all_of(
                  fields, [](std::int64_t field) { return field >= 0 || field == kNoReading; }),
          "a counter is not negative");

  const std::vector<std::string> names = uniqueNames(layout.labels, layout.labels);
  for (const std::string& name : names) {
    require(printable(name) == name && name.find(' ') == name.npos, "a name can be shown");
  }
  require(!wakeupKind(text, layout.labels.front()).empty(), "every wakeup source has a kind");
  for (std::uint64_t id = stateID(text); id != 0; id >>= 8) {
    require((id & 0xFF) >= ' ' && (id & 0xFF) <= '~', "a state has a name that can be shown");
  }
  return 0;
}
