// The spool: whole logs or none, within bounds, oldest out first.
#include "host/spool/log_spool.h"

#include <sys/mount.h>

#include <set>

#include "host/temporary_root.h"

namespace tally {
namespace {

class SpoolTest : public TemporaryRoot {
 protected:
  SpoolTest() { notifications->calls = preferences->calls = std::make_shared<fakes::CallLog>(); }
  std::shared_ptr<SubmissionConsent> consent() {
    const auto description = std::make_shared<DeviceDescription>(folder("device"), log);
    return std::make_shared<SubmissionConsent>(root, log, preferences, description);
  }
  SpoolSubmission spool() {
    return {folder("spool"), log, clock, preferences, consent(), information, notifications};
  }
  bool submit(std::string_view body, std::string_view name = "log-test",
              const KvDictionary* options = nullptr, const KvObject* reserved = nullptr) {
    return spool().SMAWriteLogForSubmission("193", name, options, reserved,
                                            [body](LogFile& file) { file.write(body); });
  }
  std::vector<SpooledLog> list() const {
    auto logs = SpoolReader(folder("spool")).list();
    EXPECT_TRUE(logs);
    return *std::move(logs);
  }
  std::string body(const SpooledLog& entry) const {
    return *SpoolReader(folder("spool")).readBody(entry, 1u << 30);
  }
  void bound(const char* key, std::int32_t value) {
    preferences->put(key, KvNumber::int32(value), "vellum.tallyd.tallyrun");
  }

