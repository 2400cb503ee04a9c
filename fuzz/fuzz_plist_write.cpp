// Values that no property list delivered, as the codec writes them.
#include "fuzz_values.h"
#include "plist_round_trip.h"

using namespace tally;

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  if (const auto value = fuzz::valueOf(input)) fuzz::checkRoundTrip(*value);
  return 0;
}
