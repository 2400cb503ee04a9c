// A platform in memory for unit tests: every service records its calls and answers with what the
// test has set. FakePlatform keeps each fake by its own type; install() makes it the platform in
// force.
#pragma once

#include <algorithm>
#include <cmath>
#include <cstring>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "fakes/fake_metrics_store.h"
#include "platform/platform.h"

namespace tally::fakes {

// The order in which the services with an effect were called, one line a call.
using CallLog = std::vector<std::string>;

struct FakeSystemLog final : SystemLog {
  struct Line {
    LogLevel level;
    std::string text;
    bool operator==(const Line&) const = default;
  };
  using SystemLog::Repeats;
  LogLevel lowest = LogLevel::Debug;
  std::vector<Line> lines;

  explicit FakeSystemLog(Repeats repeats = Repeats::All) : SystemLog(repeats) {}

  bool enabled(LogLevel level) const override { return level >= lowest; }
  void write(LogLevel level, std::string_view message) override {
    lines.push_back({level, std::string(message)});
  }
  std::vector<std::string> texts(LogLevel level) const {
    std::vector<std::string> found;
    for (const Line& line : lines) {
      if (line.level == level) found.push_back(line.text);
    }
    return found;
  }
  bool has(LogLevel level, std::string_view text) const {
    return std::any_of(lines.begin(), lines.end(),
                       [&](const Line& line) { return line.level == level && line.text == text; });
  }
};

struct FakeClock final : Clock {
  double now = 0;
  double secondsSince1970() const override { return now; }
  void setDay(std::int32_t day, double secondsIntoDay = 0) {
    now = static_cast<double>(day) * 86400.0 + secondsIntoDay;
  }
};

struct FakeEventLoop final : EventLoop {
  std::vector<SliceResult> results;  // handed out in order; TimedOut when there are none left
  std::vector<double> slices;        // the seconds asked for
  std::size_t next = 0;

  SliceResult runMainLoopSlice(double seconds, bool) override {
    slices.push_back(seconds);
    return next < results.size() ? results[next++] : SliceResult::TimedOut;
  }
};

struct FakeFiles final : Files {
  std::map<std::string, std::string, std::less<>> contents;
  std::map<std::string, std::uint64_t, std::less<>> sizes;  // of files without contents
  std::vector<std::string> reads;
  std::size_t pieceSize = SIZE_MAX;  // at most this much of an open file is read at once

  Result<std::string> readFile(std::string_view path, std::size_t limit) override {
    reads.emplace_back(path);
    const auto found = contents.find(path);
    if (found == contents.end()) return Error{std::string(path) + ": No such file or directory", 2};
    if (found->second.size() > limit) return Error{std::string(path) + ": too large"};
    return found->second;
  }
  Result<FileSource> openFile(std::string_view path, std::size_t limit) override {
    auto whole = readFile(path, limit);
    if (!whole) return whole.error();
    return FileSource([left = *std::move(whole),
                       piece = pieceSize](std::span<char> into) mutable -> Result<std::size_t> {
      const std::size_t count = std::min({left.size(), into.size(), piece});
      std::copy_n(left.begin(), count, into.begin());
      left.erase(0, count);
      return count;
    });
  }
  std::optional<std::uint64_t> fileSize(std::string_view path) override {
    if (const auto found = sizes.find(path); found != sizes.end()) return found->second;
    if (const auto found = contents.find(path); found != contents.end()) {
      return found->second.size();
    }
    return std::nullopt;
  }
};

struct FakeRunLock final : RunLock {
  std::shared_ptr<CallLog> calls;
  int depth = 0, entered = 0;
  bool held = false;  // by another run

  bool enter() override {
    ++entered;
    if (held) return false;
    if (depth++ == 0) calls->push_back("lock");
    return true;
  }
  void leave() override {
    if (--depth == 0) calls->push_back("unlock");
  }
};

struct FakePreferences final : Preferences {
  std::shared_ptr<CallLog> calls;
  std::map<std::pair<std::string, std::string>, KvRef<KvObject>> values;  // by domain and key
  std::set<std::string> failingDomains;  // whose synchronisation fails
  std::string unreadableDomain;
  bool isReadable(std::string_view domain) override { return domain != unreadableDomain; }

