#include "recorder/recorder.h"

#include <gmock/gmock.h>

#include "kv/plist_codec.h"
#include "recorder/recorder_fixture.h"

namespace tally {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Pair;
using ::testing::UnorderedElementsAre;

// Each line is sent to a recorder of its own.
TEST_F(RecorderTest, ALineIsRecordedOrRefusedForAReason) {
  const struct {
    std::string_view lines;
    std::string_view scalars, samples, refusal;
  } kCases[] = {
      {"a:1|c\na:2|c", "a 3", "", ""},
      {"a:1|c|@0.25", "a 4", "", ""},
      {"a:1:2:3|c|#x:y|c:id|e:q|card:low|T123", "a 6", "", ""},
      {"a:-5|c\na:2|c\r\n", "a -3", "", ""},
      {"a:0|c", "a 0", "", ""},
      {"a:0.4|c\na:0.4|c\na:0.4|c", "a 1", "", ""},
      {"a:1|c|@0.0000000000000000000001", "a 1000000", "", ""},
      {"a:1e300|c\na:1|c", "a 9223372036854775807", "", ""},
      {"a:9007199254740993|c\na:0.5|c\na:0.25|c", "a 9007199254740994", "", ""},
      {"a:-9223372036854775808|c\na:-1|c", "a -9223372036854775808", "", ""},
      {"a:9223372036854775807|g\na:-1|g", "a 9223372036854775806", "", ""},
      {"a:5|g\na:+2|g\na:-10|g", "a -3", "", ""},
      {"a:-7|g", "a -7", "", ""},
      {"a:0|g\na:-5|g", "a -5", "", ""},
      {"a:1.5|g|@0.1", "a 2", "", ""},
      {"a:1:2:3|g", "a 3", "", ""},
      {"a:12.500000|ms|@0.1", "", "a 12.5@36000x10", ""},
      {"a:+1:-0.0:.5:1.|ms", "", "a 1@36000 -0@36000 0.5@36000 1@36000", ""},
      {"a:-3:1e-3|h", "", "a -3@36000 0.001@36000", ""},
      {"a:1::2:|d||foo", "", "a 1@36000 2@36000", ""},
      {"a:1|h|@0.3\na:1|h|@0.3\na:1|h|@0.3", "", "a 1@36000x3 1@36000x4 1@36000x3", ""},
      {"a,b=c;d#e[f]/g h:1|c", "a,b=c;d#e[f]/g h 1", "", ""},
      {"nothing", "", "", "malformed"},
      {"a:1", "", "", "malformed"},
      {"a:1|", "", "", "malformed"},
      {"|h|#a:b", "", "", "malformed"},
      {":1|c", "", "", "name"},
      {"a\x01:1|c", "", "", "name"},
      {"\xff:1|c", "", "", "name"},
      {"a:|c", "", "", "value"},
      {"a:NaN|g", "", "", "value"},
      {"a:1e999|c", "", "", "value"},
      {"a:1e-999:0.5|c", "a 1", "", ""},
      {"a:-1|ms", "", "", "value"},
      {"a:0x10|c", "", "", "value"},
      {"a: 1|c", "", "", "value"},
      {"a:1:b|h", "", "", "value"},
      {"a:1,5|ms", "", "", "value"},
      {"a:1|C", "", "", "type"},
      {"a:1|msdos", "", "", "type"},
      {"a:1|ms:2|ms", "", "", "type"},
      {"a:b|s", "", "", "set"},
      {"a:1|c|@0", "", "", "sample_rate"},
      {"a:1|c|@-1", "", "", "sample_rate"},
      {"a:1|c|@2", "", "", "sample_rate"},
      {"a:1|g|@", "", "", "sample_rate"},
      {"_e{1,1}:a|b", "", "", "event"},
      {"_sc|a|0", "", "", "event"},
  };
  for (const auto& [lines, scalars, samples, refusal] : kCases) {
    SCOPED_TRACE(lines);
    store.state = {};
    recorder.reset();
    send(kAda, lines);
    // At the end, so that fractions are rounded.
    recorder->onTerminate();
    settle();
    EXPECT_TRUE(ingress.stopped);
    const StoredDay& day = store.state.days[kDay];
    std::string foundScalars, foundSamples;
    for (const auto& [key, value] : day.scalars) {
      if (!key.starts_with("vellum.")) foundScalars += fmt::format("{} {}", key, value);
    }
    for (const auto& [key, value] : day.samples) foundSamples += key + " " + value;
    EXPECT_EQ(foundScalars, scalars);
    EXPECT_EQ(foundSamples, samples);
    if (!refusal.empty()) {
      EXPECT_EQ(refused(refusal), 1u);
    }
  }
}

TEST_F(RecorderTest, AKeyBelongsToItsFirstUserForTheDay) {
  send(kAda, "a:1|c");
  send(kBob, "a:5|c\nb:1|c\nvellum.x:1|c");
  send(kRoot, "vellum.x:2|c");
  send(Sender::kAnonymous, "b:1:1|c");
  commit();
  EXPECT_THAT(store.state.days[kDay].owners,
              UnorderedElementsAre(Pair("a", kAda), Pair("b", kBob), Pair("vellum.x", kRoot)));
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 1);
  EXPECT_EQ(store.state.days[kDay].scalars["vellum.x"], 2);
  EXPECT_EQ(refused("owner"), 3u);
  EXPECT_EQ(refused("permission"), 1u);
  // Another process, the same day.
  recorder.reset();
  send(kBob, "a:5|c");
  commit();
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 1);
  // The next day it is free again.
  send(kBob, "a:5|c", 86400);
  commit();
  EXPECT_EQ(store.state.days[kDay + 1].scalars["a"], 5);
}

