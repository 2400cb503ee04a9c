#include "tools/channels/channel_commands.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cmath>
#include <map>
#include <memory>
#include <set>
#include <thread>
#include <tuple>
#include <vector>

#include <fmt/core.h>
#include <nlohmann/json.hpp>

#include "base/time_text.h"
#include "hwreport/hwreport.h"
#include "platform/protocol/hub_protocol.h"
#include "tools/channels/channel_readings.h"
#include "tools/channels/channel_view.h"
#include "tools/channels/keep_command.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

using std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

constexpr double kLongestWait = kSecondsPerDay;

struct ChannelArguments {
  std::string driver, group, subgroup, format, unit;
  std::uint16_t categories = 0;  // 0: any
  double delta = 0;              // 0: a single sample
  bool verbose = false;
};

// The library's reason, or its code where there is none.
std::string reasonOf(const HwReportError* error) {
  if (error == nullptr) return "for a reason that is not known";
  const bool isNamed = !error->failureReason().starts_with("createKvErr()");
  if (!isNamed && error->code() == HwErrNotFound) return "the device has no statistics hub";
  const std::string code = fmt::format("error {:#x}", error->code());
  return isNamed ? fmt::format("{} ({})", error->failureReason(), code) : code;
}

bool hasText(const KvString* text, const std::string& wanted) {
  return wanted.empty() || (text != nullptr && text->view() == wanted);
}

// wanted is a label, or a unit word that begins with 0x.
bool hasUnit(KvDictionary* channel, const std::string& wanted) {
  if (wanted.empty() || hasText(HwReportChannelGetUnitLabel(channel), wanted)) return true;
  std::uint64_t word = 0;
  if (!wanted.starts_with("0x")) return false;
  const char* const end = wanted.data() + wanted.size();
  const auto [stop, fault] = std::from_chars(wanted.data() + 2, end, word, 16);
  return fault == std::errc() && stop == end && HwReportChannelGetUnit(channel) == word;
}

bool isWanted(KvDictionary* channel, const ChannelArguments& wanted) {
  const KvString* const driver = HwReportChannelGetDriverName(channel);
  return (wanted.driver.empty() ||
          (driver != nullptr && driver->view().find(wanted.driver) != std::string_view::npos)) &&
         hasText(HwReportChannelGetGroup(channel), wanted.group) &&
         hasText(HwReportChannelGetSubGroup(channel), wanted.subgroup) &&
         (wanted.categories == 0 ||
          (HwReportChannelGetCategories(channel) & wanted.categories) != 0) &&
         (wanted.format.empty() ||
          formatName(HwReportChannelGetFormat(channel)) == wanted.format) &&
         hasUnit(channel, wanted.unit);
}

// Adds the channels of every driver that publishes some. Names and skips a driver that cannot be
// read; false then.
bool addAllDrivers(const ToolContext& context, KvDictionary& channels) {
  DeviceRegistry& registry = *context.platform->deviceRegistry;
  RegistryHandle drivers = 0;
  const auto published = KvDictionary::create({{kLegendPublicProperty, KvBoolean::of(true)}});
  const RegistryResult result = registry.RegistryCopyMatchingServices(
      KvDictionary::create({{kMatchProperty, published}}), &drivers);
  if (result != 0) {
    complain(context, fmt::format("no device registry: error {:#x}", result), kWrong);
    return false;
  }
  bool complete = true;
  while (const RegistryHandle driver = registry.RegistryIteratorNext(drivers)) {
    KvRef<HwReportError> error;
    const auto found =
        HwReportCopyChannelsForDriver(driver, kHwReportByDriver | kHwReportByGroup, &error);
    if (found) {
      HwReportMergeChannels(&channels, found.get());
    } else {
      const auto name = HwReportCopyDriverName(driver);
      complain(context,
               textOf(name.get()) + ": its channels cannot be read: " + reasonOf(error.get()),
               kWrong);
      complete = false;
    }
    registry.HandleRelease(driver);
  }
  if (!registry.RegistryIteratorIsValid(drivers)) {
    complain(context, "the registry changed meanwhile; ask again", kWrong);
    complete = false;
  }
  registry.HandleRelease(drivers);
  return complete;
}

