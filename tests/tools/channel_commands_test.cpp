// tallyctl channels on described devices: what is chosen, shown and refused.
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

std::string key(const std::string& name, const std::string& value) {
  return "<key>" + name + "</key>" + value;
}
std::string integerElement(std::uint64_t value) {
  return "<integer>" + std::to_string(value) + "</integer>";
}
std::string text(const std::string& value) { return "<string>" + value + "</string>"; }
std::string dictElement(const std::string& content) { return "<dict>" + content + "</dict>"; }
std::string array(const std::string& content) { return "<array>" + content + "</array>"; }

constexpr std::uint64_t word(std::uint64_t format, std::uint64_t categories, std::uint64_t count) {
  return format | categories << 16 | count << 32;
}

std::string entry(const std::string& className, const std::string& content) {
  return dictElement(key("Class", text(className)) + content);
}
std::string driver(const std::string& name, const std::string& legend, const std::string& values) {
  return entry("Driver", key("Name", text(name)) +
                             key("Properties", dictElement(key("HwReportLegendPublic", "<true/>") +
                                                           key("HwReportLegend", legend) +
                                                           key("HwReportValues", array(values)))));
}
std::string channel(std::uint64_t id, std::uint64_t type, const std::string& name) {
  return array(integerElement(id) + integerElement(type) + text(name));
}
constexpr const char* kThreeBuckets = "CgAAAAAAAAAAAAAAAwAAAA==";  // 10 wide
std::string group(const std::string& names, std::uint64_t unit, const std::string& channels,
                  const std::string& config = kThreeBuckets) {
  return dictElement(names +
                     key("HwReportChannelInfo",
                         dictElement(key("HwReportChannelUnit", integerElement(unit)) +
                                     key("HwReportChannelConfig", "<data>" + config + "</data>"))) +
                     key("HwReportChannels", array(channels)));
}
std::string frames(std::uint64_t id, const std::string& values) {
  return dictElement(key("Channel", integerElement(id)) + key("Frames", array(values)));
}

constexpr std::uint64_t kMilliseconds = 0x01'00'00'7C'00000000, kEvents = 0x64'00'00'00'00000000;

std::string state(const std::string& name, std::uint64_t entries, std::uint64_t residency,
                  std::uint64_t time) {
  return dictElement(key("ID", text(name)) + key("InTransitions", integerElement(entries)) +
                     key("Residency", integerElement(residency)) +
                     key("Time", integerElement(time)));
}
std::string bucket(std::uint64_t hits, std::uint64_t sum) {
  return dictElement(key("Hits", integerElement(hits)) + key("Sum", integerElement(sum)));
}

// One channel of each format, and one that is described nowhere.
std::string goodDriver() {
  const std::string groupA = key("HwReportGroupName", text("A"));
  return driver(
      "good",
      array(group(groupA, kEvents, channel(1, word(1, 0x100, 1), "count")) +
            group(groupA + key("HwReportSubGroupName", text("Sub")), kMilliseconds,
                  channel(2, word(2, 0, 2), "power") + channel(3, word(3, 0x102, 3), "latency") +
                      channel(4, word(4, 0, 2), "lanes"))),
      frames(1, integerElement(10) + integerElement(7)) +
          frames(2, array(state("IDLE", 3, 1000, 5) + state("BUSY", 4, 3000, 9)) +
                        array(state("IDLE", 5, 2500, 11) + state("BUSY", 5, 3500, 10))) +
          frames(3, array(bucket(0, 0) + bucket(2, 30) + bucket(0, 0)) +
                        array(bucket(0, 0) + bucket(6, 90) + bucket(0, 0))) +
          frames(4, array(integerElement(1) + integerElement(2) + integerElement(3) +
                          integerElement(4) + integerElement(5)) +
                        array(integerElement(2) + integerElement(4) + integerElement(6) +
                              integerElement(8) + integerElement(10))));
}
std::string hub(const std::string& content = "") {
  return entry("HwReportHub", key("Hub", dictElement(content)));
}

class ChannelCommands : public ToolTest {
 protected:
  void describe(const std::string& entries) const {
    putPlist("device/device/registry.plist", dictElement(key("Entries", array(entries))));
  }
  Outcome channels(const std::vector<std::string>& arguments) {
    return runUnder({"channels"}, arguments);
  }
  // What is read from the sample of a device, by the names of channels.
  static std::map<std::string, nlohmann::json> byName(const Outcome& outcome) {
    std::map<std::string, nlohmann::json> channels;
    const nlohmann::json document = outcome.json();
    for (const auto& item : document["channels"]) channels[item["name"]] = item;
    return channels;
  }
};