// Another user comes while the owners are not known: before the clock is set, or since they could
// not be read.
TEST_F(RecorderTest, AKeyOfAnotherIsFoundOutAtTheCommit) {
  for (const std::string_view reason : {"held", "committed", "unread"}) {
    SCOPED_TRACE(reason);
    store.state = {};
    store.ownersFail = false;
    const double right = wall;
    recorder.reset();
    send(kAda, "mine:100|g\nlat:5|h");
    commit();
    recorder.reset();
    store.ownersFail = reason == "unread";
    if (!store.ownersFail) wall = 100;
    send(kBob, "mine:666|g\nlat:9|h\nhis:1|c", 1);
    if (reason == "committed") commit();
    wall = right + 5;
    boot += 5'000'000'000;
    send(kBob, "mine:667|g\nhis:1|c");
    commit();
    send(kBob, "mine:668|g");
    send(kAda, "lat:6|h");
    commit();
    const StoredDay& day = store.state.days[kDay];
    EXPECT_EQ(day.scalars.at("mine"), 100);
    EXPECT_EQ(day.scalars.at("his"), 2);
    EXPECT_EQ(day.weights.at("lat"), 2u);
    EXPECT_EQ(day.owners.at("mine"), kAda);
    EXPECT_GE(refused("owner"), 3u);
  }
}

TEST_F(RecorderTest, AKeyThatWasAnothersYesterdayIsFreeToday) {
  send(kAda, "mine:100|g");
  commit();
  recorder.reset();
  store.ownersFail = true;
  send(kBob, "mine:1|g");
  send(kBob, "mine:2|g", 86400);
  settle();  // yesterday's is found out
  send(kBob, "mine:3|g");
  recorder->onTerminate();
  settle();
  EXPECT_EQ(store.state.days[kDay].scalars["mine"], 100);
  EXPECT_EQ(store.state.days[kDay + 1].scalars["mine"], 3);
  EXPECT_EQ(refused("owner") + refused("owner", kDay + 1), 1u) << "what the last commit counted";
  EXPECT_FALSE(recorder->hasUncommitted());
}

TEST_F(RecorderTest, SettingsGiveNamesTagsAndRights) {
  settings.prefix = "dev.";
  settings.rename["old"] = "new";
  settings.tags = {"code", "zone"};
  settings.allow["dev.secret."].numbers = {kBob};
  settings.allow["dev.secret.open"].everybody = true;
  send(kAda, "a:1|c|#x:y,code:200\na:2|c\nold:1|c|#zone\nsecret.a:1|c\nsecret.open:1|c");
  send(kBob, "secret.a:1|c");
  commit();
  send(kAda, "a:1|c|#code:200");
  commit();
  EXPECT_THAT(
      store.state.days[kDay].scalars,
      UnorderedElementsAre(Pair("dev.a,code=200", 2), Pair("dev.a", 2), Pair("new,zone=", 1),
                           Pair("dev.secret.open", 1), Pair("dev.secret.a", 1),
                           Pair("vellum.tallyd.refused.permission", 1)));
}

