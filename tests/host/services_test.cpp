// The smaller services on a device root: description, device, applications, kernel values, files,
// the run lock, the event loop and the lines of the log.
#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <systemd/sd-event.h>

#include <chrono>
#include <cstring>

#include "host/bus/event_loop.h"
#include "host/linux_platform.h"
#include "host/system/applications.h"
#include "host/system/device_information.h"
#include "host/system/kernel_values.h"
#include "host/system/locale.h"
#include "host/system/log_header_facts.h"
#include "host/system/private_module.h"
#include "host/system/run_lock.h"
#include "host/system/system_log.h"
#include "host/temporary_root.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

class ServicesTest : public TemporaryRoot {
 protected:
  std::shared_ptr<DeviceDescription> describe(const std::string& dictionary) {
    if (!dictionary.empty()) putPlist("device.plist", "<dict>" + dictionary + "</dict>");
    return std::make_shared<DeviceDescription>(folder(""), log);
  }
};

TEST(SystemLogLines, CannotBeForged) {
  const struct {
    std::string message, line;
  } cases[] = {
      {"a\ntallyrun[error]: forged", "a\\ntallyrun[error]: forged"},
      {"\r\x1b[2K\tx\x7f", "\\x0d\\x1b[2K\\tx\\x7f"},
      {std::string("nul\0end", 7), "nul\\x00end"},
      {"\xc2\x9b"
       "31m \xc2\xa0 \xc3\xa9",
       "\\x9b31m \xc2\xa0 \xc3\xa9"},
      {std::string(20000, 'a'), std::string(16384, 'a') + " [cut short]"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(standardErrorLine(LogLevel::Info, c.message), "tallyrun[info]: " + c.line + "\n");
  }
}

TEST(SystemLogSettings, ComeFromTheEnvironment) {
  const struct {
    const char *destination, *level;
    bool standardError;
    LogLevel lowest;
  } cases[] = {
      {nullptr, nullptr, false, LogLevel::Info},        {"stderr", nullptr, true, LogLevel::Debug},
      {"stderr", "error", true, LogLevel::Error},       {nullptr, "debug", false, LogLevel::Debug},
      {"journal", "default", false, LogLevel::Default}, {"", "loud", false, LogLevel::Info},
  };
  for (const auto& c : cases) {
    const auto settings = systemLogSettings(c.destination, c.level);
    EXPECT_EQ(settings.forceStandardError, c.standardError);
    EXPECT_EQ(settings.lowest, c.lowest);
  }
}

TEST_F(ServicesTest, AModuleIsLoadedOnlyIfNoFurtherUserCanWriteIt) {
  put("bin/program", "");
  const std::string program = at("bin/program"), module = at("lib/tallyrun/m.so");
  const auto fault = [&] { return functionOfModule(program, "m.so", "f").error().message; };
  EXPECT_THAT(fault(), HasSubstr("cannot examine " + module));
  put("lib/tallyrun/m.so", "");
  const struct {
    unsigned program, module, owner;
    const char* fault;
  } cases[] = {{0755, 0644, 0, "cannot load"}, {0755, 0664, 0, "by others"},
               {0775, 0664, 0, "cannot load"}, {0775, 0646, 0, "by others"},
               {0777, 0666, 0, "cannot load"}, {0755, 0644, 12345, "by others"}};
  for (const auto& c : cases) {
    ::chmod(program.c_str(), c.program);
    ::chmod(module.c_str(), c.module);
    if (c.owner != 0 && ::chown(module.c_str(), c.owner, c.owner) != 0) continue;  // only root can
    EXPECT_THAT(fault(), HasSubstr(c.fault)) << std::oct << c.program << ' ' << c.module;
  }
}

TEST_F(ServicesTest, DescriptionFaultsAreOneLineEach) {
  EXPECT_FALSE(describe("")->getAs<KvString>(Described::OSVersion)) << "no description at all";
  EXPECT_TRUE(errors().empty());
  useBoundedLog();
  const auto wrong = describe("<key>OSVersion</key><integer>1</integer>");
  EXPECT_FALSE(wrong->getAs<KvString>(Described::OSVersion));
  EXPECT_FALSE(wrong->getAs<KvString>(Described::OSVersion));
  EXPECT_THAT(errors(), ElementsAre(HasSubstr("\"OSVersion\"")));
  for (const char* damaged : {"<plist><dict>", "<plist version=\"1.0\"><array/></plist>"}) {
    useBoundedLog();
    put("device.plist", damaged);
    const auto description = describe("");
    EXPECT_FALSE(description->getAs<KvString>(Described::OSVersion));
    EXPECT_FALSE(description->getAs<KvDictionary>(Described::Timebase));
    EXPECT_THAT(errors(), ElementsAre(HasSubstr(at("device.plist"))));
  }
}

TEST_F(ServicesTest, DeviceAnswersComeFromTheDescriptionThenTheRootThenLinux) {
  LinuxDeviceInformation host(root, describe(""));
  const auto usage = host.DeviceQuery("DiskUsage");
  const auto* disk = kvCast<KvDictionary>(usage.get());
  ASSERT_TRUE(disk);
  EXPECT_GT(*disk->getInt64(kDOQDiskUsageTotalDiskCapacity), 0);
  EXPECT_LE(*disk->getInt64(kDOQDiskUsageTotalDataAvailable),
            *disk->getInt64(kDOQDiskUsageTotalDiskCapacity));
  EXPECT_FALSE(kvCast<KvBoolean>(host.DeviceQuery("InternalBuild").get())->value());
  EXPECT_FALSE(host.DeviceQuery("ConfigNumber"));
  EXPECT_FALSE(host.HasInternalDiagnostics("x"));
  EXPECT_FALSE(host.SMAOSVersion().empty());

  put("usr/lib/os-release", "NAME=Lib\n");
  EXPECT_EQ(host.SMAOSVersion(), "Lib");
  put("etc/os-release", "NAME=Etc\nVERSION_ID=2\n");
  EXPECT_EQ(host.SMAOSVersion(), "Etc 2");

  LinuxDeviceInformation described(
      root, describe("<key>OSVersion</key><string>9 (9A)</string>"
                     "<key>HasInternalDiagnostics</key><true/>"
                     "<key>SystemVersion</key><dict><key>ProductName</key><string>P</string></dict>"
                     "<key>DeviceAnswers</key><dict><key>InternalBuild</key><true/>"
                     "<key>ConfigNumber</key><data>QUIA</data></dict>"));
  EXPECT_EQ(described.SMAOSVersion(), "9 (9A)");
  EXPECT_EQ(described.copySystemVersionDictionary()->size(), 1u);
  EXPECT_TRUE(described.HasInternalDiagnostics("x"));
  EXPECT_TRUE(kvCast<KvBoolean>(described.DeviceQuery("InternalBuild").get())->value());
  EXPECT_EQ(kvCast<KvData>(described.DeviceQuery("ConfigNumber").get())->bytes().size(), 3u);
  EXPECT_TRUE(described.DeviceQuery("DiskUsage"));
}

TEST_F(ServicesTest, LogHeaderFactsAreLines) {
  const auto facts = [this](const std::string& dictionary) {
    const auto description = describe(dictionary);
    return LinuxLogHeaderFacts(std::make_shared<LinuxDeviceInformation>(root, description),
                               description, std::make_shared<const SystemTree>(root));
  };
  auto described = facts(
      "<key>SystemID</key><string>a\nb</string><key>HardwareModel</key><string>M,1</string>"
      "<key>OSVersion</key><string>OS 1</string>");
  EXPECT_EQ(described.SysIdDescription(), "a\\nb");
  EXPECT_EQ(described.HardwareModelString(), "M,1");
  EXPECT_EQ(described.SystemVersionString(), "OS 1");
  auto wrong =
      facts("<key>SystemID</key><string></string><key>HardwareModel</key><integer>1</integer>");
  EXPECT_EQ(errors().size(), 0u);
  EXPECT_THAT(wrong.SysIdDescription(), testing::StartsWith("Linux "));
  EXPECT_FALSE(wrong.HardwareModelString().empty());
  EXPECT_EQ(errors().size(), 2u);
  EXPECT_EQ(wrong.processIdentifier(), ::getpid());
  EXPECT_EQ(wrong.processName(), "host_test");
  const std::string incident = wrong.NewIncidentID();
  EXPECT_THAT(incident, testing::MatchesRegex(
                            "[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}"));
  EXPECT_NE(incident, wrong.NewIncidentID());
}

TEST_F(ServicesTest, ApplicationsAreCountedOnceAndTheUsersHideTheSystems) {
  const std::string shown = "[Desktop Entry]\nType=Application\n";
  const std::string user = "var/mobile/.local/share/";
  for (const char* name :
       {"a.desktop", "b.desktop", "c.desktop", "kde/d.desktop", "mimeinfo.cache"})
    put(std::string("usr/share/applications/") + name, shown);
  put("usr/local/share/applications/kde-d.desktop", shown);
  put(user + "applications/b.desktop", shown);
  put(user + "applications/c.desktop", shown + "Hidden=true\n");
  put("var/lib/flatpak/exports/share/applications/f.desktop", shown);
  put(user + "flatpak/exports/share/applications/f.desktop", shown);
  std::filesystem::create_directory_symlink(at("usr/share"), at("usr/share/applications/loop"));
  const auto count = [&](const std::shared_ptr<DeviceDescription>& description, int kind) {
    std::string types;
    DesktopAppRegistry(applicationFolders(root, ""), description)
        .enumerateBundles(kind, [&](std::string_view type) { types += type.substr(0, 1); });
    std::sort(types.begin(), types.end());
    return types;
  };
  EXPECT_EQ(count(describe(""), kBundleKindApplication), "SSUU");
  EXPECT_EQ(count(describe(""), 2), "");
  const auto described =
      describe("<key>Applications</key><array><string>User</string><integer>3</integer></array>");
  EXPECT_EQ(count(described, kBundleKindApplication), "U");
  EXPECT_EQ(errors().size(), 1u);
}

TEST_F(ServicesTest, LanguagesComeFromTheRootUnlessDescribed) {
  for (const char* name : {"de/LC_MESSAGES", "pt_BR/LC_MESSAGES", "fr", "en/LC_MESSAGES"})
    std::filesystem::create_directories(at("usr/share/locale/") + name);
  const LocaleEnvironment environment{"", "", "", "de_CH"};
  EXPECT_EQ(LinuxLocale(root, environment, describe("")).SystemLanguages(),
            (std::vector<std::string>{"en", "de", "pt-BR"}));
  LinuxLocale described(root, environment,
                        describe("<key>PreferredLanguages</key><array/>"
                                 "<key>SystemLanguages</key><array><string>ja</string></array>"
                                 "<key>RegionCode</key><string></string>"));
  EXPECT_TRUE(described.PreferredLanguages().empty());
  EXPECT_EQ(described.SystemLanguages(), std::vector<std::string>{"ja"});
  EXPECT_FALSE(described.CurrentRegionCode());
}

TEST_F(ServicesTest, KernelValuesHaveTheirWidths) {
  const auto description = describe(
      "<key>KernelValues</key><dict>"
      "<key>kern.memorystatus_thaw_count</key><integer>7</integer>"
      "<key>kern.memorystatus_freeze_count</key><integer>4294967296</integer>"
      "<key>kern.counter</key><integer>-1</integer>"
      "<key>vm.swapusage</key><integer>1024</integer>"
      "<key>kern.raw</key><data>AQID</data>"
      "<key>kern.busy</key><dict><key>Error</key><integer>16</integer></dict>"
      "<key>kern.odd</key><string>7</string>"
      "<key>kern.next</key><array><data>AQ==</data><data>Ag==</data></array></dict>"
      "<key>MonotonicTicks</key><integer>99</integer>"
      "<key>Timebase</key><dict/>");
  const auto tree = std::make_shared<const SystemTree>(root);
  LinuxKernelValues kernel(description, tree);
  const struct {
    const char* name;
    std::size_t room;
    int result;
    std::size_t length;
    std::uint64_t first;
  } cases[] = {
      {"kern.memorystatus_thaw_count", 4, 0, 4, 7},
      {"kern.memorystatus_freeze_count", 4, ENOENT, 4, 0},
      {"kern.counter", 8, 0, 8, UINT64_MAX},
      {"vm.swapusage", 32, 0, 32, 1024},
      {"kern.raw", 8, 0, 3, 0x030201},
      {"kern.raw", 2, ENOMEM, 2, 0},
      {"kern.busy", 8, EBUSY, 8, 0},
      {"kern.odd", 8, ENOENT, 8, 0},
      {"kern.next", 8, 0, 1, 1},
      {"kern.next", 8, 0, 1, 2},
      {"kern.next", 8, ENOENT, 8, 0},
  };
  for (const auto& c : cases) {
    std::array<std::byte, 32> buffer{};
    std::size_t length = c.room;
    EXPECT_EQ(kernel.readKernelValue(c.name, buffer, &length), c.result) << c.name << c.room;
    EXPECT_EQ(length, c.length) << c.name;
    std::uint64_t first = 0;
    std::memcpy(&first, buffer.data(), sizeof first);
    EXPECT_EQ(first, c.first) << c.name;
  }
  EXPECT_EQ(errors().size(), 2u) << "the number too large and the text";
  EXPECT_EQ(kernel.MonotonicTicks(), 99u);
  EXPECT_FALSE(kernel.TimebaseInfo());
  LinuxKernelValues real(std::make_shared<DeviceDescription>(folder("none"), log), tree);
  const auto ticks = real.MonotonicTicks();
  EXPECT_GE(real.MonotonicTicks(), ticks);
  EXPECT_EQ(real.TimebaseInfo()->denominator, 1u);
  // Without a description there is no analytics service that takes every other day of a boot.
  std::array<std::byte, 100> session{};
  std::size_t length = session.size();
  EXPECT_EQ(real.readKernelValue("kern.bootsessionuuid", session, &length), ENOENT);
  EXPECT_EQ(kernel.readKernelValue("kern.bootsessionuuid", session, &length), 0);
}

TEST_F(ServicesTest, TurnsNestAndEnd) {
  FileRunLock lock(folder("folder"), log);
  const auto held = [this] {
    const int file = ::open(at("folder/tallyrun.lock").c_str(), O_RDWR | O_CLOEXEC);
    const bool locked = ::flock(file, LOCK_EX | LOCK_NB) != 0;
    ::close(file);
    return locked;
  };
  {
    const RunTurn outer(lock);
    { const RunTurn inner(lock); }
    EXPECT_TRUE(held());
  }
  EXPECT_FALSE(held());
  put("file", "");
  FileRunLock impossible(folder("file"), log);
  for (int i = 0; i < 2; ++i)
    EXPECT_TRUE(RunTurn(impossible)) << "a lock that cannot be made does not stop a run";
  EXPECT_EQ(errors().size(), 1u);

  const RunTurn turn(lock);
  FileRunLock refused(folder("folder"), log, std::chrono::milliseconds(1));
  EXPECT_FALSE(RunTurn(refused));
  EXPECT_THAT(errors().back(), HasSubstr("is locked by process " + std::to_string(::getpid())));
}

// Takes a byte at a time and handles one: "o".
int onInput(sd_event_source*, int file, std::uint32_t, void* loop) {
  char byte = 0;
  const bool handled = ::read(file, &byte, 1) == 1 && byte == 'o';
  if (handled) static_cast<SdEventLoop*>(loop)->noteHandledEvent();
  return 0;
}

TEST_F(ServicesTest, ASliceWaitsItsTimeOutAndEndsAtATerminationSignal) {
  runTogether(1, 1, [this](int, int) {
    SdEventLoop loop(log);
    const auto start = std::chrono::steady_clock::now();
    bool right = loop.runMainLoopSlice(0.05, true) == SliceResult::TimedOut;
    right = right && std::chrono::steady_clock::now() - start >= std::chrono::milliseconds(50);
    right = right && loop.runMainLoopSlice(-1, false) == SliceResult::TimedOut;
    // A source's work is an event only if the source says so.
    int pipes[2];
    right = right && ::pipe(pipes) == 0 && ::write(pipes[1], "x", 1) == 1;
    ::sd_event_add_io(loop.event(), nullptr, pipes[0], EPOLLIN, onInput, &loop);
    right = right && loop.runMainLoopSlice(0.05, true) == SliceResult::TimedOut;
    right = right && ::write(pipes[1], "ok", 2) == 2;
    right = right && loop.runMainLoopSlice(30, true) == SliceResult::HandledEvent;
    ::kill(::getpid(), SIGTERM);
    right = right && loop.runMainLoopSlice(30, true) == SliceResult::Stopped;
    return right && loop.runMainLoopSlice(30, true) == SliceResult::TimedOut;
  });
}

TEST_F(ServicesTest, WhatRootRecordsForAUserIsTheUsers) {
  if (::geteuid() != 0) GTEST_SKIP() << "only root makes files for others";
  constexpr uid_t kUser = 12345;
  const std::string home = at("var/mobile");
  ASSERT_TRUE(folder("var/mobile").make());
  ASSERT_EQ(::chown(home.c_str(), kUser, kUser), 0);
  const Platform services = makeLinuxPlatform(root);
  services.metricsStore->TBClientSetValueForScalarKey("a", 1);
  services.crashReporting->FDLogStructuredData(172, *KvDictionary::create());
  services.preferences->SMAPreferencesSetValue("a", KvNumber::int32(1), "b");
  services.preferences->SMAPreferencesSynchronize("b");
  int files = 0;  // including those that an open store has
  for (const auto& one : std::filesystem::recursive_directory_iterator(home)) {
    struct stat status {};
    ASSERT_EQ(::stat(one.path().c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, kUser) << one.path();
    files += one.is_regular_file() ? 1 : 0;
  }
  EXPECT_GE(files, 5);
}

TEST_F(ServicesTest, MakingThePlatformTouchesNothing) {
  {
    const Platform services = makeLinuxPlatform(root + "//");
    EXPECT_EQ(services.preferences->SMAPreferencesGetIntegerValue("a", "b"), 0);
    EXPECT_FALSE(services.files->fileSize("/device/device.plist"));
    EXPECT_GT(services.clock->secondsSince1970(), 1.7e9);
  }
  EXPECT_TRUE(std::filesystem::is_empty(root));
}

}  // namespace
}  // namespace tally
