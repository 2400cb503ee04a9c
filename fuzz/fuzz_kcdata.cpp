// The search for a thread in kcdata: both functions, which must agree, and the measurement.
#include <string>

#include "fakes/fake_storage.h"
#include "fuzz.h"
#include "storage/freezer.h"
#include "storage/kcdata.h"

using namespace tally;
using fuzz::require;

namespace {

using Statistics = std::span<const std::byte>;

// Container after container, as far as the search of one goes.
int searchStepwise(std::span<const std::byte> data, const char* name, Statistics* statistics) {
  const std::byte* begin = data.data();
  const std::byte* const end = begin + data.size();
  for (;;) {
    const std::byte* next = nullptr;
    if (getIOStatsWithThreadnameFromKCDataHelper(begin, end, name, statistics, &next) != 0) {
      return 1;
    }
    if (next == nullptr) return 0;
    require(next > begin && next <= end, "a search that goes on has moved on");
    begin = next;
  }
}

}  // namespace

FUZZ_TARGET(kcdata)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const std::string name(input.takeText(input.take<std::uint8_t>() % 80));
  const fakes::Bytes bytes = input.takeRest();
  if (bytes.empty()) return 0;

  Statistics whole, stepwise;
  const int found = getIOStatsWithThreadnameFromKCData(bytes.data(), bytes.data() + bytes.size(),
                                                       name.c_str(), &whole);
  require(found == searchStepwise(bytes, name.c_str(), &stepwise) &&
              whole.data() == stepwise.data() && whole.size() == stepwise.size(),
          "both searches find the same");
  require(whole.data() == nullptr || (whole.data() >= bytes.data() &&
                                      whole.data() + whole.size() <= bytes.data() + bytes.size()),
          "statistics lie in the data");

  fakes::FakeStorage storage;
  storage.stackshot->buffer = bytes;
  CopyVMFreezerNANDInfo();
  return 0;
}
