// tallyctl channels on described devices: what is chosen, shown and refused.
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

constexpr std::uint64_t word(std::uint64_t format, std::uint64_t categories, std::uint64_t count) {
  return format | categories << 16 | count << 32;
}
constexpr std::uint64_t kMilliseconds = 0x01'00'00'7C'00000000, kEvents = 0x64'00'00'00'00000000;

Json driver(const std::string& name, const Json& legend, const std::vector<Json>& values = {}) {
  return {
      {"Class", "Driver"},
      {"Name", name},
      {"Properties",
       {{"HwReportLegendPublic", true}, {"HwReportLegend", legend}, {"HwReportValues", values}}}};
}
Json group(std::uint64_t unit, const std::vector<Json>& channels) {
  const char* const threeBuckets = "<data>CgAAAAAAAAAAAAAAAwAAAA==</data>";  // 10 wide
  return {{"HwReportChannelInfo",
           {{"HwReportChannelUnit", unit}, {"HwReportChannelConfig", threeBuckets}}},
          {"HwReportChannels", channels}};
}
Json state(const char* name, int entries, int residency, int time) {
  return {{"ID", name}, {"InTransitions", entries}, {"Residency", residency}, {"Time", time}};
}
Json buckets(int hits, int sum) {
  const Json none = {{"Hits", 0}, {"Sum", 0}};
  return std::vector<Json>{none, {{"Hits", hits}, {"Sum", sum}}, none};
}
Json frames(int id, const Json& first, const Json& second) {
  return {{"Channel", id}, {"Frames", std::vector<Json>{first, second}}};
}

// One channel of each format.
Json goodDriver() {
  Json events = group(kEvents, {{1, word(1, 0x100, 1), "count"}});
  Json times = group(kMilliseconds, {{2, word(2, 0, 2), "power"},
                                     {3, word(3, 0x102, 3), "latency"},
                                     {4, word(4, 0, 2), "lanes"}});
  events["HwReportGroupName"] = times["HwReportGroupName"] = "A";
  times["HwReportSubGroupName"] = "Sub";
  return driver(
      "good", std::vector<Json>{events, times},
      {frames(1, 10, 7),
       frames(2, {state("IDLE", 3, 1000, 5), state("BUSY", 4, 3000, 9)},
              {state("IDLE", 5, 2500, 11), state("BUSY", 5, 3500, 10)}),
       frames(3, buckets(2, 30), buckets(6, 90)), frames(4, {1, 2, 3, 4, 5}, {2, 4, 6, 8, 10})});
}
// A driver with one channel of one value.
Json smallDriver(const std::string& name, int id, const char* channel,
                 std::uint64_t categories = 0) {
  return driver(name, std::vector<Json>{group(kEvents, {{id, word(1, categories, 1), channel}})});
}
const Json kHub = {{"Class", "HwReportHub"}, {"Hub", Json::object()}};

class ChannelCommands : public ToolTest {
 protected:
  void describe(const std::vector<Json>& entries) const {
    putPlist(kRegistry, element({{"Entries", entries}}));
  }
  // What is read from the sample of a device, by the names of channels.
  static nlohmann::json byName(const Outcome& outcome) {
    nlohmann::json channels;
    const nlohmann::json document = outcome.json();
    for (const auto& item : document["channels"]) channels[item["name"]] = item;
    return channels;
  }
};

TEST_F(ChannelCommands, FiltersChooseAndCombine) {
  describe({kHub, goodDriver(), smallDriver("other", 9, "lone", 2)});
  const struct {
    std::vector<std::string> filters;
    const char* names;
  } cases[] = {
      {{}, "count power latency lanes lone "},
      {{"--driver", "oth"}, "lone "},
      {{"--group", "A"}, "count power latency lanes "},
      {{"--category", "0x100"}, "count latency "},
      {{"--format", "array"}, "lanes "},
      {{"--unit", "events"}, "count lone "},
      {{"--unit", "0x64000000000000000000"}, ""},
      {{"--unit", "events", "--group", "A"}, "count "},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.filters));
    const Outcome outcome = runUnder({"channels", "list", "--json"}, c.filters);
    std::string names;
    const Json list = outcome.json();
    for (const auto& item : list) names += item["name"].get<std::string>() + " ";
    EXPECT_EQ(names, c.names);
    EXPECT_EQ(outcome.status, *c.names != '\0' ? kSuccess : kWrong);
    EXPECT_EQ(outcome.err.empty(), *c.names != '\0');
  }
  EXPECT_EQ(run({"channels", "list", "--category", "0"}).status, kBadUsage) << "not all of them";
}

