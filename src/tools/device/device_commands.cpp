#include "tools/device/device_commands.h"

#include <chrono>
#include <memory>
#include <nlohmann/json.hpp>
#include <thread>

#include <fmt/core.h>

#include "host/host_platform.h"
#include "host/record/pseudonyms.h"
#include "host/record/recording_folder.h"
#include "host/record/tree_recorder.h"
#include "hwreport/hwreport.h"
#include "report/device_metrics.h"
#include "storage/exporter.h"
#include "storage/nand_info.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr int kMostSeconds = 3600;
constexpr std::uint32_t kDefaultSeconds = 5;

struct RecordArguments {
  std::string folder;
  std::optional<std::uint32_t> seconds;
  bool raw = false;
};

// What is missing on the device is missing in the recording too.
struct SilentLog final : SystemLog {
  bool enabled(LogLevel) const override { return false; }
  void write(LogLevel, std::string_view) override {}
};

// Reads everything that the programs read of the kernel.
void readDevice(const DeviceRoot& root, std::shared_ptr<const SystemTree> tree) {
  PlatformScope scope(makeHostPlatform(
      root, {std::make_shared<SilentLog>(), /*readOnlyPreferences=*/true, std::move(tree)}));
  Platform& services = scope.services();
  if (const auto channels = HwReportCopyAllChannels(0)) {
    KvRef<KvDictionary> subscribed;
    const auto subscription =
        HwReportCreateSubscription(nullptr, channels.get(), &subscribed, 0, nullptr);
    if (subscription) HwReportCreateSamples(subscription.get(), subscribed.get(), nullptr);
  }
  const NandExporter* exporter = nullptr;
  if (const RegistryHandle storage = findNandExporter(&exporter)) {
    services.deviceRegistry->HandleRelease(storage);
    CopyNANDInfo();
  }
  services.flashDisks->disks();
  for (const KernelValueName& value : kernelValuesOfReport()) {
    std::byte buffer[32];
    std::size_t length = std::min(sizeof buffer, value.width);
    services.kernelValues->readKernelValue(value.name, {buffer, length}, &length);
  }
  services.kernelValues->MonotonicTicks();
  services.logHeaderFacts->HardwareModelString();
}

// Each sample is called by the second that it was due, or by the later one that it was taken in.
void takeSamples(const ToolContext& context, TreeRecorder& recorder, std::uint32_t seconds) {
  using std::chrono::steady_clock;
  const auto begin = steady_clock::now();
  for (std::uint32_t second = 1; second <= seconds; ++second) {
    const auto due = begin + std::chrono::seconds(second);
    if (steady_clock::now() > due + std::chrono::seconds(1)) continue;
    if (context.errors.escapes) {
      print(context.err, fmt::format("\r\x1b[Krecording: {} s", seconds - second + 1));
      std::fflush(context.err);
    }
    std::this_thread::sleep_until(due);
    if (!recorder.takeSample(std::int64_t{second} * 1000)) break;
  }
  if (context.errors.escapes) print(context.err, "\r\x1b[K");
}

void complainOfFaults(const ToolContext& context, const RecordedTree& recorded) {
  constexpr std::size_t kMostNamed = 20;
  const std::size_t count = recorded.faults.size();
  for (std::size_t i = 0; i < std::min(count, kMostNamed); ++i) {
    complain(context, recorded.faults[i], kSuccess);
  }
  if (count > kMostNamed) {
    complain(context, counted(count - kMostNamed, "file") + " more could not be recorded",
             kSuccess);
  }
}

int record(const ToolContext& context, const RecordArguments& arguments) {
  if (const auto possible = checkRecordingFolder(arguments.folder); !possible) {
    return complain(context, possible.error().message, kWrong);
  }
  const DeviceRoot root(context.root);
  TreeRecorder recorder(root);
  readDevice(root, recorder.observedTree());
  recorder.take();
  takeSamples(context, recorder, arguments.seconds.value_or(kDefaultSeconds));
  RecordedTree recorded = recorder.finish();
  if (!arguments.raw) recorded = anonymous(recorded);
  if (const auto written = writeRecording(recorded, arguments.folder); !written) {
    return complain(context, written.error().message, kWrong);
  }
  complainOfFaults(context, recorded);
  std::uint64_t files = 0, bytes = 0;
  for (const auto& [path, entry] : recorded.entries) {
    if (entry.type == TreeEntry::Type::File) ++files;
    bytes += entry.text.size();
  }
  for (const auto& [time, changed] : recorded.samples) {
    for (const auto& [path, content] : changed) bytes += content.size();
  }
  if (context.json) {
    printJson(context, {{"files", files},
                        {"samples", recorded.samples.size() + 1},
                        {"bytes", bytes},
                        {"leftOut", recorded.faults.size()}});
  } else {
    printLine(context,
              fmt::format("{}, {}, {}", counted(files, "file"),
                          counted(recorded.samples.size() + 1, "sample"), byteText(bytes)));
  }
  return kSuccess;
}

}  // namespace

void addDeviceCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<RecordArguments> device(
      addFamily(app, "device", "Record what the kernel shows of this device"), context);
  RecordArguments& arguments = device.arguments();
  const Command command = device.add(
      "record", "Copy every file that the programs read to a directory, which is then this device",
      record);
  command.argument({"DIR", ValueKind::Directory}, &arguments.folder,
                   "The directory, which must be new or empty");
  command
      .option("--seconds", {"N", ValueKind::Number}, &arguments.seconds,
              "Record for this long, a sample each second (5)")
      .within(0, kMostSeconds);
  command.flag("--raw", &arguments.raw,
               "Keep serial numbers, addresses, and the names of the host and its interfaces");
}

}  // namespace tally::tools
