#include "tools/channel_commands.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <chrono>
#include <memory>
#include <nlohmann/json.hpp>
#include <thread>

#include "hwreport/channels.h"
#include "hwreport/descriptions.h"
#include "hwreport/samples.h"
#include "tools/channel_filter.h"
#include "tools/channel_view.h"
#include "tools/output.h"

namespace tally::tools {
namespace {

// Longer than anybody waits for a difference.
constexpr double kLongestDelta = 86400;

std::string reasonOf(const KvRef<HwReportError>& error, std::string_view what) {
  if (!error) return std::string(what);
  return fmt::format("{}: {} (code {:#x})", what, error->failureReason(), error->code());
}

// The wanted channels; null after a complaint.
KvRef<KvDictionary> chosenChannels(const ToolContext& context, const ChannelFilter& filter) {
  KvRef<HwReportError> error;
  auto channels = HwReportCopyAllChannels(0, &error);
  if (!channels) {
    complain(context, reasonOf(error, "the channels cannot be read"), kWrong);
    return nullptr;
  }
  HwReportPrune(channels.get(), [&filter](KvDictionary* channel) {
    return filter.admits(channel) ? HwIterContinue : HwIterDrop;
  });
  if (HwReportGetChannelCount(channels.get()) <= 0) {
    complain(context, "no such channel", kWrong);
    return nullptr;
  }
  return channels;
}

int runList(const ToolContext& context, const ChannelFilter& filter) {
  const auto channels = chosenChannels(context, filter);
  if (!channels) return kWrong;
  Json list = Json::array();
  HwReportIterate(channels.get(), [&](KvDictionary* channel) {
    if (context.json) {
      list.push_back(channelIdentity(channel));
    } else if (const auto line = HwReportChannelCopyDescription(channel, 0, nullptr)) {
      std::string_view text = line->view();
      if (text.ends_with('\n')) text.remove_suffix(1);
      printLine(context, text);
    }
    return HwIterContinue;
  });
  if (context.json) printJson(context, list);
  return kSuccess;
}

// Waits, and shows on a terminal that it does.
void waitFor(const ToolContext& context, double seconds) {
  using Clock = std::chrono::steady_clock;
  const auto end = Clock::now() + std::chrono::duration_cast<Clock::duration>(
                                      std::chrono::duration<double>(seconds));
  constexpr std::chrono::milliseconds kStep{200};
  for (auto now = Clock::now(); now < end; now = Clock::now()) {
    if (context.errors.interactive) {
      const auto left = std::chrono::duration<double>(end - now).count();
      print(context.err, fmt::format("\rwaiting for the second sample, {:.0f} s left ", left));
      std::fflush(context.err);
    }
    std::this_thread::sleep_for(std::min<Clock::duration>(kStep, end - now));
  }
  if (context.errors.interactive) print(context.err, "\r\x1b[K");
}

// A sample, or the difference of two when seconds are given; null after a complaint.
KvRef<KvDictionary> takeSample(const ToolContext& context, KvDictionary* channels,
                               std::optional<double> seconds) {
  KvRef<HwReportError> error;
  KvRef<KvDictionary> subscribed;
  const auto subscription = HwReportCreateSubscription(nullptr, channels, &subscribed, 0, &error);
  const auto sample = [&] {
    return subscription ? HwReportCreateSamples(subscription.get(), subscribed.get(), &error)
                        : nullptr;
  };
  auto result = sample();
  if (result && seconds) {
    waitFor(context, *seconds);
    const auto later = sample();
    result = later ? HwReportCreateSamplesDelta(result.get(), later.get(), &error) : nullptr;
  }
  if (!result) complain(context, reasonOf(error, "the channels cannot be sampled"), kWrong);
  return result;
}

int runSample(const ToolContext& context, const ChannelFilter& filter,
              std::optional<double> seconds) {
  const auto channels = chosenChannels(context, filter);
  if (!channels) return kWrong;
  const auto samples = takeSample(context, channels.get(), seconds);
  if (!samples) return kWrong;
  Json list = Json::array();
  ChannelPrinter printer(context);
  HwReportIterate(samples.get(), [&](KvDictionary* channel) {
    if (context.json) {
      list.push_back(sampledChannel(channel));
    } else {
      printer.add(channel);
    }
    return HwIterContinue;
  });
  if (context.json) {
    printJson(context, list);
  } else {
    printer.finish();
  }
  return kSuccess;
}

}  // namespace

void addChannelCommands(CLI::App& app, ToolContext& context) {
  CLI::App* channels =
      app.add_subcommand("channels", "Statistics channels that the kernel's drivers publish");
  channels->require_subcommand(1);

  CLI::App* list = channels->add_subcommand("list", "The channels, a line each");
  const auto listed = std::make_shared<ChannelFilter>();
  listed->addOptions(*list);
  list->callback([&context, listed] {
    context.command = [&context, listed] { return runList(context, *listed); };
  });

  CLI::App* sample = channels->add_subcommand("sample", "What the channels hold now");
  const auto sampled = std::make_shared<ChannelFilter>();
  sampled->addOptions(*sample);
  const auto seconds = std::make_shared<std::optional<double>>();
  sample->add_option("--delta", *seconds, "What changed within so many seconds")
      ->type_name("SECONDS")
      ->check(CLI::Range(0.0, kLongestDelta));
  sample->callback([&context, sampled, seconds] {
    context.command = [&context, sampled, seconds] {
      return runSample(context, *sampled, *seconds);
    };
  });
}

}  // namespace tally::tools