// The wanted channels of all drivers; null, after a complaint, if there are none.
KvRef<KvDictionary> chooseChannels(const ToolContext& context, const ChannelArguments& wanted,
                                   bool* complete) {
  auto channels = HwReportCreateAggregate(kHwReportByDriver | kHwReportByGroup);
  *complete = addAllDrivers(context, *channels);
  const std::int32_t published = HwReportGetChannelCount(channels.get());
  if (published > 0) {
    HwReportPrune(channels.get(), [&wanted](KvDictionary* channel) {
      return isWanted(channel, wanted) ? HwIterContinue : HwIterDrop;
    });
  }
  if (published > 0 && HwReportGetChannelCount(channels.get()) > 0) return channels;
  complain(context,
           published > 0
               ? "none of the " + counted(static_cast<std::uint64_t>(published), "channel") +
                     " fits the filters"
               : "no driver publishes channels",
           kWrong);
  return nullptr;
}

std::vector<KvDictionary*> channelsOf(KvDictionary& collection) {
  std::vector<KvDictionary*> channels;
  HwReportIterate(&collection, [&channels](KvDictionary* channel) {
    channels.push_back(channel);
    return HwIterContinue;
  });
  return channels;
}

int list(const ToolContext& context, const ChannelArguments& wanted) {
  bool complete = false;
  const auto channels = chooseChannels(context, wanted, &complete);
  if (context.json) {
    Json document = Json::array();
    if (channels) {
      for (KvDictionary* channel : channelsOf(*channels)) {
        document.push_back(jsonOfChannel(*channel));
        if (wanted.verbose) addDetails(document.back(), *channel);
      }
    }
    printJson(context, document);
  } else if (channels) {
    for (KvDictionary* channel : channelsOf(*channels)) {
      std::string text = textOf(HwReportChannelCopyDescription(channel, 0, nullptr).get());
      if (text.ends_with('\n')) text.pop_back();
      printLine(context, text);
      const std::string details = wanted.verbose ? detailsText(*channel) : "";
      if (!details.empty()) printLine(context, "  " + details, Ink::Faint);
    }
  }
  return channels && complete ? kSuccess : kWrong;
}

// Waits, and shows the remaining time on a terminal.
void wait(const ToolContext& context, double seconds) {
  const auto end =
      steady_clock::now() + std::chrono::duration_cast<steady_clock::duration>(Seconds(seconds));
  for (auto now = steady_clock::now(); now < end; now = steady_clock::now()) {
    const steady_clock::duration rest = end - now;
    if (!context.errors.escapes) {
      std::this_thread::sleep_for(rest);
      continue;
    }
    print(context.err, fmt::format("\r\x1b[Kwaiting for the second sample: {:.0f} s",
                                   std::ceil(Seconds(rest).count())));
    std::fflush(context.err);
    std::this_thread::sleep_for(
        std::min<steady_clock::duration>(rest, std::chrono::milliseconds(200)));
  }
  if (context.errors.escapes) print(context.err, "\r\x1b[K");
}

struct Sample {
  KvRef<KvDictionary> first, second;  // second: null without --delta
  double seconds = 0;                 // between them
  // Channels that were wanted and are not in the sample: those that the hub does not serve, and
  // those whose source has no value at the moment, as the kernel's may.
  std::uint64_t unserved = 0, withoutValue = 0;
};

std::tuple<std::uint64_t, std::uint64_t> keyOf(const KvDictionary* channel) {
  return {HwReportChannelGetDriverID(channel), HwReportChannelGetChannelID(channel)};
}

void countMissing(KvDictionary& subscribed, KvDictionary& sampled, Sample* sample) {
  std::set<std::tuple<std::uint64_t, std::uint64_t>> present;
  for (const KvDictionary* channel : channelsOf(sampled)) present.insert(keyOf(channel));
  for (const KvDictionary* channel : channelsOf(subscribed)) {
    if (present.contains(keyOf(channel))) continue;
    ++(channelDetails(*channel) != nullptr ? sample->withoutValue : sample->unserved);
  }
}

// False, after a complaint, if there is no sample.
bool takeSample(const ToolContext& context, const ChannelArguments& wanted, KvDictionary& channels,
                Sample* sample) {
  KvRef<HwReportError> error;
  KvRef<KvDictionary> subscribed;
  const auto subscription = HwReportCreateSubscription(nullptr, &channels, &subscribed, 0, &error);
  if (!subscription) {
    complain(context, "no subscription: " + reasonOf(error.get()), kWrong);
    return false;
  }
  const auto begin = steady_clock::now();
  sample->first = HwReportCreateSamples(subscription.get(), subscribed.get(), &error);
  if (sample->first && wanted.delta > 0) {
    wait(context, wanted.delta);
    sample->second = HwReportCreateSamples(subscription.get(), subscribed.get(), &error);
    sample->seconds = Seconds(steady_clock::now() - begin).count();
  }
  const KvRef<KvDictionary>& last = wanted.delta > 0 ? sample->second : sample->first;
  if (!last) {
    complain(context, "no sample: " + reasonOf(error.get()), kWrong);
    return false;
  }
  countMissing(*subscribed, *last, sample);
  return true;
}