  std::shared_ptr<fakes::FakePreferences> preferences = std::make_shared<fakes::FakePreferences>();
  std::shared_ptr<fakes::FakeNotifications> notifications =
      std::make_shared<fakes::FakeNotifications>();
  std::shared_ptr<fakes::FakeDeviceInformation> information =
      std::make_shared<fakes::FakeDeviceInformation>();
};

TEST_F(SpoolTest, KeepsBodyAndInformation) {
  clock->now = 1000;
  const auto options = KvDictionary::create({{"previous_os_version", KvString::create("1.0")}});
  const std::string bytes("<plist>\0\xff\n", 10);
  ASSERT_TRUE(submit(bytes, "log-tallyd", options.get()));
  clock->now = 10;  // the clock went back: the number decides the age
  ASSERT_TRUE(submit("", "empty"));
  EXPECT_EQ(names("spool"), (Names{"0000000001-log-tallyd.info.plist", "0000000001-log-tallyd.log",
                                   "0000000002-empty.info.plist", "0000000002-empty.log"}));
  const auto logs = list();
  ASSERT_EQ(logs.size(), 2u);
  EXPECT_EQ(body(logs[0]), bytes);
  EXPECT_EQ(logs[0].typeCode, "193");
  EXPECT_EQ(logs[0].name, "log-tallyd");
  EXPECT_EQ(logs[0].creationTime, 1000);
  EXPECT_TRUE(kvEqual(logs[0].options.get(), options.get()));
  EXPECT_FALSE(logs[1].options);
  EXPECT_EQ(logs[1].bytes, 0u);
  for (const std::string& name : names("spool")) {
    EXPECT_EQ(std::filesystem::status(at("spool/" + name)).permissions(),
              std::filesystem::perms(0600));
  }
}

TEST_F(SpoolTest, TheOldestGoWhenABoundIsReached) {
  bound("SpoolMaximumLogs", 3);
  for (const char* text : {"a", "b", "c", "d", "e"}) ASSERT_TRUE(submit(text));
  std::string kept;
  for (const auto& entry : list()) kept += body(entry);
  EXPECT_EQ(kept, "cde");
  EXPECT_EQ(names("spool").size(), 6u) << "information of a removed log";

  bound("SpoolMaximumLogs", 0);  // no bound: the default
  bound("SpoolMaximumBytes", 3700);
  ASSERT_TRUE(submit(std::string(2500, 'f')));
  const auto logs = list();
  EXPECT_EQ(body(logs.back()), std::string(2500, 'f'));
  EXPECT_EQ(logs.size(), 2u) << "a third log and its information of about 570 bytes are too much";
  std::uint64_t bytes = 0;
  for (const std::string& name : names("spool")) bytes += *fileSize(at("spool/" + name));
  EXPECT_LE(bytes, 3700u);

  std::filesystem::create_directories(at("spool/0000000000-in-the-way.log"));
  bound("SpoolMaximumLogs", 1);
  ASSERT_TRUE(submit("g"));
  EXPECT_EQ(names("spool").size(), 3u) << "what cannot be removed keeps older logs";
}

TEST_F(SpoolTest, RefusalsLeaveNothingBehindAndCostNoLog) {
  ASSERT_TRUE(submit("first"));
  const auto before = names("spool");
  bound("SpoolMaximumBytes", 2000);
  const struct {
    const char* name;
    std::function<bool()> attempt;
    const char* reason;
  } cases[] = {
      {"larger than the spool, piece by piece",
       [&] {
         const std::string piece(500, 'x');
         return spool().SMAWriteLogForSubmission("1", "r", nullptr, nullptr, [&](LogFile& file) {
           for (int i = 0; i < 4; ++i) file.write(piece);
         });
       },
       "larger than"},
      {"unsafe name", [&] { return submit("x", "../x"); }, "not a name"},
      {"name of a temporary file", [&] { return submit("x", "a.tmp~1"); }, "not a name"},
      {"reserved", [&] { return submit("x", "r", nullptr, KvString::create("x").get()); },
       "reserved"},
      {"nested",
       [&] {
         auto submission = spool();
         bool inner = true;
         submission.SMAWriteLogForSubmission("1", "outer", nullptr, nullptr, [&](LogFile& file) {
           inner =
               submission.SMAWriteLogForSubmission("1", "inner", nullptr, nullptr, [](LogFile&) {});
           file.write(std::string(5000, 'o'));
         });
         return inner;
       },
       "submitted while"},
  };
  for (const auto& c : cases) {
    log->lines.clear();
    EXPECT_FALSE(c.attempt()) << c.name;
    EXPECT_THAT(errors(), testing::Contains(testing::HasSubstr(c.reason))) << c.name;
    EXPECT_EQ(names("spool"), before) << c.name;
  }
}

TEST_F(SpoolTest, AVolumeIsNotFilledToItsEnd) {
  std::filesystem::create_directory(at("spool"));
  if (::mount("tally", at("spool").c_str(), "tmpfs", 0, "size=17m") != 0) {
    GTEST_SKIP() << "mounting is not allowed here";
  }
  const std::shared_ptr<void> mounted(nullptr, [&](void*) { ::umount(at("spool").c_str()); });
  EXPECT_TRUE(submit(std::string(100'000, 'a')));
  EXPECT_FALSE(submit(std::string(1'000'000, 'b')));
  EXPECT_THAT(errors(), testing::ElementsAre(testing::HasSubstr("bytes are left on the volume")));
  EXPECT_EQ(names("spool").size(), 2u);
}

TEST_F(SpoolTest, ANumberIsGivenOnceAndMadeKnown) {
  ASSERT_TRUE(submit("a", "one"));
  const std::string path =
      std::string(kIdentityFolder).substr(1) + "/" + std::string(kIdentityFile);
  const std::string former = get(path);
  ASSERT_TRUE(submit("b", "one"));
  put(path, former);  // as if that run had been killed before it noted the number
  ASSERT_TRUE(submit("c", "two"));
  std::filesystem::remove_all(at("spool"));
  std::filesystem::create_directory(at("spool"));
  ASSERT_TRUE(submit("d", "one"));
  std::filesystem::remove(at(path));
  std::filesystem::create_directory(at(path));  // can be neither read nor replaced
  ASSERT_TRUE(submit("e", "one"));
  const auto logs = list();
  ASSERT_EQ(logs.size(), 2u);
  EXPECT_TRUE(isDevicePseudonym(logs[0].device)) << logs[0].device;
  EXPECT_EQ(logs[0].deviceSequence, 3u);
  EXPECT_EQ(logs[0].systemVersion, information->osVersion);
  EXPECT_EQ(logs[1].device, "");
  EXPECT_FALSE(logs[1].deviceSequence);
  EXPECT_EQ(errors().size(), 1u);
  EXPECT_EQ(*notifications->calls, fakes::CallLog(5, "offer vellum.tallyd.tallyrun.submitted"));
}

TEST_F(SpoolTest, SubmittersDoNotClash) {
  runTogether(4, 10, [this](int process, int) { return submit(std::to_string(process)); });
  std::map<std::string, int> counts;
  std::set<std::uint64_t> numbers;
  for (const auto& entry : list()) {
    ++counts[body(entry)];
    numbers.insert(entry.deviceSequence.value_or(0));
  }
  EXPECT_TRUE(numbers.size() == 40 && *numbers.begin() == 1 && *numbers.rbegin() == 40);
  EXPECT_EQ(counts, (std::map<std::string, int>{{"0", 10}, {"1", 10}, {"2", 10}, {"3", 10}}));
}

TEST_F(SpoolTest, StrangeFilesInTheFolderDoNotMatter) {
  put("spool/notes.txt", "mine");
  put("spool/0000000007-old.log", "old");
  put("spool/0000000007-old.info.plist", "damaged");
  put("spool/0000000009-gone.info.plist", "its body was removed");
  put("spool/0000000003-x.log.tmp~1.0", "left by a killed run");
  put("spool/0999999999-stray.log", "its number leaves too few");
  put("spool/9999999999-x.log", "its number leaves none");
  useBoundedLog();
  ASSERT_TRUE(submit("new"));
  EXPECT_EQ(names("spool"),
            (Names{"0000000007-old.info.plist", "0000000007-old.log",
                   "0000000008-log-test.info.plist", "0000000008-log-test.log", "notes.txt",
                   "set-aside-0999999999-stray.log", "set-aside-9999999999-x.log"}));
  EXPECT_EQ(errors().size(), 1u);
  const auto logs = list();
  ASSERT_EQ(logs.size(), 2u);
  EXPECT_EQ(logs[0].typeCode, "");
  EXPECT_EQ(body(logs[0]), "old");
}

}  // namespace
}  // namespace tally