  KvRef<KvObject> SMAPreferencesGetValue(std::string_view key, std::string_view domain) override {
    const auto found = values.find({std::string(domain), std::string(key)});
    return found == values.end() ? nullptr : found->second;
  }
  // Recorded as "set DOMAIN KEY=VALUE" or "remove DOMAIN KEY".
  void SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                              std::string_view domain) override {
    const std::string name = std::string(domain) + " " + std::string(key);
    calls->push_back(value ? "set " + name + "=" + kvText(value.get()) : "remove " + name);
    put(key, std::move(value), domain);
  }
  WriteResult SMAPreferencesSynchronize(std::string_view domain) override {
    calls->push_back("synchronize " + std::string(domain));
    return failingDomains.contains(std::string(domain)) ? WriteResult::Failed
                                                        : WriteResult::Written;
  }
  // Sets a value without recording the call; null removes it.
  void put(std::string_view key, KvRef<KvObject> value, std::string_view domain) {
    std::pair<std::string, std::string> place{domain, key};
    if (value) {
      values[std::move(place)] = std::move(value);
    } else {
      values.erase(place);
    }
  }
};

struct FakeNotifications final : Notifications {
  std::shared_ptr<CallLog> calls;
  void postSystemNotification(std::string_view name) override {
    calls->push_back("post " + std::string(name));
  }
  void offerSystemNotification(std::string_view name) override {
    calls->push_back("offer " + std::string(name));
  }
};

// Writes are recorded as "system DOMAIN KEY=VALUE" or "... removed", with " unsynced" at the end.
struct FakeSystemConfiguration final : SMASystemConfiguration {
  std::shared_ptr<CallLog> calls;
  std::map<std::string, WriteResult> failures;                            // by "DOMAIN KEY"
  std::map<std::pair<std::string, std::string>, KvRef<KvObject>> values;  // by domain and key

  KvRef<KvObject> getPreference(std::string_view key, std::string_view domain) override {
    const auto found = values.find({std::string(domain), std::string(key)});
    return found == values.end() ? nullptr : found->second;
  }
  WriteResult setPreference(std::string_view key, KvRef<KvObject> value, std::string_view domain,
                            bool sync) override {
    const std::string name = std::string(domain) + " " + std::string(key);
    calls->push_back("system " + name + (value ? "=" + kvText(value.get()) : " removed") +
                     (sync ? "" : " unsynced"));
    if (const auto failure = failures.find(name); failure != failures.end()) return failure->second;
    values[{std::string(domain), std::string(key)}] = std::move(value);
    return WriteResult::Written;
  }
};

struct FakeServicesClient final : SMAServicesClient {
  std::shared_ptr<CallLog> calls;
  std::map<std::string, WriteResult> failures;    // by "USER DOMAIN KEY"
  std::map<std::string, KvRef<KvObject>> values;  // by "USER DOMAIN KEY"

  WriteResult setPreference(std::string_view key, std::string_view user, std::string_view domain,
                            KvRef<KvObject> value) override {
    const std::string name = nameOf(key, user, domain);
    calls->push_back("user " + name + "=" + kvText(value.get()));
    if (const auto failure = failures.find(name); failure != failures.end()) return failure->second;
    values[name] = std::move(value);
    return WriteResult::Written;
  }
  WriteResult deletePreference(std::string_view key, std::string_view user,
                               std::string_view domain) override {
    const std::string name = nameOf(key, user, domain);
    calls->push_back("user " + name + " deleted");
    if (const auto failure = failures.find(name); failure != failures.end()) return failure->second;
    values.erase(name);
    return WriteResult::Written;
  }
  static std::string nameOf(std::string_view key, std::string_view user, std::string_view domain) {
    return std::string(user) + " " + std::string(domain) + " " + std::string(key);
  }
};

struct FakeLogSubmission final : LogSubmission {
  struct Submitted {
    std::string typeCode, name, body;
    KvRef<KvDictionary> options;  // null when none were given
    bool reservedGiven = false;
    std::size_t writes = 0;
  };
  std::shared_ptr<CallLog> calls;
  std::vector<Submitted> logs;
  bool failWrite = false;   // every write to the log's file fails
  bool failSubmit = false;  // the log is written but not accepted

  bool SMAWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                const KvDictionary* options, const KvObject* reserved,
                                const Writer& writer) override {
    calls->push_back("submit " + std::string(typeCode) + " " + std::string(name));
    struct File final : LogFile {
      std::string body;
      std::size_t writes = 0;
      bool fail = false, failed = false;
      bool write(std::string_view bytes) override {
        ++writes;
        failed = failed || fail;
        if (!failed) body.append(bytes);
        return !failed;
      }
      void abandon(const Error&) override { failed = true; }
    } file;
    file.fail = failWrite;
    writer(file);
    if (file.failed || failSubmit) return false;
    logs.push_back({std::string(typeCode), std::string(name), file.body,
                    options != nullptr ? options->copy() : nullptr, reserved != nullptr,
                    file.writes});
    return true;
  }
};

