// Subscribing to channels at the statistics hub, sampling them, and subtracting samples.
#pragma once

#include <atomic>
#include <cstdint>
#include <string_view>

#include "hwreport/error.h"
#include "kv/value.h"

namespace tally {

// A connection to the hub with its mapped memory; both are released with the last reference.
class TALLY_API HwReportSubscription {
 public:
  static constexpr std::string_view kTypeName = "HwReportSubscription";
  HwReportSubscription(const HwReportSubscription&) = delete;
  HwReportSubscription& operator=(const HwReportSubscription&) = delete;
  void retain() const noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
  void release() const noexcept {
    if (references_.fetch_sub(1, std::memory_order_acq_rel) == 1) finalize();
  }

 protected:
  HwReportSubscription() noexcept = default;
  ~HwReportSubscription() = default;

 private:
  void finalize() const noexcept;
  mutable std::atomic<std::uint32_t> references_{1};
};

// Asks the hub for the desired channels. On success *subscribed is a copy of the collection, with
// the same levels and copies of the channels; later samples are taken with it. Allocator and
// reserved are not used (null and 0). Null on failure.
TALLY_API KvRef<HwReportSubscription> HwReportCreateSubscription(
    const void* allocator, KvDictionary* desired, KvRef<KvDictionary>* subscribed,
    std::uint32_t reserved, KvRef<HwReportError>* error = nullptr);

// A sample: copies of the subscribed channels with their elements as they are now. A channel that
// the hub does not serve is left out. Independent of the subscription once made. Null on failure.
TALLY_API KvRef<KvDictionary> HwReportCreateSamples(HwReportSubscription* subscription,
                                                    KvDictionary* subscribed,
                                                    KvRef<HwReportError>* error = nullptr);
// The same from a buffer of 64-byte elements, a run for each channel, in any order.
TALLY_API KvRef<KvDictionary> HwReportCreateSamplesRaw(KvDictionary* subscribed, const KvData* raw,
                                                       KvRef<HwReportError>* error = nullptr);

// later - earlier, channel by channel. A channel that the earlier sample does not have keeps its
// absolute values. Both must have the same driver and group levels. Null on failure.
TALLY_API KvRef<KvDictionary> HwReportCreateSamplesDelta(KvDictionary* earlier, KvDictionary* later,
                                                         KvRef<HwReportError>* error = nullptr);
// The same for one channel.
TALLY_API KvRef<KvDictionary> HwReportSampleCreateDelta(KvDictionary* earlier, KvDictionary* later,
                                                        KvRef<HwReportError>* error = nullptr);

}  // namespace tally
