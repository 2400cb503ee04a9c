#include "recorder/held_keys.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

namespace tally {
namespace {

using Limits = std::numeric_limits<std::int64_t>;
constexpr double kEndOfInt64 = 9223372036854775808.0;  // 2^63
constexpr std::size_t kTextBlock = 16 << 10;

std::int64_t saturated(double value, bool& clamped) {
  if (value >= -kEndOfInt64 && value < kEndOfInt64) return static_cast<std::int64_t>(value);
  clamped = true;
  return value < 0 ? Limits::min() : Limits::max();
}

void addSaturated(std::int64_t& sum, std::int64_t amount, bool& clamped) {
  if (!__builtin_add_overflow(sum, amount, &sum)) return;
  sum = amount < 0 ? Limits::min() : Limits::max();
  clamped = true;
}

}  // namespace

void HeldScalar::add(double amount) {
  dirty_ = true;
  if (isSet_) {
    amount_ += amount;
    return;
  }
  const double whole = std::trunc(amount);
  addSaturated(whole_, saturated(whole, clamped_), clamped_);
  // An infinite amount has no fraction; its whole part was clamped.
  if (whole != amount && std::isfinite(amount)) fraction_ += amount - whole;
}

void HeldScalar::set(double value) {
  dirty_ = isSet_ = true;
  value_ = value;
  amount_ = 0;
}

void HeldScalar::move(double amount) {
  moves_ = true;
  add(amount);
}

std::optional<HeldScalar::Change> HeldScalar::take(bool atEnd) {
  if (!dirty_ && !(atEnd && fraction_ != 0)) return std::nullopt;
  const bool changed = std::exchange(dirty_, false);
  bool clamped = std::exchange(clamped_, false);
  if (isSet_) {
    value_ += std::exchange(amount_, 0.0);
    const std::int64_t value = saturated(std::round(value_), clamped);
    return Change{RecordedChange::Kind::Set, value, clamped};
  }
  const double whole = atEnd ? std::round(fraction_) : std::trunc(fraction_);
  addSaturated(whole_, saturated(whole, clamped), clamped);
  fraction_ = atEnd ? 0 : fraction_ - whole;
  const std::int64_t value = std::exchange(whole_, 0);
  if (value == 0 && !changed) return std::nullopt;
  return Change{moves_ ? RecordedChange::Kind::Move : RecordedChange::Kind::Add, value, clamped};
}

std::uint32_t HeldKeys::findIn(const HashIndex& index, std::string_view text) const {
  const std::uint32_t found = index.find(
      hashBytes(text), [&](std::uint32_t number) { return texts_[number].text == text; });
  return found == kNone ? kNone : texts_[found].index;
}

std::uint32_t HeldKeys::findKey(std::string_view key) const {
  const std::uint32_t found = findIn(others_, key);
  if (found != kNone) return found;
  const std::uint32_t identity = findIn(identities_, key);
  return identity != kNone && keys_[identity].key == key ? identity : kNone;
}

std::string_view HeldKeys::keep(std::string_view text) {
  if (blocks_.empty() || blocks_.back().capacity() - blocks_.back().size() < text.size()) {
    blocks_.emplace_back().reserve(std::max(kTextBlock, text.size()));
  }
  std::string& block = blocks_.back();
  const std::size_t begin = block.size();
  block += text;
  return std::string_view(block).substr(begin);
}

std::uint32_t HeldKeys::add(std::string_view identity, std::string_view key, std::size_t& bytes) {
  constexpr std::size_t kIndexBytes = 16;  // of a slot, the index being half empty
  const auto index = static_cast<std::uint32_t>(keys_.size());
  HeldKey& held = keys_.emplace_back();
  held.key = keep(key);
  bytes += 2 * sizeof(HeldKey) + key.size();  // a growing vector has up to twice its elements
  if (identity == key) {
    bytes += sizeof(Identity) + kIndexBytes;
    identities_.add(hashBytes(key), static_cast<std::uint32_t>(texts_.size()));
    texts_.push_back({held.key, index});
    return index;
  }
  bytes += sizeof(Identity) + kIndexBytes;
  others_.add(hashBytes(key), static_cast<std::uint32_t>(texts_.size()));
  texts_.push_back({held.key, index});
  addIdentity(identity, index, bytes);
  return index;
}

void HeldKeys::addIdentity(std::string_view identity, std::uint32_t index, std::size_t& bytes) {
  constexpr std::size_t kIndexBytes = 16;
  bytes += sizeof(Identity) + kIndexBytes + identity.size();
  identities_.add(hashBytes(identity), static_cast<std::uint32_t>(texts_.size()));
  texts_.push_back({keep(identity), index});
}

}  // namespace tally