struct FakeCrashReporting final : CrashReporting {
  std::shared_ptr<CallLog> calls;
  bool submissionEnabled = true;
  std::vector<std::pair<std::uint32_t, KvRef<KvDictionary>>> records;

  bool isDiagnosticSubmissionEnabled() override {
    calls->push_back("isDiagnosticSubmissionEnabled");
    return submissionEnabled;
  }
  void FDLogStructuredData(std::uint32_t recordType, const KvDictionary& record) override {
    calls->push_back("FDLogStructuredData " + std::to_string(recordType));
    records.emplace_back(recordType, record.copy());
  }
  void FDDumpAllOldStructuredDataLogs() override {
    calls->push_back("FDDumpAllOldStructuredDataLogs");
  }
  void rollFixlineLogs() override { calls->push_back("rollFixlineLogs"); }
};

struct FakeCrashSupportLibrary final : CrashSupportLibrary {
  bool present = true;
  std::set<std::string> missingSymbols;
  std::vector<std::string> opened;  // paths
  std::vector<std::string> lookups;

  bool open(std::string_view path) override {
    opened.emplace_back(path);
    return present;
  }
  bool hasSymbol(std::string_view name) override {
    lookups.emplace_back(name);
    return present && !missingSymbols.contains(std::string(name));
  }
};

struct FakeDeviceInformation final : DeviceInformation {
  std::map<std::string, KvRef<KvObject>, std::less<>> answers;
  std::set<std::string, std::less<>> internalSubsystems;
  std::string osVersion = "1.0 (1A1)";
  KvRef<KvDictionary> systemVersion =
      KvDictionary::create({{"ProductName", KvString::create("Test OS")},
                            {"ProductVersion", KvString::create("1.0")},
                            {"ProductBuildVersion", KvString::create("1A1")}});

  KvRef<KvObject> DeviceQuery(std::string_view question) override {
    const auto found = answers.find(question);
    return found == answers.end() ? nullptr : found->second;
  }
  bool HasInternalDiagnostics(std::string_view subsystem) override {
    return internalSubsystems.contains(subsystem);
  }
  std::string SMAOSVersion() override { return osVersion; }
  KvRef<KvDictionary> copySystemVersionDictionary() override { return systemVersion->copy(); }
};

struct FakeAppRegistry final : AppRegistry {
  std::vector<std::string> bundleTypes;  // of kind 1
  int enumerations = 0;

  void enumerateBundles(int kind, const std::function<void(std::string_view)>& handler) override {
    ++enumerations;
    if (kind != kBundleKindApplication) return;
    for (const std::string& type : bundleTypes) handler(type);
  }
};

struct FakeLocale final : Locale {
  std::vector<std::string> preferred{"de-CH", "en"};
  std::vector<std::string> system{"en", "de", "fr"};
  std::optional<std::string> region = "CH";

  std::vector<std::string> PreferredLanguages() override { return preferred; }
  std::vector<std::string> SystemLanguages() override { return system; }
  std::optional<std::string> CurrentRegionCode() override { return region; }
};

struct FakeKernelValues final : KernelValues {
  struct Answer {
    std::vector<std::byte> bytes;
    int error = 0;
  };
  // Successive reads of a name get successive answers; the last one is repeated.
  std::map<std::string, std::vector<Answer>, std::less<>> answers;
  std::vector<std::string> reads;
  std::uint64_t ticks = 0;
  std::optional<Timebase> timebase = Timebase{1, 1};

  template <class T>
  void put(std::string_view name, T value) {
    std::vector<std::byte> bytes(sizeof value);
    std::memcpy(bytes.data(), &value, sizeof value);
    answers[std::string(name)] = {{std::move(bytes), 0}};
  }
  void fail(std::string_view name, int error) { answers[std::string(name)] = {{{}, error}}; }

  int readKernelValue(std::string_view name, std::span<std::byte> buffer,
                      std::size_t* length) override {
    constexpr int kNoSuchValue = 2, kDoesNotFit = 12;
    reads.emplace_back(name);
    const auto found = answers.find(name);
    if (found == answers.end() || found->second.empty()) return kNoSuchValue;
    const Answer answer = found->second.front();
    if (found->second.size() > 1) found->second.erase(found->second.begin());
    if (answer.error != 0) return answer.error;
    if (answer.bytes.size() > std::min(buffer.size(), *length)) return kDoesNotFit;
    std::copy(answer.bytes.begin(), answer.bytes.end(), buffer.begin());
    *length = answer.bytes.size();
    return 0;
  }
  std::uint64_t MonotonicTicks() override { return ticks; }
  std::optional<Timebase> TimebaseInfo() override { return timebase; }
};