TEST_F(RecorderTest, KeysAndRightsSurviveARestartAndOtherSettings) {
  settings.prefix = "dev.";
  send(kBob, "temp:5|c\ndev.temp:1|c");
  for (const bool restarts : {true, false}) {
    SCOPED_TRACE(restarts);
    commit();
    if (restarts) {
      recorder.reset();
    } else {
      settings.prefix = "";
      settings.allow["dev.temp"].numbers = {kAda};
      recorder->onReload();
      settings.allow.clear();
      settings.complete = false;
      recorder->onReload();  // a broken file changes nothing
    }
    send(kAda, restarts ? "temp:7|c" : "dev.temp:70|c");
    send(kBob, restarts ? "dev.temp:1|c" : "dev.temp:700|c\ndev.dev.temp:1|c");
  }
  commit();
  EXPECT_EQ(store.state.days[kDay].scalars["dev.temp"], 75) << "of its owner, then of who may";
  EXPECT_EQ(store.state.days[kDay].scalars["dev.dev.temp"], 3);
  EXPECT_EQ(refused("owner"), 2u);
}

TEST_F(RecorderTest, UsersBeyondThoseThatAreToldApartAreNobodyElse) {
  for (std::int64_t user = 0; user < 1500; ++user) {
    send(user + 5000, fmt::format("k{}:1|c", user));
  }
  send(kRoot, "vellum.x:1|c\nk1400:1|c");
  send(9000, "vellum.x:1|c\nk1000:1|c\nk1401:1|c");
  commit();
  const auto& scalars = store.state.days[kDay].scalars;
  EXPECT_EQ(scalars.at("vellum.x"), 1);
  EXPECT_EQ(scalars.at("k1000"), 1);
  EXPECT_EQ(scalars.at("k1400"), 1);
  EXPECT_EQ(scalars.at("k1401"), 2) << "these are one";
}

TEST_F(RecorderTest, LimitsHoldForEachUserAlone) {
  const auto set = [&](RecorderNumber which, std::int64_t value) {
    settings.numbers[static_cast<std::size_t>(which)] = value;
  };
  set(RecorderNumber::MetricsPerSecond, 1);
  set(RecorderNumber::KeysOfUser, 2);
  set(RecorderNumber::KeysOfDay, 3);
  std::string flood;
  for (int i = 0; i < 700; ++i) flood += "a:1|c\n";
  send(kAda, flood);
  send(kBob, "b:1|c\nc:1|c\nd:1|c");
  send(3, "e:1|c");
  commit();
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 600);
  EXPECT_EQ(refused("metrics_per_second"), 100u);
  EXPECT_EQ(refused("keys_of_user"), 1u);
  EXPECT_EQ(refused("keys_of_day"), 1u);
  EXPECT_EQ(recorder->streamQuota({kAda}), 0u);
  EXPECT_GT(recorder->streamQuota({kBob}), 0u);
  send(kAda, "a:1|c", 60);
  commit();
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 601);
}