TEST_F(ChannelCommands, SamplesEveryFormatAndItsDifference) {
  describe({kHub, goodDriver()});
  const struct {
    std::vector<std::string> arguments;
    const char* values;
  } cases[] = {
      {{"sample", "--json"},
       R"({"/count/value": 10, "/lanes/values": [1, 2, 3, 4, 5],
           "/power/states/0": {"id": "0x49444c45", "name": "IDLE", "entries": 3,
                               "residency": 1000, "share": 0.25, "current": false},
           "/latency/buckets/1": {"lower": 10, "upper": 20, "hits": 2, "sum": 30,
                                  "minimum": null, "maximum": null}})"},
      {{"sample", "--json", "--delta", "0.01"},
       R"({"/count/value": -3, "/lanes/values": [1, 2, 3, 4, 5],
           "/power/states/0": {"id": "0x49444c45", "name": "IDLE", "entries": 2,
                               "residency": 1500, "share": 0.75, "current": true},
           "/latency/buckets/1": {"lower": 10, "upper": 20, "hits": 4, "sum": 60,
                                  "minimum": null, "maximum": null}})"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.arguments.back());
    const Outcome outcome = runUnder({"channels"}, c.arguments);
    ASSERT_EQ(outcome.status, kSuccess) << outcome.err;
    expectValues(byName(outcome), c.values);
  }
}

TEST_F(ChannelCommands, PeopleSeeUnitsBarsAndTheCurrentState) {
  describe({kHub, goodDriver()});
  EXPECT_EQ(run({"channels", "sample"}).out,
            "\ngood <id 0x101>\n"
            " A\n"
            "  count  10  events\n"
            " A / Sub\n"
            "  power\n"
            "    IDLE  ██████                    25.0 %  1 s  3  entered\n"
            "    BUSY  ██████████████████        75.0 %  3 s  4  entered, now\n"
            "  latency\n"
            "    10 to 20  ms  2  ████████████████████████\n"
            "  lanes\n"
            "    [0]  1  ms  ████▊\n"
            "    [1]  2  ms  █████████▋\n"
            "    [2]  3  ms  ██████████████▍\n"
            "    [3]  4  ms  ███████████████████▎\n"
            "    [4]  5  ms  ████████████████████████\n");
}

TEST_F(ChannelCommands, WhatASourceSaysOfAChannelIsShownOnRequest) {
  describe(
      {kHub, driver("kernel", std::vector<Json>{group(
                                  kEvents, {{7,
                                             word(1, 1, 1),
                                             "reads",
                                             {{"Semantics", "counter"},
                                              {"Scope", "boot"},
                                              {"Width", 32},
                                              {"File", "/proc/x"},
                                              {"Description", "what was read"}}},
                                            {8, word(1, 1, 1), "bare", {{"Width", "wide"}}}})})});
  const Outcome text = run({"channels", "list", "--verbose"});
  EXPECT_THAT(text.out, HasSubstr(" >\n  what was read; counter; /proc/x; 32 bits since boot\n"));
  const Json list = run({"channels", "list", "--verbose", "--json"}).json();
  EXPECT_EQ(list[0]["width"], 32);
  EXPECT_EQ(list[0]["file"], "/proc/x");
  EXPECT_TRUE(list[1]["width"].is_null() && list[1]["file"].is_null());
  const Outcome sample = run({"channels", "sample"});
  EXPECT_EQ(sample.status, kSuccess) << "that may happen";
  EXPECT_EQ(sample.out, "\n2 channels without a value now\n");
}

TEST_F(ChannelCommands, FaultsAreNamedAndCostNoMore) {
  const Json good = goodDriver();
  const Json failing = {{"Class", "HwReportHub"}, {"Hub", {{"UpdateStatus", 0xE00002BC}}}};
  Json lost = smallDriver("lost", 5, "x");
  lost["Properties"]["HwReportValues"] =
      std::vector<Json>{frames(5, std::vector<Json>{1}, std::vector<Json>{Json::object()})};
  const struct {
    std::vector<Json> entries;
    const char* message;
    bool showsGood = false;
    std::vector<std::string> arguments = {"sample"};
  } cases[] = {
      {{}, "no driver publishes channels"},
      {{good}, "the device has no statistics hub"},
      {{failing, good}, "no sample: error 0xe00002bc"},
      {{kHub, good, smallDriver("ghost", 8, "unserved")}, "1 channel not served by the hub", true},
      {{kHub, good, lost}, "x: the two samples cannot", true, {"sample", "--delta", "0.01"}},
      {{kHub, driver("bro&#27;ken", std::vector<Json>{group(0, {Json::array({1})})}), good},
       "bro\\x1bken <id 0x101>: its channels cannot be read",
       true},
      {{kHub, driver("odd", 3), good}, "bad legend (error 0xe00002c9)", true, {"list"}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.message);
    describe(c.entries);
    const Outcome outcome = runUnder({"channels"}, c.arguments);
    EXPECT_EQ(outcome.status, kWrong);
    EXPECT_THAT(outcome.err, HasSubstr(c.message));
    EXPECT_EQ(outcome.out.find("latency") != std::string::npos, c.showsGood);
    const Outcome json = runUnder({"channels", "--json"}, c.arguments);
    EXPECT_EQ(json.status, kWrong);
    EXPECT_TRUE(json.out.empty() || Json::accept(json.out));
  }
}

}  // namespace
}  // namespace tally::tools
