#include "config/rounding_range.h"

#include <algorithm>
#include <limits>
#include <numeric>

namespace tally {
namespace {

constexpr std::int64_t kMinimum = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMaximum = std::numeric_limits<std::int64_t>::max();

// The first value from first to last that fulfils a condition, which last does and which stays
// fulfilled once it is. The answer is usually near the guess, so the search widens from there.
template <class Condition>
std::int64_t firstWhere(std::int64_t first, std::int64_t last, std::int64_t guess,
                        const Condition& condition) {
  std::int64_t step = 1;
  const auto widen = [&step] { step = step > kMaximum / 2 ? kMaximum : step * 2; };
  if (condition(guess)) {
    last = guess;
    for (std::int64_t probe = 0; !__builtin_sub_overflow(last, step, &probe) && probe >= first;
         widen()) {
      if (!condition(probe)) {
        first = probe + 1;
        break;
      }
      last = probe;
    }
  } else {
    first = guess + 1;
    for (std::int64_t probe = 0; !__builtin_add_overflow(first, step, &probe) && probe < last;
         widen()) {
      if (condition(probe)) {
        last = probe;
        break;
      }
      first = probe + 1;
    }
  }
  while (first < last) {
    const std::int64_t middle = std::midpoint(first, last);
    if (condition(middle)) {
      last = middle;
    } else {
      first = middle + 1;
    }
  }
  return first;
}

}  // namespace

RoundingInverse::RoundingInverse(const ScalarOptions& options) {
  for (const WhitelistOption& option : whitelistOptions()) {
    if (!option.effect.isForScalars()) continue;
    const auto setting = unsignedOption(options, option.name);
    if (setting) steps_.push_back({option.effect.rounding(), *setting});
  }
  pieces_.push_back({kMinimum, kMaximum, 0, 0});
  for (std::size_t step = 0; step < steps_.size(); ++step) splitPieces(step);
  for (Piece& piece : pieces_) {
    piece.atFirst = apply(piece.first, steps_.size());
    piece.atLast = apply(piece.last, steps_.size());
  }
}

std::int64_t RoundingInverse::apply(std::int64_t value, std::size_t steps) const {
  for (std::size_t step = 0; step < steps; ++step) {
    value = steps_[step].rounding.round(value, steps_[step].setting);
  }
  return value;
}

// So that the step, too, is monotonic over each piece. The steps before it already are, so the
// piece of its input only rises.
void RoundingInverse::splitPieces(std::size_t step) {
  const auto pieceOf = steps_[step].rounding.piece;
  if (pieceOf == nullptr) return;
  std::vector<Piece> split;
  for (Piece rest : pieces_) {
    const int lastPiece = pieceOf(apply(rest.last, step));
    for (int piece = pieceOf(apply(rest.first, step)); piece != lastPiece;
         piece = pieceOf(apply(rest.first, step))) {
      const std::int64_t next =
          firstWhere(rest.first, rest.last, rest.first,
                     [&](std::int64_t value) { return pieceOf(apply(value, step)) > piece; });
      split.push_back({rest.first, next - 1, 0, 0});
      rest.first = next;
    }
    split.push_back(rest);
  }
  pieces_ = std::move(split);
}

std::optional<TrueValues> RoundingInverse::trueValues(std::int64_t reported) const {
  if (!rounds()) return TrueValues{reported, reported, false};
  const auto rounded = [this](std::int64_t value) { return apply(value, steps_.size()); };
  std::optional<TrueValues> found;
  for (const Piece& piece : pieces_) {
    if (reported < piece.atFirst || reported > piece.atLast) continue;
    const std::int64_t guess = std::clamp(reported, piece.first, piece.last);
    const std::int64_t lowest = firstWhere(piece.first, piece.last, guess, [&](std::int64_t value) {
      return rounded(value) >= reported;
    });
    if (rounded(lowest) != reported) continue;
    const std::int64_t highest =
        piece.atLast == reported
            ? piece.last
            : firstWhere(lowest, piece.last, std::max(lowest, guess), [&](std::int64_t value) {
                return rounded(value) > reported;
              }) - 1;
    if (found) {
      found->hasGaps |= found->highest + 1 != lowest;
      found->highest = highest;
    } else {
      found = TrueValues{lowest, highest, false};
    }
  }
  return found;
}

std::optional<TrueValues> trueValues(std::int64_t reported, const ScalarOptions& options) {
  return RoundingInverse(options).trueValues(reported);
}

}  // namespace tally
