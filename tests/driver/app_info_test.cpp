// The conversation with the system: what each message does, and what a bad one does not do.
#include "driver/app_info_listener.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "fakes/fake_platform.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

constexpr const char* kUuidText = "00112233-4455-6677-8899-AABBCCDDEEFF";

KvRef<KvObject> text(const char* value) { return KvString::create(value); }
KvRef<KvObject> uuid(std::size_t size = 16) {
  std::vector<std::byte> bytes;
  for (std::size_t i = 0; i < size; ++i) bytes.push_back(static_cast<std::byte>(i * 0x11));
  return KvData::create(bytes);
}
KvRef<KvDictionary> application() {
  return KvDictionary::create({{"bundle_id", text("org.example.mail")},
                               {"version", text("7.1")},
                               {"adam_id", KvNumber::int64(5'000'000'000)},
                               {"arch", KvNumber::int64(-2)},
                               {"uuid", uuid()}});
}
KvRef<KvDictionary> operation(std::int64_t code, KvRef<KvObject> value = nullptr) {
  auto message = KvDictionary::create({{"operation", KvNumber::int64(code)}});
  message->set("value", std::move(value));
  return message;
}
KvRef<KvDictionary> appData(KvRef<KvObject> list) {
  auto message = operation(2);
  message->set("app_data", std::move(list));
  return message;
}

class AppInfoTest : public testing::Test {
 protected:
  AppInfoTest() { fake.crashReporting->submissionEnabled = false; }  // the report is not at stake
  // Sends messages to a new process; "requested" afterwards.
  bool send(const std::vector<KvRef<KvDictionary>>& messages) {
    fake.calls->clear();
    fake.log->lines.clear();
    fake.preferences->values.clear();
    const auto nothing = [](Platform&) {};
    Platform platform = fake.services();
    DailyTasks tasks(platform, {.runTelemetrySweep = nothing, .updateTaskingState = nothing});
    AppInfoListener listener(platform, tasks);
    for (const auto& message : messages) listener.handleMessage(*message);
    return listener.isAppInfoRequested();
  }
  // The days that were processed, and the notifications.
  std::vector<std::string> effects() {
    std::vector<std::string> found;
    for (const std::string& line : fake.log->texts(LogLevel::Default)) {
      if (line.starts_with("daily tasks")) found.push_back(line.substr(16));
    }
    for (const std::string& call : *fake.calls) {
      if (call.starts_with("post ")) found.push_back(call);
    }
    return found;
  }
  std::size_t errors() { return fake.log->texts(LogLevel::Error).size(); }

  fakes::FakePlatform fake = fakes::makeFakePlatform();
};

TEST_F(AppInfoTest, ConversationsByTheirMessages) {
  const std::string posted = "post vellum.tallyd.tallyrun.logging";
  const std::int64_t high = std::int64_t{7} << 32;
  const auto list = [] { return appData(KvArray::create({application()})); };
  const auto day = [](int number) { return operation(1, KvNumber::int64(number)); };
  const struct {
    const char* name;
    std::vector<KvRef<KvDictionary>> messages;
    std::vector<std::string> effects;
    bool requested = false;
    std::size_t errors = 0;
  } cases[] = {
      {"announced and delivered", {operation(0), list()}, {"day 19999", posted}},
      {"delivered twice", {operation(0), list(), list()}, {"day 19999", posted}},
      {"unsolicited", {list()}, {}},
      {"a day twice", {day(7), day(8)}, {"day 7"}},
      {"a day after an announcement", {operation(0), day(7)}, {posted}, true},
      {"low halves", {operation(high | 1, KvNumber::int64(high | 0xFFFFFFFF))}, {"day -1"}},
      {"an unknown operation counts as the first", {operation(9), operation(0)}, {}},
      {"no operation", {KvDictionary::create(), operation(0)}, {posted}, true, 1},
      {"an operation of another type",
       {KvDictionary::create({{"operation", text("0")}}),
        KvDictionary::create({{"operation", KvNumber::int32(0)}})},
       {},
       false,
       2},
      {"a day without a value", {operation(1), operation(1, text("5"))}, {}, false, 2},
      {"a list of another type",
       {operation(0), appData(text("x")), list()},
       {"day 19999", posted},
       false,
       1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(send(c.messages), c.requested);
    EXPECT_EQ(effects(), c.effects);
    EXPECT_EQ(errors(), c.errors);
  }
}

TEST_F(AppInfoTest, TheListIsLoggedInItsTwoForms) {
  send({appData(KvArray::create())});
  EXPECT_THAT(fake.log->texts(LogLevel::Default),
              ElementsAre("tallyrun got (unsolicited -- so ignoring) AAI:\n(\n)"));
  send({operation(0), appData(KvArray::create({application()}))});
  EXPECT_THAT(fake.log->texts(LogLevel::Default)[1], HasSubstr("tallyrun got requestedAAI:\n"));
  EXPECT_THAT(fake.log->texts(LogLevel::Default)[1], HasSubstr(kUuidText));
}

TEST_F(AppInfoTest, ElementsKeepTheirOrderAndBadOnesAreLeftOut) {
  const auto with = [](const char* key, KvRef<KvObject> value) {
    auto element = application();
    element->set(key, std::move(value));
    return element;
  };
  auto numberless = with("adam_id", nullptr);
  numberless->set("arch", text("arm"));
  const auto list =
      KvArray::create({text("no dictionary"), application(), with("bundle_id", nullptr),
                       with("bundle_id", KvNumber::int64(1)), with("version", nullptr), numberless,
                       with("uuid", nullptr), with("uuid", uuid(15)), with("uuid", uuid(17)),
                       with("uuid", text(kUuidText)), with("bundle_id", text("last"))});
  const auto logged = [](const char* bundle, std::int64_t adamID, std::int64_t arch) {
    return KvDictionary::create({{"bundle", text(bundle)},
                                 {"version", text("7.1")},
                                 {"adamID", KvNumber::int64(adamID)},
                                 {"arch", KvNumber::int64(arch)},
                                 {"uuid", text(kUuidText)}});
  };
  const auto expected =
      KvArray::create({logged("org.example.mail", 5'000'000'000, -2),
                       logged("org.example.mail", 0, 0), logged("last", 5'000'000'000, -2)});
  const auto kept = makeAppInformation(*fake.log, *list);
  EXPECT_TRUE(kvEqual(kept.get(), expected.get())) << kvText(kept.get());
  EXPECT_THAT(fake.log->texts(LogLevel::Error),
              ElementsAre("app_data: 8 of 11 elements skipped; element 0: not a dictionary"));
}

}  // namespace
}  // namespace tally
