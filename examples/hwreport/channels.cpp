// Lists, samples and prints the statistics channels of a device (TALLYRUN_ROOT, or /).
#include <hwreport/hwreport.h>

int main() {
  using namespace tally;
  const auto channels = HwReportCopyAllChannels(0);
  KvRef<KvDictionary> subscribed;
  const auto subscription = HwReportCreateSubscription(nullptr, channels.get(), &subscribed, 0);
  const auto samples = HwReportCreateSamples(subscription.get(), subscribed.get());
  return HwReportIterate(samples.get(), [](KvDictionary* channel) {
    HwReportWriteStringUTF8(1, HwReportChannelCopyDescription(channel, 0, nullptr).get());
    HwReportWriteStringUTF8(1, HwReportSampleCopyDescription(channel, 0, "  ").get());
    return HwIterContinue;
  });
}
