// The telemetry list, with the characteristics that say how it is laid out.
#include "fakes/fake_storage.h"
#include "fuzz_values.h"
#include "storage/lists/telemetry_list.h"
#include "storage/vendor_counters.h"

using namespace tally;
using fuzz::require;

FUZZ_TARGET(telemetry_list)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto digits = input.takeText(input.take<std::uint8_t>() % 16);
  hexStringToByte(digits, digits.size());
  hexStringToInt32(digits, digits.size());
  const auto characteristics = fuzz::ValueReader(input).take();
  // Runs of one word each, since whole lists would be more than a mutation can fill.
  fakes::Bytes list(input.take<std::uint16_t>());
  while (!input.empty() && !list.empty()) {
    const std::size_t at = input.take<std::uint16_t>() % list.size();
    const auto word = input.take<std::uint32_t>();
    std::memcpy(list.data() + at, &word, std::min(sizeof word, list.size() - at));
  }

  const fakes::FakePlatform platform = fakes::makeFakePlatform();
  const auto scope = platform.install();
  std::size_t buses = 0;
  const bool read =
      readTelemetryList(list, characteristics.get(), stdout, [&](const KvDictionary&) { ++buses; });
  const bool logged = parseTelemetryList(list.data(), list.size(), characteristics.get())->value();
  require(read == logged && buses == platform.crashReporting->records.size(),
          "each bus that is read is logged");
  require(read || buses == 0, "of a list that is refused nothing is logged");
  return 0;
}
