// The options of whitelisted keys: one table gives each option's values, the keys it is for, and
// its effect. Checks, documents and the report itself read it.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "kv/value.h"

namespace tally {

// Options of one whitelisted key; an empty dictionary reports the key unchanged.
using ScalarOptions = KvDictionary;

constexpr std::string_view kOptionIntervals = "intervals";

enum class OptionValue {
  WholeNumber,  // not negative, of 32 bits; a real without fraction counts
  Numbers,      // an array of numbers
};

// What a setting of a rounding option does that its author probably did not intend.
struct SettingRemark {
  bool isFault;
  bool isIdle;  // nothing is rounded
  std::string_view text;
};

// Near a value: results are multiples of the step, for values up to and including the last.
struct RoundingGrid {
  std::uint64_t step;
  std::int64_t last;
};

// A step of the rounding of scalars. The remark is empty for an ordinary setting. The step is
// monotonic over the values of one piece, whose number never falls while the values rise; without a
// function for it, over all values.
struct ScalarRounding {
  std::int64_t (*round)(std::int64_t value, std::uint32_t setting);
  RoundingGrid (*grid)(std::int64_t value, std::uint32_t setting);
  std::optional<SettingRemark> (*remark)(std::uint32_t setting);
  int (*piece)(std::int64_t value);
};

// What an option does. Has no default, so that a row without an effect does not compile.
class OptionEffect {
 public:
  constexpr OptionEffect(ScalarRounding rounding) : rounding_(rounding), isForScalars_(true) {}
  // Its effect on distributions is in the report's summary.
  static constexpr OptionEffect onDistributions() { return {}; }

  constexpr bool isForScalars() const { return isForScalars_; }
  constexpr const ScalarRounding& rounding() const { return rounding_; }

 private:
  constexpr OptionEffect() = default;
  ScalarRounding rounding_{};  // of scalars alone
  bool isForScalars_ = false;
};

struct WhitelistOption {
  std::string_view name;
  OptionValue value;
  OptionEffect effect;
  std::string_view meaning;  // as the documents say it
};

// All options; those for scalars in the order in which they are applied.
std::span<const WhitelistOption> whitelistOptions();
// Null when no option has this name.
const WhitelistOption* whitelistOption(std::string_view name);

// The whole number of an option; empty when the option is missing or anything else.
std::optional<std::uint32_t> unsignedOption(const ScalarOptions& options, std::string_view name);

// Whether the value is one that the option accepts. An unknown name may have any value.
bool isWellFormedOption(std::string_view name, const KvObject& value);

// Whether options change some value of a key.
bool haveEffect(const ScalarOptions& options);

// One step of a rounding.
struct RoundingStep {
  std::string_view option;
  std::uint32_t setting = 0;
  std::int64_t before = 0;
  std::int64_t after = 0;
};

// The value as its options round it, step by step; results outside 64 bits saturate. Steps that
// were applied are added to steps when it is given.
std::int64_t roundScalar(std::int64_t value, const ScalarOptions& options,
                         std::vector<RoundingStep>* steps = nullptr);

}  // namespace tally