// The differences channel by channel, so that one that cannot be subtracted does not affect others.
std::vector<KvRef<KvDictionary>> differences(const ToolContext& context, const Sample& sample,
                                             bool* complete) {
  std::map<std::tuple<std::uint64_t, std::uint64_t>, KvDictionary*> earlier;
  for (KvDictionary* channel : channelsOf(*sample.first)) {
    earlier.try_emplace(keyOf(channel), channel);
  }
  std::vector<KvRef<KvDictionary>> result;
  for (KvDictionary* channel : channelsOf(*sample.second)) {
    const auto before = earlier.find(keyOf(channel));
    auto difference =
        before != earlier.end() ? HwReportSampleCreateDelta(before->second, channel) : nullptr;
    if (difference) {
      result.push_back(std::move(difference));
    } else {
      complain(context, channelName(*channel) + ": the two samples cannot be subtracted", kWrong);
      *complete = false;
    }
  }
  return result;
}

void printSample(const ToolContext& context, const std::vector<KvDictionary*>& channels,
                 std::optional<double> seconds) {
  if (!context.json) {
    ChannelPrinter printer(context, seconds);
    for (KvDictionary* channel : channels) printer.print(*channel);
    return;
  }
  Json document = {{"seconds", seconds ? Json(*seconds) : Json()}, {"channels", Json::array()}};
  for (KvDictionary* channel : channels) document["channels"].push_back(jsonOfSample(*channel));
  printJson(context, document);
}

int sample(const ToolContext& context, const ChannelArguments& wanted) {
  bool complete = false;
  const auto channels = chooseChannels(context, wanted, &complete);
  Sample taken;
  if (!channels || !takeSample(context, wanted, *channels, &taken)) {
    if (context.json) printSample(context, {}, std::nullopt);
    return kWrong;
  }
  if (taken.second) {
    const auto changed = differences(context, taken, &complete);
    std::vector<KvDictionary*> borrowed;
    borrowed.reserve(changed.size());
    for (const auto& channel : changed) borrowed.push_back(channel.get());
    printSample(context, borrowed, taken.seconds);
  } else {
    printSample(context, channelsOf(*taken.first), std::nullopt);
  }
  if (taken.unserved > 0) {
    complain(context, counted(taken.unserved, "channel") + " not served by the hub", kWrong);
    complete = false;
  }
  if (taken.withoutValue > 0 && !context.json) {
    printLine(context, "");
    printLine(context, counted(taken.withoutValue, "channel") + " without a value now", Ink::Faint);
  }
  return complete ? kSuccess : kWrong;
}

void addFilters(Command command, ChannelArguments& wanted) {
  command.option("--driver", kTextValue, &wanted.driver,
                 "Only drivers whose name or id contains it");
  command.option("--group", {"NAME", ValueKind::Text}, &wanted.group, "Only this group");
  command.option("--subgroup", {"NAME", ValueKind::Text}, &wanted.subgroup, "Only this subgroup");
  command
      .option("--category", {"BITS", ValueKind::Number}, &wanted.categories,
              "Only these category bits (0x100)")
      .within(0x1, 0xFFFF);
  command
      .option("--format", {"FORMAT", ValueKind::Text}, &wanted.format,
              "Only this format: simple, state, histogram or array")
      .oneOf({"simple", "state", "histogram", "array"});
  command.option("--unit", {"UNIT", ValueKind::Text}, &wanted.unit,
                 "Only this unit: its label, or its word (0x...)");
  command.canPlay();
}

}  // namespace

void addChannelCommands(CLI::App& app, ToolContext& context) {
  CLI::App& family =
      addFamily(app, "channels", "Show the statistics channels that drivers publish");
  CommandGroup<ChannelArguments> channels(family, context);
  ChannelArguments& wanted = channels.arguments();
  Command command = channels.add("list", "List the statistics channels", list);
  addFilters(command, wanted);
  command.flag("--verbose", &wanted.verbose, "Also say what each one means and where it is read");
  command = channels.add(
      "sample", "Print the values of channels; exit status 1 if one is not served", sample);
  addFilters(command, wanted);
  command
      .option("--delta", {"SECONDS", ValueKind::Number}, &wanted.delta,
              "Show what changes in this many seconds")
      .within(0.001, kLongestWait);
  addKeepCommand(family, context);
}

}  // namespace tally::tools
