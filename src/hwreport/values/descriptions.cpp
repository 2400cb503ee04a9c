// Channels and samples as lines of text.
#include "hwreport/descriptions.h"

#include <string>
#include <string_view>

#include <fmt/core.h>

#include "base/process.h"
#include "hwreport/channel.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/printf_hex.h"
#include "hwreport/channels/raw_element.h"
#include "hwreport/values.h"
#include "hwreport/values/state_values.h"
#include "hwreport/values/unit_word.h"

namespace tally {
namespace {

// Text as a C string has it.
std::string_view upToNul(const KvString& text) {
  return text.view().substr(0, text.view().find('\0'));
}

// Columns are counted in bytes, as printf does.
std::string rightAligned(std::string_view text, std::size_t width) {
  std::string result(text.size() < width ? width - text.size() : 0, ' ');
  return result.append(text);
}

std::string textOr(const KvString* text, std::string_view missing) {
  return std::string(text != nullptr ? text->view() : missing);
}

// What the lines of a sampled channel have in common.
struct Sample {
  KvDictionary* channel;
  ElementRun run;
  std::string prefix;
  std::string name;
  std::string unitLabel;
};

bool appendSimple(const Sample& sample, std::string* out) {
  // The run has one value to show, on as many lines as there are elements.
  for (std::size_t i = 0; i < sample.run.count(); ++i) {
    *out += fmt::format("{}{} = {{ {:12} {} }}\n", sample.prefix, rightAligned(sample.name, 32),
                        HwReportSimpleGetIntegerValue(sample.channel), sample.unitLabel);
  }
  return true;
}

bool appendStates(const Sample& sample, std::string* out) {
  const auto total = totalResidency(sample.channel);
  const std::uint64_t unit = HwReportChannelGetUnit(sample.channel);
  const std::string name = rightAligned(sample.name, 20);
  // Missing names are looked up once, not for each state.
  HwReportStateGetNameForIndex(sample.channel, 0);
  const bool named = sample.channel->get(*keys().stateNames) != nullptr;
  for (std::int32_t i = 0; i < sample.run.count(); ++i) {
    const auto* const state = named ? HwReportStateGetNameForIndex(sample.channel, i) : nullptr;
    const std::string text = state != nullptr
                                 ? std::string(upToNul(*state))
                                 : printfHex(HwReportStateGetIDForIndex(sample.channel, i));
    const std::uint64_t residency = HwReportStateGetResidency(sample.channel, i);
    *out += fmt::format("{}{}[{}] = {{ # {:<8} {:>9.3e} s / {:>4.1f}% }}\n", sample.prefix, name,
                        rightAligned(text, 8), HwReportStateGetInTransitions(sample.channel, i),
                        HwReportScaleValue(residency, unit, kUnitSeconds),
                        dutyCycle(residency, total) * 100);
  }
  return true;
}

bool appendBuckets(const Sample& sample, std::string* out) {
  const std::string name = rightAligned(sample.name, 20);
  for (std::int32_t i = 0; i < sample.run.count(); ++i) {
    std::int64_t lower = 0, upper = 0;
    if (HwReportHistogramGetBucketBounds(sample.channel, i, &lower, &upper) != 0) return false;
    const std::uint64_t hits = HwReportHistogramGetBucketHits(sample.channel, i);
    if (hits == kHwReportInvalidValue) return false;
    *out += fmt::format("{}{}[{:12} - {:12} {}] = ", sample.prefix, name, lower, upper,
                        sample.unitLabel);
    if (hits == 0) {
      *out += "{ <no hits>; # 0 }\n";
      continue;
    }
    *out += fmt::format("{{ m {:12}; M {:12}; s {:12}; # {:12} }}\n",
                        HwReportHistogramGetBucketMinValue(sample.channel, i),
                        HwReportHistogramGetBucketMaxValue(sample.channel, i),
                        HwReportHistogramGetBucketSum(sample.channel, i), hits);
  }
  return true;
}

bool appendArrays(const Sample& sample, std::string* out) {
  for (std::size_t i = 0; i < sample.run.count(); ++i) *out += "arrays unsupported?";
  return true;
}

bool appendElements(const Sample& sample, std::uint8_t format, std::string* out) {
  switch (format) {
    case kHwReportFormatSimple:
      return appendSimple(sample, out);
    case kHwReportFormatState:
      return appendStates(sample, out);
    case kHwReportFormatHistogram:
      return appendBuckets(sample, out);
    case kHwReportFormatSimpleArray:
      return appendArrays(sample, out);
    default:
      return sample.run.count() == 0;  // an unknown format has no text
  }
}

}  // namespace

KvRef<KvString> HwReportChannelCopyDescription(KvDictionary* channel, std::uint32_t,
                                               const char* prefix) {
  const auto type = typeWordOf(channel);
  if (!type) return nullptr;
  constexpr std::string_view kNull = "(null)", kNone = "(none)";
  return KvString::create(fmt::format(
      "{}{} {} < {} ({}) | G/g {}/{} | cat {} | format {} | elts {} >\n",
      prefix != nullptr ? prefix : "", textOr(HwReportChannelGetDriverName(channel), kNull),
      textOr(HwReportChannelGetChannelName(channel), kNull),
      printfHex(HwReportChannelGetChannelID(channel)),
      textOr(HwReportChannelGetUnitLabel(channel), kNull),
      textOr(HwReportChannelGetGroup(channel), kNone),
      textOr(HwReportChannelGetSubGroup(channel), kNone), printfHex(type->categories(), 4),
      printfHex(type->format(), 4), type->elementCount()));
}

KvRef<KvString> HwReportSampleCopyDescription(KvDictionary* channel, std::uint32_t,
                                              const char* prefix) {
  const std::uint8_t format = HwReportChannelGetFormat(channel);
  const auto run = runOfFormat(channel, format);
  if (!run) return nullptr;
  const auto* const name = HwReportChannelGetChannelName(channel);
  const Sample sample = {
      channel, *run, prefix != nullptr ? prefix : "",
      name != nullptr ? std::string(upToNul(*name)) : printfHex(run->channelID()),
      textOr(HwReportChannelGetUnitLabel(channel), "(null)")};
  std::string text;
  if (!appendElements(sample, format, &text)) return nullptr;
  return KvString::create(text);
}

HwResult HwReportWriteStringUTF8(int descriptor, const KvString* string) {
  if (string == nullptr) return HwErrBadArgument;
  const std::string_view text = upToNul(*string);
  const std::ptrdiff_t written = writeOnce(descriptor, text);
  if (written < 0) return HwErrIO;
  if (static_cast<std::size_t>(written) < text.size()) return HwErrShortWrite;
  return static_cast<std::size_t>(written) == text.size() ? 0 : HwErrGeneral;
}

}  // namespace tally
