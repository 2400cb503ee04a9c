#include "recorder/sample_stream.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <limits>

#include "base/varint.h"

namespace tally {
namespace {

// A sample begins with a byte: two flags, what kind of value, and the lowest bits of a whole one.
constexpr unsigned kOffsetFollows = 1, kWeightFollows = 2, kReal = 4, kMoreBits = 8;
constexpr unsigned kFirstBits = 4;  // of a whole value in the upper half of that byte
constexpr double kMostWhole = 9007199254740992.0;  // 2^53
// The longest: the byte, a real, an offset, a weight.
constexpr std::size_t kLongest = 1 + 10 + 5 + 5;
constexpr std::uint32_t kFirstBlock = 48, kLargestBlock = 4080;

bool isWhole(double value) {
  return std::fabs(value) < kMostWhole && value == std::trunc(value) &&
         !(value == 0 && std::signbit(value));
}

}  // namespace

void StreamSamples::clear() {
  values.clear();
  offsets.clear();
  weights.clear();
}

std::byte* SampleStream::reserve(std::size_t most, std::size_t& grown) {
  if (blocks_.empty() || blocks_.back().capacity - blocks_.back().used < most) {
    const std::uint32_t capacity =
        blocks_.empty() ? kFirstBlock : std::min(blocks_.back().capacity * 2, kLargestBlock);
    blocks_.push_back({std::make_unique_for_overwrite<std::byte[]>(capacity), 0, capacity});
    constexpr std::size_t kAllocator = 16;  // what it adds to each piece
    grown = capacity + sizeof(Block) + kAllocator;
    bytes_ += grown;
  }
  return blocks_.back().data.get() + blocks_.back().used;
}

std::size_t SampleStream::add(double value, std::uint32_t offset, std::uint32_t weight) {
  std::size_t grown = 0;
  std::byte* const begin = reserve(kLongest, grown);
  std::byte* out = begin + 1;
  unsigned tag = 0;
  if (isWhole(value)) {
    const std::uint64_t whole = zigzag(static_cast<std::int64_t>(value));
    const std::uint64_t more = whole >> kFirstBits;
    tag = static_cast<unsigned>(whole & ((1u << kFirstBits) - 1)) << (8 - kFirstBits);
    if (more != 0) {
      tag |= kMoreBits;
      out = putVarint(out, more);
    }
  } else {
    tag = kReal;
    std::memcpy(out, &value, sizeof value);
    out += sizeof value;
  }
  if (offset != offset_) {
    tag |= kOffsetFollows;
    out = putVarint(out, zigzag(std::int64_t{offset} - std::int64_t{offset_}));
    offset_ = offset;
  }
  if (weight != weight_) {
    tag |= kWeightFollows;
    out = putVarint(out, weight);
    weight_ = weight;
  }
  *begin = static_cast<std::byte>(tag);
  blocks_.back().used += static_cast<std::uint32_t>(out - begin);
  ++count_;
  return grown;
}

SampleStream::Reader::Reader(const SampleStream& stream) : stream_(stream), left_(stream.count_) {}

std::byte SampleStream::Reader::take() {
  const Block& block = stream_.blocks_[block_];
  const std::byte taken = block.data[position_];
  if (++position_ == block.used) {
    ++block_;
    position_ = 0;
  }
  return taken;
}

std::uint64_t SampleStream::Reader::takeNumber() {
  return takeVarint([this] { return take(); });
}

bool SampleStream::Reader::next(StreamSamples& samples, std::size_t most) {
  samples.clear();
  bool weighted = false;
  for (; left_ > 0 && samples.values.size() < most; --left_) {
    const auto tag = static_cast<unsigned>(take());
    double value = 0;
    if ((tag & kReal) != 0) {
      std::byte bytes[sizeof value];
      for (std::byte& byte : bytes) byte = take();
      std::memcpy(&value, bytes, sizeof value);
    } else {
      std::uint64_t whole = tag >> (8 - kFirstBits);
      if ((tag & kMoreBits) != 0) whole |= takeNumber() << kFirstBits;
      value = static_cast<double>(unzigzag(whole));
    }
    if ((tag & kOffsetFollows) != 0) {
      offset_ = static_cast<std::uint32_t>(std::int64_t{offset_} + unzigzag(takeNumber()));
    }
    if ((tag & kWeightFollows) != 0) weight_ = static_cast<std::uint32_t>(takeNumber());
    weighted = weighted || weight_ != 1;
    samples.values.push_back(value);
    samples.offsets.push_back(offset_);
    samples.weights.push_back(weight_);
  }
  if (!weighted) samples.weights.clear();
  return !samples.values.empty();
}

std::size_t SampleStream::append(const SampleStream& other) {
  constexpr std::size_t kAtATime = 1024;
  std::size_t grown = 0;
  Reader reader(other);
  StreamSamples samples;
  while (reader.next(samples, kAtATime)) {
    for (std::size_t i = 0; i < samples.values.size(); ++i) {
      grown += add(samples.values[i], samples.offsets[i],
                   samples.weights.empty() ? 1 : samples.weights[i]);
    }
  }
  return grown;
}

std::uint64_t SampleStream::thin() {
  if (count_ < 2) return 0;
  constexpr std::size_t kAtATime = 1024;  // even, so that pairs stay together
  SampleStream kept;
  Reader reader(*this);
  StreamSamples samples;
  while (reader.next(samples, kAtATime)) {
    const auto weightOf = [&](std::size_t i) -> std::uint64_t {
      return samples.weights.empty() ? 1 : samples.weights[i];
    };
    for (std::size_t i = 0; i < samples.values.size(); i += 2) {
      const std::uint64_t weight =
          weightOf(i) + (i + 1 < samples.values.size() ? weightOf(i + 1) : 0);
      kept.add(samples.values[i], samples.offsets[i],
               static_cast<std::uint32_t>(
                   std::min<std::uint64_t>(weight, std::numeric_limits<std::uint32_t>::max())));
    }
  }
  const std::uint64_t gone = count_ - kept.count_;
  *this = std::move(kept);
  return gone;
}

}  // namespace tally
