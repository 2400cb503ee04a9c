#include "faults/sample_device.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <new>
#include <numeric>

#include "base/files/file.h"
#include "driver/daily_job.h"
#include "driver/tasking.h"
#include "driver/telemetry_sweep.h"
#include "fakes/fake_platform.h"
#include "host/host_platform.h"
#include "host/store/store_schema.h"
#include "host/store/store_writer.h"
#include "kv/plist_codec.h"

namespace tally::faults {
namespace {

namespace fs = std::filesystem;

constexpr double kSecondsPerDay = 86400;

void require(bool done, const std::string& what) {
  if (done) return;
  fmt::print(stderr, "the sample device cannot be made: {}\n", what);
  std::abort();
}

// On a file system in memory the walks take a fraction of the time.
fs::path placeForDevices() {
  return ::access("/dev/shm", W_OK) == 0 ? fs::path("/dev/shm") : fs::temp_directory_path();
}

// Written by the child, read by its parent.
Acknowledged& acknowledged() {
  static void* const shared = ::mmap(nullptr, sizeof(Acknowledged), PROT_READ | PROT_WRITE,
                                     MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  require(shared != MAP_FAILED, "no shared memory");
  static Acknowledged* const record = new (shared) Acknowledged;
  return *record;
}

// Services that record what the real ones acknowledge.

struct NotedSubmission final : LogSubmission {
  explicit NotedSubmission(std::shared_ptr<LogSubmission> service) : real(std::move(service)) {}
  bool SMAWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                const KvDictionary* options, const KvObject* reserved,
                                const Writer& writer) override {
    const bool written = real->SMAWriteLogForSubmission(typeCode, name, options, reserved, writer);
    acknowledged().logs += written;
    return written;
  }
  std::shared_ptr<LogSubmission> real;
};

struct NotedEvents final : AnalyticsEvents {
  explicit NotedEvents(std::shared_ptr<AnalyticsEvents> service) : real(std::move(service)) {}
  bool isAvailable() override { return real->isAvailable(); }
  bool isEventWanted(std::string_view name) override { return real->isEventWanted(name); }
  bool PulseSendEventLazy(std::string_view name, const PayloadBuilder& builder) override {
    const bool sent = real->PulseSendEventLazy(name, builder);
    acknowledged().events += sent;
    return sent;
  }
  std::shared_ptr<AnalyticsEvents> real;
};

struct NotedCrashReporting final : CrashReporting {
  explicit NotedCrashReporting(std::shared_ptr<CrashReporting> service)
      : real(std::move(service)) {}
  bool isDiagnosticSubmissionEnabled() override { return real->isDiagnosticSubmissionEnabled(); }
  void FDLogStructuredData(std::uint32_t type, const KvDictionary& record) override {
    real->FDLogStructuredData(type, record);
    acknowledged().records += type == kStorageRecordType;
  }
  void FDDumpAllOldStructuredDataLogs() override { real->FDDumpAllOldStructuredDataLogs(); }
  void rollFixlineLogs() override { real->rollFixlineLogs(); }
  std::shared_ptr<CrashReporting> real;
};

// The day check as the program does it; returns what it said at error level.
std::vector<std::string> dayCheck(const std::string& root) {
  const auto log = std::make_shared<fakes::FakeSystemLog>();
  log->lowest = LogLevel::Error;
  const auto notifications = std::make_shared<fakes::FakeNotifications>();
  notifications->calls = std::make_shared<fakes::CallLog>();
  {
    Platform services = makeHostPlatform(root, {.log = log});
    services.notifications = notifications;
    services.logSubmission = std::make_shared<NotedSubmission>(services.logSubmission);
    services.analyticsEvents = std::make_shared<NotedEvents>(services.analyticsEvents);
    services.crashReporting = std::make_shared<NotedCrashReporting>(services.crashReporting);
    const PlatformScope scope(std::move(services));
    const char* const arguments[] = {"tallyrun", "-d"};
    runDailyJob(platform(), arguments,
                {.runTelemetrySweep =
                     [](Platform& given) {
                       runTelemetrySweep(given);
                       acknowledged().swept = true;
                     },
                 .updateTaskingState =
                     [](Platform& given) {
                       updateTaskingState(given);
                       acknowledged().tasked = true;
                     }});
  }
  return log->texts(LogLevel::Error);
}

}  // namespace

SampleDevice::SampleDevice() {
  std::string name = (placeForDevices() / "tally-faults-XXXXXX").string();
  require(::mkdtemp(name.data()) != nullptr, "no folder");
  folder_ = name;
  fs::copy(FAULT_DEVICE, at(""), fs::copy_options::recursive);
  // One of the days is too old to be kept after the next run.
  record({kDay - 35, kFormerRun - 1});
  fs::create_directories(at("/Library/Preferences"));
  schedule("former");
  // A run without faults some days ago leaves what every later run finds.
  const Ending former = run(kFormerRun);
  require(former.sound && former.errors.empty(),
          fmt::format("the former run: {}", fmt::join(former.errors, "; ")));
  // What the next run has to do: samples to fold, another tasking, logs to roll.
  record({kDay - 1, kDay, kDay + 1});
  schedule("present");
  const std::string repairLogs = at("/var/mobile/Library/Logs/Fixline");
  fs::create_directories(repairLogs);
  std::ofstream(repairLogs + "/fix.log") << "new";
  std::ofstream(repairLogs + "/fix.log.1") << "old";
  std::ofstream(repairLogs + "/fix.log.2") << "older";
  fs::rename(at("/device"), folder_ / "device");  // nothing is ever written there
  fs::rename(at(""), folder_ / "original");
}

SampleDevice::~SampleDevice() {
  std::error_code ignored;
  fs::remove_all(folder_, ignored);
}

void SampleDevice::record(const std::vector<std::int32_t>& days) const {
  auto writer = StoreWriter::open(metricsStoreFile(at("")), IfMissing::Create);
  require(writer && *writer, "the store");
  require(static_cast<bool>((*writer)->begin()), "a transaction");
  for (const std::int32_t day : days) {
    std::vector<double> values(kSamples);
    std::iota(values.begin(), values.end(), 0);
    const std::vector<std::uint32_t> offsets(kSamples, 0);
    require((*writer)->setScalar(day, "count", countOf(day)) &&
                (*writer)->pushSamples(day, "time", values, offsets),
            "a row");
  }
  require(static_cast<bool>((*writer)->commit()), "the rows");
}

void SampleDevice::restore(bool withStore) const {
  if (fs::exists(at("/device"))) fs::rename(at("/device"), folder_ / "device");
  fs::remove_all(at(""));
  fs::copy(folder_ / "original", at(""), fs::copy_options::recursive);
  fs::rename(folder_ / "device", at("/device"));
  if (!withStore) fs::remove_all(at("/var/mobile/Library/Tallybook"));
}

Ending SampleDevice::run(std::int32_t day, const Fault* fault, long n,
                         const std::string& folder) const {
  const std::string output = folder_ / "output", errors = folder_ / "errors";
  faultWasMet() = false;
  acknowledged() = {};
  const pid_t child = ::fork();
  require(child >= 0, "no process");
  if (child == 0) {
    constexpr rlimit kNoCore{0, 0};
    ::setrlimit(RLIMIT_CORE, &kNoCore);
    // What the storage library says on standard error; a sanitizer's report, too.
    ::dup2(::open(output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600), STDERR_FILENO);
    setClock(day * kSecondsPerDay + kSecondsPerDay / 2);
    std::ofstream(errors, std::ios::trunc).close();
    const bool cut = fault != nullptr && fault->effect == Fault::Effect::PowerCut;
    if (cut) followDisk(at(""), folder_ / "kept");
    if (fault != nullptr) arm(*fault, n, at(folder));
    const auto said = dayCheck(at(""));
    if (cut) endWithPowerCut();
    disarm();
    std::ofstream list(errors);
    for (const std::string& line : said) list << line << '\n';
    list.close();
    ::_exit(0);
  }
  int status = 0;
  require(::waitpid(child, &status, 0) == child, "no child");
  Ending ending;
  ending.met = faultWasMet();
  ending.acknowledged = acknowledged();
  // A program that has no memory may end at once.
  ending.killed = (WIFEXITED(status) && WEXITSTATUS(status) == kKilledStatus) ||
                  (ending.met && fault->possible == kNoMemory && WIFSIGNALED(status) &&
                   WTERMSIG(status) == SIGABRT);
  ending.sound = ending.killed || (WIFEXITED(status) && WEXITSTATUS(status) == 0);
  std::ifstream list(errors);
  for (std::string line; std::getline(list, line);) ending.errors.push_back(line);
  if (!ending.sound) {
    ending.errors.push_back(
        fmt::format("ended with status {:#x}: {}", status, *readFile(output, 1u << 20)));
  }
  return ending;
}

void SampleDevice::schedule(const std::string& tasking) const {
  fs::copy_file(at("/schedules/" + tasking + ".plist"),
                at("/Library/Preferences/vellum.Ferryman.plist"),
                fs::copy_options::overwrite_existing);
}

std::string SampleDevice::at(std::string_view path) const {
  return (folder_ / "root").string() + std::string(path);
}

std::vector<std::string> SampleDevice::files(std::string_view folder) const {
  std::vector<std::string> found;
  if (!fs::exists(at(folder))) return found;
  for (const auto& entry : fs::recursive_directory_iterator(at(folder))) {
    if (entry.is_regular_file()) found.push_back(entry.path().string());
  }
  std::sort(found.begin(), found.end());
  return found;
}

std::string SampleDevice::copyOfStore() const {
  const std::string store = metricsStoreFile(at("")).text(), copy = folder_ / "copy";
  // Without the map of the log, which its next reader makes anew.
  for (const char* suffix : {"", "-wal", "-journal"}) {
    fs::remove(copy + suffix);
    if (fs::exists(store + suffix)) fs::copy_file(store + suffix, copy + suffix);
  }
  return fs::exists(copy) ? copy : "";
}

KvRef<KvDictionary> dictionaryIn(const std::string& path) {
  const auto text = readFile(path, 1u << 24);
  const auto root = text ? decodePlist(*text) : Result<KvRef<KvObject>>(text.error());
  return root ? KvRef<KvDictionary>::share(kvCast<KvDictionary>(root->get())) : nullptr;
}

std::int64_t countOf(std::int32_t day) { return day % 1000; }

}  // namespace tally::faults
