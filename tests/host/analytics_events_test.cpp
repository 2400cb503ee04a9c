// The spool of analytics events: whole lines, within bounds, and only what the device wants.
#include "host/spool/analytics_events.h"

#include "host/temporary_root.h"
#include "kv/json_writer.h"

namespace tally {
namespace {

class EventSpoolTest : public TemporaryRoot {
 protected:
  EventSpoolTest() {
    preferences->calls = std::make_shared<fakes::CallLog>();
    putPlist("device.plist", "<dict/>");
  }
  LinuxAnalyticsEvents service() {
    const auto description = std::make_shared<DeviceDescription>(TemporaryRoot::folder(""), log);
    const auto consent = std::make_shared<SubmissionConsent>(root, log, preferences, description);
    return {analyticsEventsFolder(root), log, clock, preferences, description, consent};
  }
  bool send(std::string_view name, std::string_view text = "x") {
    return service().PulseSendEventLazy(name, [&] {
      ++built;
      return KvDictionary::create({{"text", KvString::create(text)}});
    });
  }
  std::string spooled() const {
    std::string all;
    for (const std::string& name : names(folder)) all += get(folder + "/" + name);
    return all;
  }

  const std::string folder = "var/mobile/Library/Logs/AnalyticsEvents";
  std::shared_ptr<fakes::FakePreferences> preferences = std::make_shared<fakes::FakePreferences>();
  int built = 0;
};

TEST_F(EventSpoolTest, OneObjectALineAndTornLinesAreCut) {
  clock->setDay(20000, 1.5);
  EXPECT_TRUE(send("a", "1"));
  const std::string line =
      "{\"event\":\"a\",\"time\":\"2024-10-04T00:00:01Z\",\"payload\":{\"text\":\"1\"}}\n";
  EXPECT_EQ(spooled(), line);
  const std::string file = folder + "/0000000001-events.jsonl";
  put(file, line + line.substr(0, line.size() - 1));
  EXPECT_TRUE(send("a", "1"));
  EXPECT_EQ(spooled(), line + line);
  put(folder + "/0000000007-other.txt", "not ours");
  EXPECT_TRUE(send("a", "1"));
  EXPECT_EQ(get(folder + "/0000000007-other.txt"), "not ours");
  EXPECT_EQ(get(folder + "/0000000008-events.jsonl"), line);
  EXPECT_TRUE(errors().empty());
  std::filesystem::create_directories(at(folder + "/0000000009-events.jsonl"));
  EXPECT_TRUE(send("a", "1"));
  EXPECT_EQ(get(folder + "/0000000010-events.jsonl"), line);
  EXPECT_EQ(errors().size(), 1u);
}

TEST_F(EventSpoolTest, TheDescriptionSaysWhatIsWanted) {
  const struct {
    std::string entry;
    bool available;
    std::string wanted;  // of a, b, bc, each before a blank
    std::size_t errors;
  } cases[] = {
      {"<dict/>", true, "a b bc ", 0},
      {"<dict><key>Absent</key><true/></dict>", false, "", 0},
      {"<dict><key>Wanted</key><array><string>b</string><integer>1</integer></array></dict>", true,
       "b ", 0},
      {"<dict><key>Wanted</key><array><string>b*</string></array></dict>", true, "b bc ", 0},
      {"<dict><key>Wanted</key><string>b</string></dict>", true, "", 1},
      {"<string>b</string>", true, "a b bc ", 1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.entry);
    useBoundedLog();
    built = 0;
    putPlist("device.plist", "<dict><key>AnalyticsEvents</key>" + c.entry + "</dict>");
    LinuxAnalyticsEvents events = service();
    EXPECT_EQ(events.isAvailable(), c.available);
    std::string sent;
    for (const char* name : {"a", "b", "bc"}) {
      if (events.PulseSendEventLazy(name, [&] { return ++built, KvDictionary::create(); })) {
        sent += std::string(name) + " ";
      }
    }
    EXPECT_EQ(sent, c.wanted);
    EXPECT_EQ(built, std::count(sent.begin(), sent.end(), ' ')) << "built without need";
    EXPECT_EQ(errors().size(), c.errors);
  }
}

TEST_F(EventSpoolTest, TheFolderStaysWithinItsBounds) {
  preferences->put("SpoolMaximumBytes", KvNumber::int32(4000), "vellum.tallyd.tallyrun");
  for (int i = 0; i < 60; ++i) ASSERT_TRUE(send(std::to_string(i), std::string(300, 'x')));
  EXPECT_LE(spooled().size(), 4000u);
  EXPECT_GT(spooled().size(), 2000u);
  EXPECT_NE(spooled().find("\"event\":\"59\""), std::string::npos);
  EXPECT_FALSE(send("large", std::string(4000, 'x')));
  EXPECT_EQ(errors().size(), 1u);
}

TEST_F(EventSpoolTest, SendersTakeTurns) {
  runTogether(4, 20, [&](int i, int) { return send(std::to_string(i), std::string(2000, 'y')); });
  const std::string text = spooled();
  EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 80);
}

TEST(Json, EveryKindOfValueOnOneLine) {
  const auto bytes = std::as_bytes(std::span("ab", 2));
  const auto value = KvDictionary::create(
      {{"q\"\\\n\x7f", KvString::create("\x1b[2J\xc3\xa9")},
       {"n", KvArray::create({KvNumber::int8(-1), KvNumber::int64(INT64_MIN),
                              KvNumber::uint64(UINT64_MAX), KvNumber::float32(0.1f),
                              KvNumber::float64(1e22), KvNumber::float64(-INFINITY)})},
       {"o", KvArray::create({KvBoolean::of(true), KvDate::create(0), KvData::create(bytes),
                              KvArray::create(), KvDictionary::create()})}});
  std::string text;
  appendJson(text, *value);
  EXPECT_EQ(text,
            "{\"q\\\"\\\\\\u000a\\u007f\":\"\\u001b[2J\xc3\xa9\","
            "\"n\":[-1,-9223372036854775808,18446744073709551615,0.1,1e+22,\"-inf\"],"
            "\"o\":[true,\"1970-01-01T00:00:00Z\",\"YWI=\",[],{}]}");
  KvRef<KvArray> deep = KvArray::create();
  for (int i = 0; i < 2000; ++i) deep = KvArray::create({deep});
  text.clear();
  appendJson(text, *deep);
  EXPECT_EQ(text, std::string(512, '[') + "null" + std::string(512, ']'));
}

}  // namespace
}  // namespace tally