TEST_F(ChannelCommands, FiltersChooseAndCombine) {
  describe(hub() + goodDriver() +
           driver("other", array(group("", kEvents, channel(9, word(1, 2, 1), "lone"))), ""));
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
    const nlohmann::json list = outcome.json();
    for (const auto& item : list) names += item["name"].get<std::string>() + " ";
    EXPECT_EQ(names, c.names);
    EXPECT_EQ(outcome.status, *c.names != '\0' ? kSuccess : kWrong);
    EXPECT_EQ(outcome.err.empty(), *c.names != '\0');
  }
  EXPECT_EQ(channels({"list", "--category", "0"}).status, kBadUsage) << "not all of them";
}

TEST_F(ChannelCommands, SamplesEveryFormatAndItsDifference) {
  describe(hub() + goodDriver());
  const struct {
    std::vector<std::string> arguments;
    std::int64_t count;
    std::uint64_t entries, residency, hits, sum;
    double share;
    nlohmann::json lanes;
  } cases[] = {
      {{"sample", "--json"}, 10, 3, 1000, 2, 30, 0.25, {1, 2, 3, 4, 5}},
      {{"sample", "--json", "--delta", "0.01"}, -3, 2, 1500, 4, 60, 0.75, {1, 2, 3, 4, 5}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.arguments.back());
    const Outcome outcome = channels(c.arguments);
    ASSERT_EQ(outcome.status, kSuccess) << outcome.err;
    auto shown = byName(outcome);
    EXPECT_EQ(shown["count"]["value"], c.count);
    const nlohmann::json& idle = shown["power"]["states"][0];
    EXPECT_EQ(idle["name"], "IDLE");
    EXPECT_EQ(idle["entries"], c.entries);
    EXPECT_EQ(idle["residency"], c.residency);
    EXPECT_EQ(idle["share"], c.share);
    const nlohmann::json& middle = shown["latency"]["buckets"][1];
    EXPECT_EQ(middle["lower"], 10);
    EXPECT_EQ(middle["upper"], 20);
    EXPECT_EQ(middle["hits"], c.hits);
    EXPECT_EQ(middle["sum"], c.sum);
    EXPECT_TRUE(middle["minimum"].is_null());
    EXPECT_EQ(shown["lanes"]["values"], c.lanes);
  }
}

TEST_F(ChannelCommands, PeopleSeeUnitsBarsAndTheCurrentState) {
  describe(hub() + goodDriver());
  const Outcome outcome = channels({"sample"});
  EXPECT_EQ(outcome.out,
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

TEST_F(ChannelCommands, FaultsAreNamedAndCostNoMore) {
  const std::string code = integerElement(0xE00002BC), good = hub() + goodDriver();
  const std::string ghost =
      driver("ghost", array(group("", kEvents, channel(8, word(1, 0, 1), "unserved"))), "");
  const std::string broken =
      driver("bro&#27;ken", array(group("", 0, array(integerElement(1)))), "");
  const std::string legend = driver("odd", integerElement(3), "");
  const std::string lost = driver("lost", array(group("", kEvents, channel(5, word(1, 0, 1), "x"))),
                                  frames(5, array(integerElement(1)) + "<array><dict/></array>"));
  const struct {
    const char* name;
    std::string entries;
    const char* message;
    bool showsGood = false;
    std::vector<std::string> arguments = {"sample"};
  } cases[] = {
      {"nothing", "", "no driver publishes channels"},
      {"no hub", goodDriver(), "the device has no statistics hub"},
      {"update", hub(key("UpdateStatus", code)) + goodDriver(), "no sample: error 0xe00002bc"},
      {"a channel without values", good + ghost, "1 channel not served by the hub", true},
      {"a channel that ends",
       good + lost,
       "x: the two samples cannot be subtracted",
       true,
       {"sample", "--delta", "0.01"}},
      {"a broken legend", hub() + broken + goodDriver(),
       "bro\\x1bken <id 0x101>: its channels cannot be read", true},
      {"no legend", hub() + legend + goodDriver(), "bad legend (error 0xe00002c9)", true, {"list"}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    describe(c.entries);
    const Outcome outcome = channels(c.arguments);
    EXPECT_EQ(outcome.status, kWrong);
    EXPECT_THAT(outcome.err, HasSubstr(c.message));
    EXPECT_EQ(outcome.out.find("latency") != std::string::npos, c.showsGood);
    const Outcome json = runUnder({"channels", "--json"}, c.arguments);
    EXPECT_EQ(json.status, kWrong);
    EXPECT_TRUE(json.out.empty() || nlohmann::json::accept(json.out));
  }
}

}  // namespace
}  // namespace tally::tools