struct FakeLogHeaderFacts final : LogHeaderFacts {
  int incidents = 0;

  std::string SysIdDescription() override { return "test system"; }
  std::string HardwareModelString() override { return "Model,1"; }
  std::string SystemVersionString() override { return "Test OS 1.0 (1A1)"; }
  std::string NewIncidentID() override { return "INCIDENT-" + std::to_string(++incidents); }
  std::string processName() override { return "tallyrun"; }
  std::int32_t processIdentifier() override { return 321; }
};

struct FakeFlashDisks final : FlashDisks {
  std::vector<FlashDisk> list;
  std::shared_ptr<DeviceRegistry> registry;  // of any disk
  std::vector<FlashDisk> disks() override { return list; }
  std::shared_ptr<DeviceRegistry> registryOf(std::string_view name) override {
    return std::ranges::count(list, name, &FlashDisk::name) > 0 ? registry : nullptr;
  }
};

struct FakePlatform {
  std::shared_ptr<CallLog> calls = std::make_shared<CallLog>();
  std::shared_ptr<FakeSystemLog> log = std::make_shared<FakeSystemLog>();
  std::shared_ptr<FakeClock> clock = std::make_shared<FakeClock>();
  std::shared_ptr<FakeEventLoop> eventLoop = std::make_shared<FakeEventLoop>();
  std::shared_ptr<FakeFiles> files = std::make_shared<FakeFiles>();
  std::shared_ptr<FakeRunLock> runLock = std::make_shared<FakeRunLock>();
  std::shared_ptr<FakePreferences> preferences = std::make_shared<FakePreferences>();
  std::shared_ptr<FakeNotifications> notifications = std::make_shared<FakeNotifications>();
  std::shared_ptr<FakeSystemConfiguration> systemConfiguration =
      std::make_shared<FakeSystemConfiguration>();
  std::shared_ptr<FakeServicesClient> servicesClient = std::make_shared<FakeServicesClient>();
  std::shared_ptr<FakeMetricsStore> metricsStore = std::make_shared<FakeMetricsStore>();
  std::shared_ptr<FakeLogSubmission> logSubmission = std::make_shared<FakeLogSubmission>();
  std::shared_ptr<FakeCrashReporting> crashReporting = std::make_shared<FakeCrashReporting>();
  std::shared_ptr<FakeCrashSupportLibrary> crashSupportLibrary =
      std::make_shared<FakeCrashSupportLibrary>();
  std::shared_ptr<FakeDeviceInformation> deviceInformation =
      std::make_shared<FakeDeviceInformation>();
  std::shared_ptr<FakeAppRegistry> appRegistry = std::make_shared<FakeAppRegistry>();
  std::shared_ptr<FakeLocale> locale = std::make_shared<FakeLocale>();
  std::shared_ptr<FakeKernelValues> kernelValues = std::make_shared<FakeKernelValues>();
  std::shared_ptr<FakeFlashDisks> flashDisks = std::make_shared<FakeFlashDisks>();
  std::shared_ptr<FakeLogHeaderFacts> logHeaderFacts = std::make_shared<FakeLogHeaderFacts>();

  Platform services() const {
    Platform services;
    services.log = log;
    services.clock = clock;
    services.eventLoop = eventLoop;
    services.files = files;
    services.runLock = runLock;
    services.preferences = preferences;
    services.notifications = notifications;
    services.systemConfiguration = systemConfiguration;
    services.servicesClient = servicesClient;
    services.metricsStore = metricsStore;
    services.logSubmission = logSubmission;
    services.crashReporting = crashReporting;
    services.crashSupportLibrary = crashSupportLibrary;
    services.deviceInformation = deviceInformation;
    services.appRegistry = appRegistry;
    services.locale = locale;
    services.kernelValues = kernelValues;
    services.flashDisks = flashDisks;
    services.logHeaderFacts = logHeaderFacts;
    return services;
  }
  // Puts the fakes in force until the returned scope ends.
  std::unique_ptr<PlatformScope> install() const {
    return std::make_unique<PlatformScope>(services());
  }
};

// A platform whose clock shows noon of day 20,000.
inline FakePlatform makeFakePlatform() {
  FakePlatform fake;
  fake.runLock->calls = fake.preferences->calls = fake.logSubmission->calls =
      fake.crashReporting->calls = fake.metricsStore->calls = fake.notifications->calls =
          fake.systemConfiguration->calls = fake.servicesClient->calls = fake.calls;
  fake.clock->setDay(20000, 43200);
  fake.metricsStore->clock = fake.clock;
  return fake;
}

}  // namespace tally::fakes
