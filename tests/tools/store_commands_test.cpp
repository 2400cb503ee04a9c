// tallyctl store: what import takes and refuses, and that a dump can be imported again.
#include "tools/store/recorded_words.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

class StoreCommands : public ToolTest {
 protected:
  Platform makePlatform(const std::string&, std::FILE*) override {
    const auto fake = fakes::makeFakePlatform();
    fake.clock->setDay(20000, 3661.5);
    return fake.services();
  }
  Outcome import(std::string_view csv, const std::string& device = "device") {
    put("day.csv", csv);
    return run({"store", "import", at("day.csv"), "--json"}, device);
  }
  std::string dump(const std::string& device = "device") {
    return run({"store", "dump"}, device).out;
  }
  void forget() { std::filesystem::remove_all(at("device")); }
};

TEST_F(StoreCommands, ImportKeepsTheGoodLinesAndNamesTheBadOnes) {
  const std::string longKey(513, 'k'), header = "kind,key,day,offset,value\n";
  const struct {
    std::string csv;
    int scalars, samples;
    std::string bad = "";          // the numbers of the lines
    const char* reason = nullptr;  // of the first
  } cases[] = {
      {"", 0, 0},
      {"\xef\xbb\xbf" + header + "scalar,a,1,,5\r\n\r\ndistribution,b,1,0,2.5", 1, 1},
      {header + "scalar,a,1,,1.5\nscalar,a,1,,5\n", 1, 0, "2", "whole number of 64 bits"},
      {"scalar,a,2147483648,,1\nscalar,a,-2147483649,,1\nscalar,a,,,1\n", 0, 0, "1 2 3", "the day"},
      {"distribution,a,1,,1\ndistribution,a,1,-1,1\ndistribution,a,1,86400,1\n"
       "distribution,a,1,86399,1\n",
       0, 1, "1 2 3", "0 to 86399"},
      {"distribution,a,1,0,nan\ndistribution,a,1,0,-inf\ndistribution,a,1,0,1e999\n"
       "distribution,a,1,0,1x\ndistribution,a,1,0,\n",
       0, 2, "3 4 5", "a double"},
      {"scalar,a,1,1\nscalar,a,1,,1,,\nscalar\n", 0, 0, "1 2 3", "fewer than five"},
      {"scalar,,1,,1\nscalar,\xff,1,,1\nscalar," + longKey + ",1,,1\n" +
           std::string("scalar,a\0b,1,,1\n", 16),
       0, 0, "1 2 3 4", "valid UTF-8"},
      {"\"scalar\",\"a,\"\"\n\",\"1\",\"\",\"5\"\nscalar,b,1,,1\n", 2, 0},
      {"scalar,\"a,1,,1\nscalar,b,1,,1\n", 1, 0, "1", "not closed"},
      {"scalar,\"a\"x,1,,1\nscalar,b\"c,1,,1\nscalar,d\"e,1,,1\n", 2, 0, "1", "follows a closing"},
      {"scalar,a,1,,1\n" + std::string(600'000, 'x') + "\nscalar,b,1,,1\n", 2, 0, "2", "longer"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.csv.substr(0, 80));
    forget();
    const Outcome outcome = import(c.csv);
    const auto document = outcome.json();
    EXPECT_EQ(document["scalars"], c.scalars);
    EXPECT_EQ(document["samples"], c.samples);
    std::string bad;
    for (const auto& entry : document["firstRejected"]) bad += entry["line"].dump() + " ";
    EXPECT_EQ(bad, c.bad.empty() ? "" : c.bad + " ");
    EXPECT_EQ(document["rejected"], split(c.bad, ' ').size());
    EXPECT_EQ(outcome.status, c.bad.empty() ? kSuccess : kWrong);
    if (c.reason != nullptr) {
      EXPECT_THAT(outcome.err, HasSubstr("line " + c.bad.substr(0, 1) + ": "));
      EXPECT_THAT(document["firstRejected"][0]["reason"], HasSubstr(c.reason));
    }
    EXPECT_EQ(exists(kStore), c.scalars + c.samples > 0);
  }
}

TEST_F(StoreCommands, OnlyTheFirstOfManyBadLinesAreShown) {
  std::string csv = "scalar,a,1,,1\n";
  for (int i = 0; i < 5000; ++i) csv += "bad\n";
  const Outcome outcome = import(csv);
  EXPECT_EQ(std::count(outcome.err.begin(), outcome.err.end(), ';'), 20);
  EXPECT_THAT(outcome.err, HasSubstr("and 4980 more bad lines"));
}

TEST_F(StoreCommands, ADumpCanBeImportedAgain) {
  const std::string rows =
      "kind,key,day,offset,value\n"
      "scalar,zeta,-1,,-9223372036854775808\n"
      "scalar,\" a,\"\"b\"\"\r\n\",20000,,7\n"
      "scalar,caf\xc3\xa9 \x07,20000,,0\n"
      "distribution,\"d,\",19999,86399,0.1\n"
      "distribution,\"d,\",19999,0,-0\n"
      "distribution,d,20000,5,1e+300\n"
      "distribution,d,20000,5,nan\n"
      "distribution,d,20000,4,-inf\n"
      "distribution,d,20000,4,5e-324\n";
  ASSERT_EQ(import(rows).status, kSuccess);
  EXPECT_EQ(dump(), rows);
  ASSERT_EQ(import(dump(), "copy").status, kSuccess);
  EXPECT_EQ(dump("copy"), rows);
  EXPECT_EQ(run({"store", "dump", "--day", "19999", "--prefix", "d"}).out,
            "kind,key,day,offset,value\ndistribution,\"d,\",19999,86399,0.1\n"
            "distribution,\"d,\",19999,0,-0\n");
  expectValues(run({"store", "dump", "--json"}).json(),
               R"({"/scalars/1/key": " a,\"b\"\r\n", "/distributions/1/samples/2": [4, "-inf"]})");
  expectValues(run({"store", "keys", "--json"}).json(),
               R"({"/3": {"kind": "distribution", "key": "d", "days": 1, "firstDay": 20000,
                   "lastDay": 20000, "samples": 4}, "/5": "absent"})");
}

