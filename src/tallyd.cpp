// tallyd: records metrics for other programs.
#include <link.h>
#include <malloc.h>
#include <sys/mman.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/child_process.h"
#include "base/process.h"
#include "base/version.h"
#include "host/ingress/socket_ingress.h"
#include "host/store/recording/recording_store.h"
#include "host/store/store_schema.h"
#include "host/system/environment.h"
#include "host/system/machine/machine.h"
#include "host/system/standard_streams.h"
#include "host/system/system_log.h"
#include "recorder/recorder.h"

namespace tally {
namespace {

constexpr int kFailed = 1, kBadUsage = 2;
constexpr std::string_view kHelp =
    "Usage: tallyd [--udp ADDRESS]...\n"
    "\n"
    "Records the metrics that other programs send in StatsD lines, on the sockets that systemd\n"
    "passes or, started by hand, on its own ones in run/tallyd below TALLYRUN_ROOT.\n"
    "\n"
    "  --udp ADDRESS  also listen there: 127.0.0.1:8125, [::1]:8125, or another loopback port\n"
    "  --version      print the version\n"
    "  --help         print this text\n";

struct Arguments {
  std::vector<std::string> udpAddresses;
  std::optional<int> exitStatus;  // set when there is nothing to run
};

int print(std::FILE* file, std::string_view text, int status) {
  const bool written = std::fwrite(text.data(), 1, text.size(), file) == text.size();
  return std::fflush(file) == 0 && written ? status : kFailed;
}

Arguments readArguments(int count, char** texts) {
  Arguments arguments;
  for (int i = 1; i < count; ++i) {
    const std::string_view text = texts[i];
    if (text == "--version") {
      arguments.exitStatus = print(stdout, "tallyd " + std::string(kProgramVersion) + "\n", 0);
    } else if (text == "--help" || text == "-h") {
      arguments.exitStatus = print(stdout, kHelp, 0);
    } else if (text == "--udp" && i + 1 < count) {
      arguments.udpAddresses.emplace_back(texts[++i]);
      continue;
    } else {
      arguments.exitStatus = print(stderr, kHelp, kBadUsage);
    }
    break;
  }
  return arguments;
}

// The kernel's counters restart with the next boot, which nobody may announce: they are kept every
// hour in which something is committed anyway. By a process of its own, since it takes more memory
// than everything here.
std::function<void()> keepCountersHourly(SystemLog& log) {
  constexpr std::chrono::hours kEvery{1};
  return [&log, kEvery, last = std::chrono::steady_clock::now()]() mutable {
    const auto now = std::chrono::steady_clock::now();
    if (now - last < kEvery) return;
    last = now;
    const auto started =
        startInBackground(std::array<std::string, 3>{"tallyctl", "channels", "keep"});
    if (!started) log.fault("recorder: counters", "{}", started.error().message);
  };
}

// Unmaps the pages that an object's code and constants are in; what is needed again is mapped
// again.
int unmapCode(dl_phdr_info* object, std::size_t, void*) {
  const std::string_view name = object->dlpi_name;
  if (!name.empty() && name.front() != '/') return 0;  // the kernel's own
  const auto page = static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
  for (int i = 0; i < object->dlpi_phnum; ++i) {
    const auto& segment = object->dlpi_phdr[i];
    if (segment.p_type != PT_LOAD || (segment.p_flags & PF_W) != 0) continue;
    const std::uintptr_t address = object->dlpi_addr + segment.p_vaddr;
    const std::uintptr_t begin = address / page * page;
    void* const mapping = reinterpret_cast<void*>(begin);  // NOLINT(performance-no-int-to-ptr)
    (void)::madvise(mapping, address + segment.p_memsz - begin, MADV_DONTNEED);
  }
  return 0;
}

// What was committed was spread over the heap, and most of the code is for commits alone: while it
// is mapped, the kernel keeps it in memory longest.
void returnMemory() {
  ::malloc_trim(0);
  ::dl_iterate_phdr(unmapCode, nullptr);
}

int run(const Arguments& arguments) {
  const DeviceRoot root(deviceRootFromEnvironment());
  const auto log = makeSystemLogOfEnvironment("tallyd");
  auto ingress = openIngress(root, {arguments.udpAddresses}, *log);
  if (!ingress) {
    log->message(LogLevel::Error, "{}", ingress.error().message);
    return kFailed;
  }
  StoreFile file = metricsStoreFile(root);
  file.notify = [log](const std::string& message) { log->write(LogLevel::Error, message); };
  const auto store = makeSqliteRecordingStore(std::move(file));
  Recorder recorder({.store = *store,
                     .ingress = **ingress,
                     .log = *log,
                     .bootId = bootId(),
                     .readSettings = [&] { return readRecorderSettings(root, userNumber, *log); },
                     .clockIsSynchronised = clockIsSynchronised,
                     .onCommitted =
                         [keepCounters = keepCountersHourly(*log)]() mutable {
                           returnMemory();
                           keepCounters();
                         }});
  const auto served = (*ingress)->run(recorder);
  if (!served) log->message(LogLevel::Error, "{}", served.error().message);
  log->writeOmitted();
  return served && !recorder.hasUncommitted() ? 0 : kFailed;
}

}  // namespace
}  // namespace tally

int main(int count, char** texts) {
  tally::surviveFailedWrites();
  tally::prepareStandardStreams();
  const auto arguments = tally::readArguments(count, texts);
  if (arguments.exitStatus) return *arguments.exitStatus;
  // One heap for both threads, and what is freed goes back: the daemon is there all day.
  ::mallopt(M_ARENA_MAX, 1);
  constexpr int kKeptBytes = 256 << 10;
  ::mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  return tally::run(arguments);
}
