// The statistics buffer: parsed by itself, fetched from a driver, and turned into figures.
#include "fakes/fake_storage.h"
#include "fuzz.h"
#include "storage/auxiliary_metrics.h"
#include "storage/exporter.h"
#include "storage/nand_info.h"

using namespace tally;
using fuzz::require;

FUZZ_TARGET(statistics)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const std::size_t announced = input.take<std::uint16_t>();
  const fakes::Bytes buffer = input.takeRest();

  SPXParseContext parsed;
  const int result = SPXParseBufferToCxt(&parsed, buffer.data(), buffer.size());
  std::size_t counters = 0;
  SPXForEachCounter(parsed, [&](std::string_view name, std::uint64_t) {
    ++counters;
    require(!name.empty() && name.data()[name.size()] == '\0', "a counter has a terminated name");
  });
  require(counters * sizeof(std::uint64_t) <= buffer.size(), "each counter has its bytes");
  require(result == 1 || parsed.exportVersion == 0, "a parse that failed has no export version");

  fakes::FakeStorage storage;
  storage.registry->serve(buffer, announced);
  const NandExporter* exporter = nullptr;
  SPXParseContext fetched;
  const bool loaded = loadNandStatistics(&exporter, &fetched)->value();
  require(loaded || fetched.firstBlock == nullptr, "a fetch that failed leaves an empty context");
  if (loaded && announced >= buffer.size()) {
    require(result == 1 &&
                kvEqual(buildNandInfo(parsed, false).get(), buildNandInfo(fetched, false).get()),
            "what is fetched gives the figures of what is parsed");
  }
  SPXReleaseContext(&fetched);
  SPXReleaseContext(&parsed);

  storage.registry->serve(buffer, announced);
  CopyNANDHealthInfo();
  require(storage.registry->services == 0 && storage.registry->connections == 0,
          "every handle is released");
  return 0;
}
