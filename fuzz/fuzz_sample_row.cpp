// Rows of the store's samples: any columns are a row or not, and what a row holds packs again.
#include "fuzz.h"
#include "host/store/samples/packed_samples.h"
#include "host/store/samples/sample_row.h"

using namespace tally;
using fuzz::require;

namespace {

SampleVectors unpacked(SampleRow& row, std::span<const std::byte> weights,
                       std::span<const std::byte> offsets, std::size_t step) {
  SampleVectors out;
  out.values.resize(row.size());
  out.offsets.resize(row.size());
  if (row.isWeighted()) out.weights.resize(row.size());
  for (std::size_t first = 0; first < row.size(); first += step) {
    const std::size_t count = std::min(step, row.size() - first);
    row.unpackValues(first, std::span(out.values).subspan(first, count));
    row.unpackOffsets(offsets, first, std::span(out.offsets).subspan(first, count));
    if (!row.isWeighted()) continue;
    row.unpackWeights(weights, first, std::span(out.weights).subspan(first, count));
  }
  return out;
}

bool areSame(const SampleVectors& a, const SampleVectors& b) {
  const auto same = [](const auto& one, const auto& other) {
    return std::ranges::equal(std::as_bytes(std::span(one)), std::as_bytes(std::span(other)));
  };
  return same(a.values, b.values) && same(a.offsets, b.offsets) &&
         weightOf(a.columns()) == weightOf(b.columns());
}

}  // namespace

FUZZ_TARGET(sample_row)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const std::size_t samples = input.take<std::uint16_t>();
  const std::size_t step = std::size_t{1} + input.take<std::uint16_t>();
  const auto weights = input.takeCopy(input.take<std::uint16_t>());
  const auto offsets = input.takeCopy(input.take<std::uint16_t>());
  const auto values = input.takeRest();
  const SampleRow::Shape shape{static_cast<std::int64_t>(samples),
                               static_cast<std::int64_t>(samples + (weights.empty() ? 0 : 1)),
                               std::ssize(values), std::ssize(weights), std::ssize(offsets)};
  SampleRow row;
  if (!row.open(shape, values)) return 0;
  const SampleVectors whole = unpacked(row, weights, offsets, row.size());
  require(areSame(whole, unpacked(row, weights, offsets, step)), "a part is a part");
  const PackedRow packed = packRow(whole.columns());
  const SampleRow::Shape again{shape.samples, static_cast<std::int64_t>(weightOf(whole.columns())),
                               std::ssize(packed.values), std::ssize(packed.weights),
                               std::ssize(packed.offsets)};
  require(row.open(again, packed.values), "what is packed is sound");
  require(areSame(whole, unpacked(row, packed.weights, packed.offsets, row.size())),
          "samples pack without loss");
  return 0;
}
