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
#include "data/sample_device.h"
#include "figures.h"
#include "host/linux_platform.h"
#include "process_cost.h"

namespace {

using namespace tally;

// With an option for each, a million entries would be more values than a whitelist may have.
enum class Options { Two, ForEveryFourth };

std::string whitelist(int entries, Options options) {
  std::string text =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
      "\t<key>Bench</key>\n\t<dict>\n\t\t<key>ScalarKeys</key>\n\t\t<dict>\n";
  const auto option = [](std::string_view key, std::string_view type, std::string_view value) {
    return fmt::format("\t\t\t\t<key>{0}</key>\n\t\t\t\t<{1}>{2}</{1}>\n", key, type, value);
  };
  const std::string figures = option("sig_fig", "integer", "2");
  const std::string both = figures + option("type", "string", "scalar");
  for (int i = 0; i < entries; ++i) {
    const bool isShort = options == Options::ForEveryFourth;
    text += fmt::format("\t\t\t<key>{}.counter.{}</key>\n",
                        isShort ? "app" : "com.example.subsystem", i);
    text += isShort && i % 4 != 0
                ? "\t\t\t<dict/>\n"
                : fmt::format("\t\t\t<dict>\n{}\t\t\t</dict>\n", isShort ? figures : both);
  }
  return text + "\t\t</dict>\n\t</dict>\n</dict>\n</plist>\n";
}

// Of this process, in the kernel's account of it.
double mebibytes(std::string_view name) {
  std::ifstream status("/proc/self/status");
  for (std::string word; status >> word;) {
    long kibibytes = 0;
    if (word == name && status >> kibibytes) return static_cast<double>(kibibytes) / 1024;
  }
  return 0;
}

// What a command prints.
std::string outputOf(const std::string& command) {
  std::FILE* const pipe = ::popen(command.c_str(), "r");
  char text[256] = {};
  if (pipe != nullptr) text[std::fread(text, 1, sizeof text - 1, pipe)] = '\0';
  return pipe != nullptr && ::pclose(pipe) == 0 ? text : "?";
}

// Where reading stops.
enum class Until { Nothing, Bytes, Content, Tables };

void load(const std::string& root, Until until) {
  Platform platform = makeLinuxPlatform(DeviceRoot(root));
  if (until == Until::Nothing) return;
  if (until == Until::Tables) {
    const double before = mebibytes("VmRSS:");
    const auto kept = Whitelist::load(platform);
    if (!kept) std::exit(1);
    const double peak = mebibytes("VmHWM:") - before;
    ::malloc_trim(0);
    fmt::print("peak {:5.1f} MiB, then holds {:5.1f} MiB", peak, mebibytes("VmRSS:") - before);
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

// Milliseconds of CPU that a command takes beyond one that does the same but what is measured.
double costBeyond(const std::vector<std::string>& without,
                  const std::vector<std::string>& command) {
  constexpr int kRuns = 3;
  const auto base = bench::medianRun(kRuns, without), cost = bench::medianRun(kRuns, command);
  if (base.exitStatus != 0 || cost.exitStatus != 0) std::exit(1);
  return (cost.cpuSeconds - base.cpuSeconds) * 1e3;
}

// Returns the milliseconds of decoding.
double measure(const std::string& self, int entries, Options options) {
  char root[] = "/tmp/bench_whitelist.XXXXXX";
  if (::mkdtemp(root) == nullptr) std::exit(1);
  const std::string path = bench::whitelistPath(root);
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path) << whitelist(entries, options);

  const double decoded = costBeyond({self, "bytes", root}, {self, "content", root});
  const double loaded = costBeyond({self, "nothing", root}, {self, "tables", root});
  const std::string read = "import plistlib, sys; file = open(sys.argv[1], 'rb'); ";
  const double python = costBeyond({"python3", "-c", read + "file.read()", path},
                                   {"python3", "-c", read + "plistlib.load(file)", path});
  fmt::print("{:>9} entries, {}, {:.1f} MiB\n", entries,
             options == Options::Two ? "two options each" : "an option for every fourth",
             static_cast<double>(std::filesystem::file_size(path)) / (1 << 20));
  fmt::print("    decoded               {:7.1f} ms CPU  {:4.0f} ns each\n", decoded,
             decoded * 1e6 / entries);
  fmt::print("    yardstick: plistlib   {:7.1f} ms CPU  {:4.1f} times that\n", python,
             python / decoded);
  fmt::print("    with digest, tables   {:7.1f} ms CPU  {}\n", loaded,
             outputOf(fmt::format("{} tables {}", self, root)));
  std::fflush(stdout);
  std::filesystem::remove_all(root);
  if (options == Options::Two) {
    bench::addFigure("whitelist of 100,000 entries", decoded, "ms CPU", bench::atMost(25));
    bench::addFigure("whitelist, beside plistlib", decoded, "ms CPU", "Python's plistlib", python,
                     bench::noTarget());
  }
  return decoded;
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
  measure(self, 100'000, Options::Two);
  measure(self, 10'000, Options::ForEveryFourth);
  const double tenth = measure(self, 100'000, Options::ForEveryFourth);
  const double million = measure(self, 1'000'000, Options::ForEveryFourth);
  bench::addFigure("whitelist, growth to a million", million, "ns an entry", "of 100,000 entries",
                   tenth * 10, bench::atMost(1.25));
  return 0;
}