TEST_F(RecorderTest, CommitsComeWithTheIntervalTheDayAndDurableKeys) {
  settings.durable = {"alarm."};
  send(kAda, "a:1|c");
  EXPECT_EQ(next, 900'000'000'000);
  send(kAda, "alarm.x:1|c", 10);
  settle();
  EXPECT_EQ(store.commits, 1);
  EXPECT_THAT(store.state.days[kDay].scalars, ElementsAre(Pair("alarm.x", 1)));
  for (int i = 0; i < 50; ++i) {
    send(kAda, "alarm.x:1|c");
    settle();
  }
  EXPECT_EQ(store.commits, 10);
  EXPECT_EQ(next, 1'000'000'000);
  send(kBob, "alarm.y:1|c");
  settle();
  EXPECT_EQ(store.state.days[kDay].scalars["alarm.y"], 1) << "one who floods delays nobody else";
  send(kAda, "alarm.x:1|c");
  send(kAda, "", 1);
  settle();
  EXPECT_EQ(store.commits, 12);
  EXPECT_EQ(store.state.days[kDay].scalars["alarm.x"], 52);
  store.commits = 1;
  send(kAda, "", 888);
  EXPECT_EQ(store.commits, 1);
  send(kAda, "", 1);
  settle();
  EXPECT_EQ(store.commits, 2);
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 1);
  EXPECT_EQ(next, std::nullopt);  // nothing is held: no wake-up
  // A gauge goes on from yesterday's value, what came before midnight is yesterday's.
  wall = (kDay + 1) * 86400.0 - 2;
  send(kAda, "g:5|g\nt:1|ms");
  EXPECT_LE(*next, 3'000'000'000);
  send(kAda, "g:+1|g\nt:2|ms", 3);
  settle();
  commit();
  EXPECT_EQ(store.state.days[kDay].scalars["g"], 5);
  EXPECT_EQ(store.state.days[kDay + 1].scalars["g"], 6);
  EXPECT_EQ(store.state.days[kDay].samples["t"], "1@86398");
  EXPECT_EQ(store.state.days[kDay + 1].samples["t"], "2@1");
}

TEST_F(RecorderTest, WhatCameBeforeTheClockWasSetIsDatedLater) {
  const double right = wall;
  const std::int64_t start = boot;
  wall = 100;
  send(kAda, "a:1|c\nt:1|ms");
  send(kAda, "t:2|ms", 600);
  commit();
  EXPECT_TRUE(store.state.days.empty());
  EXPECT_EQ(store.state.undated.size(), 2u);
  send(kAda, "a:1|c\nt:3|ms", 600);
  // The clock is set, ten minutes later, to just after midnight.
  wall = std::floor(right / 86400) * 86400 + 300;
  boot += 600'000'000'000;
  send(kAda, "a:1|c");
  commit();
  EXPECT_TRUE(store.state.undated.empty());
  EXPECT_EQ(boot - start, 1'800'000'000'000);
  EXPECT_EQ(store.state.days[kDay - 1].scalars["a"], 2);
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 1);
  EXPECT_EQ(store.state.days[kDay - 1].samples["t"], "1@84900 2@85500 3@86100");
  EXPECT_EQ(store.state.days[kDay - 1].owners["a"], kAda);
}

TEST_F(RecorderTest, AClockBehindTheNewestDayIsBelievedLateOrWhenItIsSynchronised) {
  for (const bool synchronises : {false, true}) {
    SCOPED_TRACE(synchronises);
    store.state = {};
    store.state.days[kDay + 100].scalars["future"] = 1;
    synchronised = false;
    wall = kDay * 86400.0 + 36000;
    recorder.reset();
    send(kAda, "a:1|c");
    commit();
    EXPECT_EQ(store.state.undated.size(), 1u);
    synchronised = synchronises;
    send(kAda, "a:1|c", synchronises ? 60 : 86400);
    commit();
    EXPECT_TRUE(store.state.undated.empty());
    const std::int32_t today = kDay + (synchronises ? 0 : 1);
    EXPECT_EQ(store.state.days[kDay].scalars["a"], synchronises ? 2 : 1);
    EXPECT_EQ(store.state.days[today].scalars["a"], synchronises ? 2 : 1);
  }
}

TEST_F(RecorderTest, AStoreThatCannotBeWrittenLosesNothingButDetail) {
  settings.numbers[std::size_t(RecorderNumber::MemoryLimit)] = 8 << 20;
  store.failure = "the disk is full";
  send(kBob, "b:1|c\nslow:7|ms\nslow:8|ms");
  std::string lines;
  for (int i = 0; i < 2000; ++i) lines += fmt::format("flood:{}.125|h\n", i);
  std::uint64_t sent = 0;
  for (int round = 0; round < 400; ++round) {
    send(kAda, lines, 1);
    settle();
    sent += 2000;
  }
  EXPECT_THAT(log->texts(LogLevel::Error), ElementsAre(HasSubstr("the disk is full")));
  // The next attempts take no more memory, and the days that end meanwhile have bounds.
  const std::size_t held = recorder->hasUncommitted();
  for (int minute = 0; minute < 30; ++minute) {
    send(kAda, "flood:1|h", 61);
    settle();
    ++sent;
  }
  EXPECT_EQ(held, 1u);
  EXPECT_EQ(commit(), "failed: the disk is full\n");
  store.failure.clear();
  EXPECT_EQ(commit(), "done\n");
  const StoredDay& day = store.state.days[kDay];
  EXPECT_EQ(day.scalars.at("b"), 1);
  EXPECT_EQ(day.samples.at("slow"), "7@36000 8@36000");  // others' are left alone
  EXPECT_EQ(day.weights.at("flood") + refused("memory"), sent);
  EXPECT_GT(day.scalars.at("vellum.tallyd.samples_thinned"), 0);
  EXPECT_EQ(refused("memory"), 0u);
}

TEST_F(RecorderTest, FractionsAddUpOverCommits) {
  for (int i = 0; i < 5; ++i) {
    send(kAda, "a:0.5|c");
    commit();
  }
  EXPECT_EQ(store.state.days[kDay].scalars["a"], 2);
}

TEST_F(RecorderTest, WhatItHoldsIsForgottenOnRequest) {
  send(kAda, "a:1|c\nt:1|ms\ng:7|g");
  recorder->onControl(7, "forget");
  send(kAda, "");
  send(kAda, "a:1|c");  // was queued
  send(kBob, "b:1|c\ng:+1|g");
  EXPECT_EQ(ingress.answers[7], "done\n");
  commit();
  EXPECT_THAT(store.state.days[kDay].scalars, ElementsAre(Pair("b", 1), Pair("g", 1)));
  EXPECT_TRUE(store.state.days[kDay].samples.empty());
}

TEST_F(RecorderTest, TheStatusIsAPropertyList) {
  send(kAda, "a:1|c\nbad\ntallyclient.dropped:7|c");
  recorder->onControl(1, "status");
  const auto value = decodePlist(ingress.answers[1]);
  ASSERT_TRUE(value);
  const auto* const status = kvCast<KvDictionary>(value->get());
  EXPECT_EQ(status->getInt64("metrics"), 1);
  EXPECT_EQ(status->getAs<KvDictionary>("refused")->getInt64("malformed"), 1);
  EXPECT_EQ(status->getAs<KvDictionary>("counts")->getInt64("client_metrics_dropped"), 7);
  recorder->onControl(2, "erase everything");
  EXPECT_THAT(ingress.answers[2], HasSubstr("failed"));
}

TEST_F(RecorderTest, TheStatusNamesTheKeysThatWereRefusedLast) {
  settings.prefix = "p.";
  settings.tags = {"t"};
  send(kAda, "a:1|c\nset:1|s\nset:2|s\nwrong:x|g|#t:u\n\x01:1|q\nlate:1:2|ms|@7\nbare:1");
  send(kBob, "a:2:3|c");
  const auto named = [&] {
    recorder->onControl(1, "status");
    const auto value = decodePlist(ingress.answers[1]);
    const auto* const rows = kvCast<KvDictionary>(value->get())->getAs<KvArray>("refused_keys");
    std::vector<std::string> texts;
    for (std::size_t i = 0; i < rows->size(); ++i) {
      const auto* const row = rows->getAs<KvDictionary>(i);
      EXPECT_EQ(row->getInt64("day"), kDay);
      texts.push_back(fmt::format(
          "{} {} {} {}", row->getString("key").value_or(""), row->getString("reason").value_or(""),
          row->getString("kind").value_or("-"), row->getInt64("count").value_or(0)));
    }
    return texts;
  };
  EXPECT_THAT(named(), ElementsAre("p.a owner - 2", "p.bare malformed - 1",
                                   "p.late sample_rate distribution 1", "p.wrong value scalar 1",
                                   "p.set set - 2"));
  // However many there are, the newest ones are kept.
  for (int i = 0; i < 1000; ++i) send(kAda, fmt::format("n{}:1|s", i));
  const auto many = named();
  EXPECT_EQ(many.size(), RefusedNames::kMost);
  EXPECT_EQ(many.front(), "p.n999 set - 1");
  recorder->onControl(2, "forget");
  send(kAda, "");
  send(kAda, "");
  EXPECT_THAT(named(), ElementsAre());
}

TEST_F(RecorderTest, OneThatIsNotUsedEndsIfItIsStartedAgain) {
  ingress.activated = true;
  send(kAda, "a:1|c");
  send(kAda, "", 900);
  settle();
  EXPECT_FALSE(ingress.stopped);
  ASSERT_TRUE(next);
  send(kAda, "", 900);
  EXPECT_TRUE(ingress.stopped);
}

TEST_F(RecorderTest, TheTimeThatItRanIsCountedOnItsDaysIfItIsWanted) {
  const auto ran = [&](std::int32_t day) {
    const auto& scalars = store.state.days[day].scalars;
    const auto found = scalars.find("vellum.tallyd.time.running");
    return found != scalars.end() ? found->second : -1;
  };
  ingress.activated = true;
  wall = kDay * 86400.0 + 86400 - 2000;
  send(kAda, "a:1|c");
  send(kAda, "", 900);
  settle();
  EXPECT_EQ(ran(kDay), -1) << "not wanted";
  store.wantsRunning = true;
  send(kAda, "a:1|c", 100);
  EXPECT_EQ(commit(), "done\n");
  EXPECT_EQ(ran(kDay), 100);
  send(kAda, "a:1|c", 950);
  EXPECT_EQ(commit(), "done\n");
  EXPECT_EQ(ran(kDay), 1050);
  store.failure = "full";
  send(kAda, "b:1|c", 20);
  EXPECT_NE(commit(), "done\n");
  store.failure.clear();
  send(kAda, "", 80);  // past midnight, since when it waits to try again
  settle();
  EXPECT_EQ(ran(kDay), 1100);
  EXPECT_EQ(ran(kDay + 1), 50);
  // Nobody records any more: it ends, and not before what it ran is committed.
  send(kAda, "", 1800);
  settle();
  EXPECT_TRUE(ingress.stopped);
  EXPECT_EQ(ran(kDay + 1), 1850);
}

}  // namespace
}  // namespace tally
