#include "host/store/samples/blob_source.h"

#include <algorithm>

namespace tally {

std::size_t BlobSource::nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) {
  first_ += count_;
  count_ = 0;
  if (first_ == held_.size() && !nextRow(offsets != nullptr)) return 0;
  if (offsets != nullptr && held_.offsets.empty()) {
    (void)unpackSamples(blob_, PackedColumns::All, held_);
  }
  const SampleColumns part = slice(held_.columns(), first_, capacity);
  count_ = part.values.size();
  std::ranges::copy(part.values, values);
  if (offsets != nullptr) std::ranges::copy(part.offsets, offsets);
  return count_;
}

bool BlobSource::nextRow(bool withOffsets) {
  clear();
  while (const auto blob = nextBlob()) {
    blob_ = *blob;
    const auto columns = withOffsets ? PackedColumns::All : PackedColumns::ValuesAndWeights;
    // Damaged ones were counted by the walk over the rows.
    if (unpackSamples(blob_, columns, held_)) return true;
  }
  return false;
}

}  // namespace tally
