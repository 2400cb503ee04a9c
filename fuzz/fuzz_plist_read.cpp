// Property lists, XML and binary, as the codec reads them.
#include "plist_round_trip.h"

using namespace tally;

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto decoded = decodePlist(input.rest());
  if (decoded) {
    fuzz::checkRoundTrip(**decoded);
  } else {
    fuzz::require(!decoded.error().message.empty(), "a refusal has a reason");
  }
  return 0;
}