TEST_F(StoreCommands, WeightsAreAColumnOfADumpThatHasAny) {
  const std::string rows =
      "kind,key,day,offset,value,weight\n"
      "scalar,a,20000,,7,\n"
      "distribution,d,20000,5,0.5,1\n"
      "distribution,d,20000,4,nan,4294967295\n"
      "distribution,e,20000,5,1,1\n";
  ASSERT_EQ(import(rows).status, kSuccess);
  EXPECT_EQ(dump(), rows);
  EXPECT_EQ(import("distribution,d,1,5,1,0\ndistribution,d,1,5,1,4294967296\n"
                   "distribution,d,1,5,1,x\nscalar,a,1,,1,1\n")
                .json()["rejected"],
            4);
  expectValues(run({"store", "dump", "--json"}).json(),
               R"({"/distributions/0/samples": [[5, 0.5], [4, "nan", 4294967295]]})");
}

TEST_F(StoreCommands, WordsNameKeysAndTheirValues) {
  const auto pairs = WordForm::Pairs, groups = WordForm::Groups;
  const struct {
    std::vector<std::string> words;
    WordForm form;
    std::string input, expected;
  } cases[] = {
      {{"a", "1", "b", "2"}, pairs, "", "a 1;b 2;"},
      {{"a", "1", "b"}, pairs, "", "the key b has no value"},
      {{"a", "1", "2", "+", "b", "3"}, groups, "", "a 1 2;b 3;"},
      {{"a", "1", "+"}, groups, "", "a key is missing"},
      {{"a"}, groups, "", "the key a has no value"},
      {{"-"}, pairs, "a 1\tb  2\r\n\n - 3", "a 1;b 2;- 3;"},
      {{"-"}, groups, "a 1\nb 2 + c", "line 2: the key c has no value"},
      {{"-"}, groups, "", ""},
      {{"-"}, pairs, std::string((16u << 20) + 1, ' '), "standard input is longer"},
  };
  for (const auto& c : cases) {
    put("words", c.input);
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> input(
        std::fopen(at("words").c_str(), "r"), std::fclose);
    const auto recorded = readRecordedWords(c.words, c.form, input.get());
    std::string text = recorded ? "" : recorded.error().message;
    for (const auto& [key, values] : recorded ? *recorded : std::vector<RecordedWords>()) {
      text += key;
      for (const std::string& value : values) text += " " + value;
      text += ";";
    }
    EXPECT_TRUE(text.starts_with(c.expected) && text.empty() == c.expected.empty()) << text;
  }
}

TEST_F(StoreCommands, SetAndPushTakeTheDayInProgressUnlessTold) {
  const struct {
    const char* arguments;
    int status;
    std::string row;  // of the dump
  } cases[] = {
      {"set a -5", kSuccess, "scalar,a,20000,,-5\n"},
      {"set a 6 --day -7", kSuccess, "scalar,a,-7,,6\n"},
      {"push d nan 1 --day 3 --offset 9", kSuccess,
       "distribution,d,3,9,nan\ndistribution,d,3,9,1\n"},
      {"set a 1 b 2", kSuccess, "scalar,a,20000,,1\nscalar,b,20000,,2\n"},
      {"push d 1 + e 2 --offset 9", kSuccess,
       "distribution,d,20000,9,1\ndistribution,e,20000,9,2\n"},
      {"set a 1 b x", kBadUsage, ""},
      {"push d 1 + e x", kBadUsage, ""},
      {"set a", kBadUsage, ""},
      {"set a 1.5", kBadUsage, ""},
      {"set a 1 --day x", kBadUsage, ""},
      {"push d much", kBadUsage, ""},
      {"push d 1 --offset 86400", kBadUsage, ""},
  };
  for (const auto& c : cases) {
    forget();
    const Outcome outcome = runUnder({"store"}, split(c.arguments, ' '));
    EXPECT_EQ(outcome.status, c.status) << c.arguments;
    EXPECT_EQ(outcome.err.empty(), c.status == kSuccess) << outcome.err;
    EXPECT_EQ(dump(), "kind,key,day,offset,value\n" + c.row);
  }
}

}  // namespace
}  // namespace tally::tools
