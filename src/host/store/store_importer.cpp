#include "host/store/store_importer.h"

#include <algorithm>
#include <numeric>
#include <tuple>

namespace tally {
namespace {

// 28 MiB in all, with the copy that is ordered by place; 36 MiB with weights.
constexpr std::size_t kSamplesInHand = 1u << 20;
// What the places in hand may take; each costs its key twice and two nodes.
constexpr std::size_t kPlaceBytes = 8u << 20;
constexpr std::size_t kBytesOfPlace = 160;

}  // namespace

Status StoreImporter::ensureBegun() {
  if (writer_) return Done{};
  auto opened = StoreWriter::open(file_, IfMissing::Create);
  if (!opened) return opened.error();
  writer_ = std::move(*opened);
  if (auto begun = writer_->begin(); !begun) return begun;
  // What was pushed before comes before what is imported.
  return writer_->foldRecent();
}

Status StoreImporter::addScalar(std::int32_t day, std::string_view key, std::int64_t value) {
  if (auto begun = ensureBegun(); !begun) return begun;
  return writer_->setScalar(day, key, value);
}

Status StoreImporter::addSample(std::int32_t day, std::string_view key, std::uint32_t offset,
                                double value, std::uint32_t weight) {
  if (values_.size() == kSamplesInHand || placeBytes_ > kPlaceBytes) {
    if (auto written = writeSamples(); !written) return written;
  }
  if (values_.capacity() == 0) {
    placeOfSample_.reserve(kSamplesInHand);
    offsets_.reserve(kSamplesInHand);
    values_.reserve(kSamplesInHand);
  }
  placeOfSample_.push_back(placeOf(day, key));
  offsets_.push_back(offset);
  if (weight != 1) weights_.resize(values_.size(), 1);
  if (weight != 1 || !weights_.empty()) weights_.push_back(weight);
  values_.push_back(value);
  return Done{};
}

std::uint32_t StoreImporter::placeOf(std::int32_t day, std::string_view key) {
  // Rows of one key often follow each other.
  if (lastPlace_ < places_.size() && places_[lastPlace_].day == day &&
      places_[lastPlace_].key == key) {
    return lastPlace_;
  }
  placeName_.assign(reinterpret_cast<const char*>(&day), sizeof day);
  placeName_.append(key);
  const auto next = static_cast<std::uint32_t>(places_.size());
  const auto [entry, added] = placeNumbers_.try_emplace(placeName_, next);
  if (added) {
    places_.push_back({day, std::string(key)});
    placeBytes_ += kBytesOfPlace + 2 * key.size();
  }
  return lastPlace_ = entry->second;
}

Status StoreImporter::writeSamples() {
  if (auto begun = ensureBegun(); !begun) return begun;
  // Where the samples of each place begin, then each sample to its place; arrival order is kept.
  std::vector<std::size_t> ends(places_.size() + 1, 0);
  for (const std::uint32_t place : placeOfSample_) ++ends[place + 1];
  std::partial_sum(ends.begin(), ends.end(), ends.begin());
  std::vector<double> values(values_.size());
  std::vector<std::uint32_t> offsets(values_.size()), weights(weights_.size());
  std::vector<std::size_t> begins(ends.begin(), ends.end() - 1);
  for (std::size_t i = 0; i < values_.size(); ++i) {
    const std::size_t target = begins[placeOfSample_[i]]++;
    values[target] = values_[i];
    offsets[target] = offsets_[i];
    if (!weights_.empty()) weights[target] = weights_[i];
  }
  std::vector<std::uint32_t> order(places_.size());
  std::iota(order.begin(), order.end(), 0u);
  std::sort(order.begin(), order.end(), [&](std::uint32_t a, std::uint32_t b) {
    return std::tie(places_[a].day, places_[a].key) < std::tie(places_[b].day, places_[b].key);
  });
  for (const std::uint32_t place : order) {
    const std::size_t begin = ends[place], count = ends[place + 1] - begin;
    SampleColumns samples = slice({values, offsets, weights}, begin, count);
    if (weightOf(samples) == count) samples.weights = {};
    auto written = writer_->appendSamples(places_[place].day, places_[place].key, samples);
    if (!written) return written;
  }
  values_.clear();
  offsets_.clear();
  weights_.clear();
  placeOfSample_.clear();
  places_.clear();
  placeNumbers_.clear();
  placeBytes_ = 0;
  return Done{};
}

Status StoreImporter::finish() {
  if (!values_.empty()) {
    if (auto written = writeSamples(); !written) return written;
  }
  return writer_ ? writer_->commit() : Status(Done{});
}

}  // namespace tally
