// Prints what each simple channel counted while a second passed (TALLYRUN_ROOT, or /).
#include <hwreport/hwreport.h>

#include <chrono>
#include <iostream>
#include <thread>

int main() {
  using namespace tally;
  const auto channels = HwReportCopyAllChannels(0);
  KvRef<KvDictionary> subscribed;
  KvRef<HwReportError> error;
  const auto subscription = HwReportCreateSubscription(nullptr, channels.get(), &subscribed, 0);
  const auto earlier = HwReportCreateSamples(subscription.get(), subscribed.get(), &error);
  if (!earlier) {
    std::cerr << error->failureReason() << '\n';
    return 1;
  }
  std::this_thread::sleep_for(std::chrono::seconds(1));
  const auto later = HwReportCreateSamples(subscription.get(), subscribed.get());
  const auto delta = HwReportCreateSamplesDelta(earlier.get(), later.get());
  return HwReportIterate(delta.get(), [](KvDictionary* channel) {
    if (HwReportChannelGetFormat(channel) == kHwReportFormatSimple) {
      std::cout << HwReportChannelGetChannelName(channel)->view() << ' '
                << HwReportSimpleGetIntegerValue(channel) << '\n';
    }
    return HwIterContinue;
  });
}
