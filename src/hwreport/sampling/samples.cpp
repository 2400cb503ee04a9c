// Cuts the channels' runs out of the hub's region.
#include "hwreport/samples.h"

#include "hwreport/channel.h"
#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/raw_element.h"
#include "hwreport/sampling/run_index.h"
#include "hwreport/sampling/subscription.h"

namespace tally {
namespace {

// Writes the type of a channel that was requested by its id alone. The legend channel array is
// shared, so every copy of the channel gets it.
void learnType(const KvDictionary& channel, const ElementRun& run) {
  auto* const legend = channel.getAs<KvArray>(*keys().legendChannel);
  if (legend == nullptr) return;
  auto type = KvNumber::uint64(run.typeWord().bits);
  if (legend->size() == kLegendTypeWord) {
    legend->append(std::move(type));
  } else {
    legend->replaceAt(kLegendTypeWord, std::move(type));
  }
}

KvRef<KvDictionary> cutSamples(KvDictionary* subscribed, std::span<const std::byte> buffer,
                               KvRef<HwReportError>* error) {
  constexpr const char* kMessage = "couldn't create samples";
  if (subscribed == nullptr || buffer.size() < element::kSize) {
    reportError(error, HwErrBadArgument, kMessage);
    return nullptr;
  }
  RunIndex index(buffer);
  HwResult pending = HwErrGeneral;
  KvArena arena;
  KvRef<KvDictionary> samples;
  const int result = transformChannels(
      subscribed, arena,
      [&](KvDictionary* channel, KvDictionary* copy) {
        const auto run =
            index.find(HwReportChannelGetDriverID(channel), HwReportChannelGetChannelID(channel));
        if (!run) {
          if (index.stopped()) return 1;
          pending = HwErrNotFound;
          return HwIterDrop;
        }
        if (HwReportChannelGetFormat(channel) == kHwReportFormatUnknown) {
          learnType(*channel, ElementRun(*run));
        }
        copy->set(keys().rawElements, KvData::create(*run, &arena));
        return HwIterContinue;
      },
      &samples,
      [&](const KvDictionary& channel) {
        index.fetch(HwReportChannelGetDriverID(&channel), HwReportChannelGetChannelID(&channel));
      });
  if (!walkFailed(result)) return samples;
  reportError(error, pending, kMessage);
  return nullptr;
}

}  // namespace

KvRef<KvDictionary> HwReportCreateSamples(HwReportSubscription* subscription,
                                          KvDictionary* subscribed, KvRef<HwReportError>* error) {
  if (subscription == nullptr || subscribed == nullptr) {
    reportError(error, HwErrBadArgument);
    return nullptr;
  }
  auto& connection = static_cast<Subscription&>(*subscription);
  if (const HwResult failure = connection.update(); failure != 0) {
    reportError(error, failure);
    return nullptr;
  }
  return cutSamples(subscribed, connection.region(), error);
}

KvRef<KvDictionary> HwReportCreateSamplesRaw(KvDictionary* subscribed, const KvData* raw,
                                             KvRef<HwReportError>* error) {
  return cutSamples(subscribed, raw != nullptr ? raw->bytes() : std::span<const std::byte>(),
                    error);
}

}  // namespace tally
