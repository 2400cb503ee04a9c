// Packed samples of the metrics store: any blob has a layout or not, and what it holds packs again.
#include "fuzz.h"
#include "host/store/samples/packed_samples.h"

using namespace tally;
using fuzz::require;

namespace {

void checkSame(const SampleVectors& a, const SampleVectors& b) {
  const auto same = [](const auto& one, const auto& other) {
    return std::ranges::equal(std::as_bytes(std::span(one)), std::as_bytes(std::span(other)));
  };
  require(same(a.values, b.values) && same(a.offsets, b.offsets), "samples pack without loss");
  require(weightOf(a.columns()) == weightOf(b.columns()), "so do their weights");
}

}  // namespace

FUZZ_TARGET(packed_samples)(const std::uint8_t* data, std::size_t size) {
  const auto blob = fuzz::Input(data, size).takeRest();
  SampleVectors samples, some, again;
  const bool sound = unpackSamples(blob, PackedColumns::All, samples);
  require(sound ==
              packedLayout(std::span(blob).first(std::min(blob.size(), kPackedHeader)), blob.size())
                  .has_value(),
          "the header alone shows what is sound");
  require(unpackSamples(blob, PackedColumns::ValuesAndWeights, some) == sound, "as a part");
  if (!sound) return 0;
  require(samples.size() >= 1 && samples.size() <= kMostPackedSamples, "a row is bounded");
  require(some.weights == samples.weights && some.offsets.empty(), "a part is a part");
  const auto packed = packSamples(samples.columns());
  require(packed.size() <= kLongestPacked, "a blob is bounded");
  require(unpackSamples(packed, PackedColumns::All, again), "what is packed is sound");
  checkSame(samples, again);
  return 0;
}
