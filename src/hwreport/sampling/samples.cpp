// Takes samples.
#include "hwreport/samples.h"

#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/raw_element.h"
#include "hwreport/sampling/frame_sampler.h"
#include "hwreport/sampling/subscription.h"

namespace tally {
namespace {

KvRef<KvDictionary> cutSamples(KvDictionary* subscribed, std::span<const std::byte> buffer,
                               KvRef<HwReportError>* error) {
  constexpr const char* kMessage = "couldn't create samples";
  if (subscribed == nullptr || buffer.size() < element::kSize) {
    reportError(error, HwErrBadArgument, kMessage);
    return nullptr;
  }
  HwResult pending = HwErrGeneral;
  KvRef<KvDictionary> samples;
  const int result = transformLevels(
      subscribed, nullptr, false,
      [&](const LevelChannels& channels, const LevelChannels*, KvRef<ChannelFrame>* output) {
        *output = channels.copyWithoutElements();
        const bool whole = channels.isWhole(**output);
        const auto sampled = FrameSampler::sample(**output, buffer);
        if (sampled == FrameSampler::Result::Stopped) return 1;
        if (sampled == FrameSampler::Result::SomeMissing) pending = HwErrNotFound;
        return whole ? HwIterContinue : HwIterFailed;
      },
      &samples);
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
