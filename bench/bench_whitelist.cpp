// Reading a whitelist of many entries, as the daily job does, beside Python's plistlib on the same
// file. Each measurement is a process of its own ("bench_whitelist NAME ROOT"), so that its peak of
// memory is its own.
#include <fmt/format.h>
#include <malloc.h>
#include <stdlib.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <string_view>

#include "base/files/device_root.h"
#include "config/whitelist.h"
#include "host/linux_platform.h"
#include "process_cost.h"
#include "sample_device.h"

namespace {

using namespace tally;

// Every fourth entry has an option: with one for each, a million of them would be more values than
// a whitelist may have.
std::string whitelist(int entries) {
  std::string text =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
      "\t<key>Bench</key>\n\t<dict>\n\t\t<key>ScalarKeys</key>\n\t\t<dict>\n";
  for (int i = 0; i < entries; ++i) {
    text += fmt::format("\t\t\t<key>app.counter.{}</key>\n", i);
    text += i % 4 != 0 ? "\t\t\t<dict/>\n"
                       : fmt::format(
                             "\t\t\t<dict>\n\t\t\t\t<key>sig_fig</key>\n\t\t\t\t"
                             "<integer>{}</integer>\n\t\t\t</dict>\n",
                             1 + i / 4 % 3);
  }
  return text + "\t\t</dict>\n\t</dict>\n</dict>\n</plist>\n";
}

// Where reading stops.
enum class Until { Nothing, Bytes, Content, Tables };

void load(const std::string& root, Until until) {
  Platform platform = makeLinuxPlatform(DeviceRoot(root));
  if (until == Until::Nothing) return;
  if (until == Until::Tables) {
    if (Whitelist::load(platform) == nullptr) std::exit(1);
    return;
  }
  const auto file = platform.files->openFile(kWhitelistPath, kPlistMaximumBytes);
  if (!file) std::exit(1);
  DocumentWindow window([&](std::span<char> buffer) { return (*file)(buffer).operator*(); });
  if (until == Until::Content && !WhitelistContent::read(window)) std::exit(1);
  while (!window.endsDocument()) window.more(window.text().size());
}

constexpr std::pair<const char*, Until> kMeasurements[] = {{"nothing", Until::Nothing},
                                                           {"bytes", Until::Bytes},
                                                           {"content", Until::Content},
                                                           {"tables", Until::Tables}};

double residentMebibytes() {
  ::malloc_trim(0);
  std::ifstream statistics("/proc/self/statm");
  long size = 0, resident = 0;
  statistics >> size >> resident;
  return static_cast<double>(resident) * 4096 / (1 << 20);
}

// What a command takes beyond another that does the same but for what is measured.
struct Cost {
  double milliseconds, mebibytes;
};
Cost costBeyond(const std::vector<std::string>& without, const std::vector<std::string>& command) {
  constexpr int kRuns = 7;
  const auto base = bench::medianRun(kRuns, without), cost = bench::medianRun(kRuns, command);
  if (base.exitStatus != 0 || cost.exitStatus != 0) std::exit(1);
  return {(cost.cpuSeconds - base.cpuSeconds) * 1e3,
          static_cast<double>(cost.peakKibibytes - base.peakKibibytes) / 1024};
}

void measure(const std::string& self, int entries) {
  char root[] = "/tmp/bench_whitelist.XXXXXX";
  if (::mkdtemp(root) == nullptr) std::exit(1);
  const std::string path = bench::whitelistPath(root);
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path) << whitelist(entries);

  const Cost decoded = costBeyond({self, "bytes", root}, {self, "content", root});
  const Cost loaded = costBeyond({self, "nothing", root}, {self, "tables", root});
  const std::string read = "import plistlib, sys; file = open(sys.argv[1], 'rb'); ";
  const Cost python = costBeyond({"python3", "-c", read + "file.read()", path},
                                 {"python3", "-c", read + "plistlib.load(file)", path});
  Platform platform = makeLinuxPlatform(DeviceRoot(root));
  const double before = residentMebibytes();
  const auto kept = Whitelist::load(platform);
  const double resident = residentMebibytes() - before;
  fmt::print(
      "{:>9} entries, {:5.1f} MiB: decoded in {:6.1f} ms CPU ({:.0f} ns each), plistlib "
      "{:7.1f} ms, {:.0f} times that\n",
      entries, static_cast<double>(std::filesystem::file_size(path)) / (1 << 20),
      decoded.milliseconds, decoded.milliseconds * 1e6 / entries, python.milliseconds,
      python.milliseconds / decoded.milliseconds);
  fmt::print(
      "{:>17} with digest and tables {:6.1f} ms CPU, peak {:5.1f} MiB, then holds {:5.1f} "
      "MiB; plistlib peak {:6.1f} MiB\n",
      "", loaded.milliseconds, loaded.mebibytes, resident, python.mebibytes);
  std::filesystem::remove_all(root);
}

}  // namespace

int main(int count, char** arguments) {
  if (count == 3) {
    for (const auto& [name, until] : kMeasurements) {
      if (name == std::string_view(arguments[1])) return load(arguments[2], until), 0;
    }
    return 2;
  }
  const std::string self = std::filesystem::canonical(arguments[0]);
  for (const int entries : {10'000, 100'000, 1'000'000}) measure(self, entries);
  return 0;
}
