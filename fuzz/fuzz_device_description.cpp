// device.plist: every service that it answers for is asked.
#include <array>

#include "described_folder.h"
#include "fakes/fake_platform.h"
#include "host/described/described_purgeable_space.h"
#include "host/described/described_stackshot.h"
#include "host/spool/analytics_events.h"
#include "host/spool/submission_consent.h"
#include "host/system/applications.h"
#include "host/system/crash_support_library.h"
#include "host/system/device_information.h"
#include "host/system/kernel_values.h"
#include "host/system/locale.h"
#include "host/system/log_header_facts.h"

using namespace tally;
using fuzz::require;

namespace {

void askKernelValues(LinuxKernelValues& values) {
  std::array<std::byte, 64> buffer;
  for (const std::string_view name : {"Value", "vm.swapusage", "kern.bootsessionuuid"}) {
    for (const std::size_t room : {std::size_t{0}, std::size_t{8}, buffer.size()}) {
      std::size_t length = room;
      values.readKernelValue(name, std::span(buffer).first(room), &length);
      require(length <= buffer.size(), "no more is delivered than fits");
    }
  }
  values.MonotonicTicks();
  values.TimebaseInfo();
}

void askServices(const DeviceRoot& root, const std::shared_ptr<DeviceDescription>& description) {
  const auto log = std::make_shared<fuzz::UnreadLog>();
  const auto preferences = std::make_shared<fakes::FakePreferences>();
  const auto consent = std::make_shared<SubmissionConsent>(root, log, preferences, description);
  consent->given();
  LinuxAnalyticsEvents events(analyticsEventsFolder(root), log,
                              std::make_shared<fakes::FakeClock>(), preferences, description,
                              consent);
  events.isAvailable();
  events.isEventWanted("Value");
  LinuxCrashSupportLibrary library(description);
  if (library.open("Value")) library.hasSymbol("Value");
  DesktopAppRegistry applications({}, description);
  applications.enumerateBundles(kBundleKindApplication, [](std::string_view) {});
}

}  // namespace

FUZZ_TARGET(device_description)(const std::uint8_t* data, std::size_t size) {
  static const fuzz::DescribedFolder folder;
  fuzz::Input input(data, size);
  folder.putInput("device.plist", input);
  const auto description = std::make_shared<DeviceDescription>(DeviceDirectory(folder.root, ""),
                                                               std::make_shared<fuzz::UnreadLog>());

  const auto device = std::make_shared<LinuxDeviceInformation>(folder.root, description);
  device->DeviceQuery("DiskUsage");
  device->DeviceQuery("InternalBuild");
  device->HasInternalDiagnostics("Value");
  device->copySystemVersionDictionary();
  device->SMAOSVersion();
  const auto tree = std::make_shared<const SystemTree>(folder.root);
  LinuxKernelValues values(description, tree);
  askKernelValues(values);
  LinuxLocale locale(folder.root, {}, description);
  locale.PreferredLanguages();
  locale.SystemLanguages();
  locale.CurrentRegionCode();
  LinuxLogHeaderFacts facts(device, description, tree);
  for (const std::string& line : {facts.SysIdDescription(), facts.HardwareModelString()}) {
    require(line.find('\n') == line.npos, "a line of a log's header stays one");
  }
  DescribedStackshot stackshot(DeviceDirectory(folder.root, ""), description);
  if (const auto config = stackshot.stackshotConfigCreate()) {
    config->stackshotConfigSetFlags(0x10000);
    config->stackshotCapture();
    config->stackshotBuffer();
  }
  askServices(folder.root, description);
  DescribedPurgeableSpace space(description);
  if (space.isAvailable()) space.copyItemizedPurgeableSpace(*KvDictionary::create());
  return 0;
}
