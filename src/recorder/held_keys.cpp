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

ScalarAmount ScalarAmount::of(double number) {
  ScalarAmount amount;
  const double whole = std::trunc(number);
  amount.whole = saturated(whole, amount.clamped);
  // An infinite amount has no fraction; its whole part was clamped.
  if (std::isfinite(number)) amount.fraction = number - whole;
  return amount;
}

void HeldScalar::add(const ScalarAmount& amount) {
  dirty_ = true;
  clamped_ = clamped_ || amount.clamped;
  addSaturated(whole_, amount.whole, clamped_);
  fraction_ += amount.fraction;
}

void HeldScalar::set(const ScalarAmount& value) {
  dirty_ = isSet_ = true;
  clamped_ = clamped_ || value.clamped;
  whole_ = value.whole;
  fraction_ = value.fraction;
}

void HeldScalar::move(const ScalarAmount& amount) {
  moves_ = true;
  add(amount);
}

std::optional<HeldScalar::Change> HeldScalar::take(bool atEnd) {
  if (!dirty_ && !(atEnd && !isSet_ && fraction_ != 0)) return std::nullopt;
  const bool changed = std::exchange(dirty_, false);
  bool clamped = std::exchange(clamped_, false);
  std::int64_t value = whole_;
  if (isSet_) {
    addSaturated(value, saturated(std::round(fraction_), clamped), clamped);
    return Change{RecordedChange::Kind::Set, value, clamped};
  }
  const double whole = atEnd ? std::round(fraction_) : std::trunc(fraction_);
  addSaturated(value, saturated(whole, clamped), clamped);
  fraction_ = atEnd ? 0 : fraction_ - whole;
  whole_ = 0;
  if (value == 0 && !changed) return std::nullopt;
  return Change{moves_ ? RecordedChange::Kind::Move : RecordedChange::Kind::Add, value, clamped};
}

void HeldScalar::putBack(const Change& change) {
  dirty_ = true;
  if (isSet_) return;  // what was set is still here, and what was added before it does not matter
  addSaturated(whole_, change.value, clamped_);
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

std::uint32_t HeldKeys::add(std::string_view identity, std::string_view key) {
  if (identity != key) {
    const std::uint32_t index = addKey(key);
    addIdentity(identity, index);
    return index;
  }
  const std::uint32_t index = addHeld(key);
  identities_.add(hashBytes(key), static_cast<std::uint32_t>(texts_.size()));
  addText(keys_[index].key, index);
  return index;
}

std::uint32_t HeldKeys::addKey(std::string_view key) {
  const std::uint32_t index = addHeld(key);
  others_.add(hashBytes(key), static_cast<std::uint32_t>(texts_.size()));
  addText(keys_[index].key, index);
  return index;
}

std::uint32_t HeldKeys::addHeld(std::string_view key) {
  keys_.emplace_back().key = keep(key);
  bytes_ += 2 * sizeof(HeldKey);  // a growing vector has up to twice its elements
  return static_cast<std::uint32_t>(keys_.size() - 1);
}

void HeldKeys::forgetIdentities() {
  identities_.clear();
  others_.clear();
  texts_.clear();
  for (std::uint32_t i = 0; i < keys_.size(); ++i) {
    others_.add(hashBytes(keys_[i].key), i);
    texts_.push_back({keys_[i].key, i});
  }
}

void HeldKeys::addIdentity(std::string_view identity, std::uint32_t index) {
  identities_.add(hashBytes(identity), static_cast<std::uint32_t>(texts_.size()));
  addText(keep(identity), index);
}

void HeldKeys::addText(std::string_view text, std::uint32_t index) {
  constexpr std::size_t kIndexBytes = 16;  // of a slot, the index being half empty
  texts_.push_back({text, index});
  bytes_ += text.size() + 2 * sizeof(Identity) + kIndexBytes;
}

}  // namespace tally
