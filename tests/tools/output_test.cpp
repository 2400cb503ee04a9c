// Tables, bars and numbers for people.
#include "tools/frame/output.h"

#include <gtest/gtest.h>

#include <cmath>

#include <limits>

#include "base/natural_order.h"
#include "base/printable.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

TEST(Output, NumbersForPeople) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  std::string reals, integers;
  for (const double value : {0.0, -0.0, 2.5, 29.0234, 0.00012345, 999.96, 1000.4, -48731904.0, 1e15,
                             1e16, kInfinity, -kInfinity, std::nan("")}) {
    reals += realText(value) + " ";
  }
  EXPECT_EQ(
      reals,
      "0 0 2.5 29.02 0.0001234 1,000 1,000 -48,731,904 1,000,000,000,000,000 1e+16 inf -inf nan ");
  for (const std::int64_t value :
       std::initializer_list<std::int64_t>{0, -999, 1000, -1234567, INT64_MIN}) {
    integers += integerText(value) + " ";
  }
  EXPECT_EQ(integers, "0 -999 1,000 -1,234,567 -9,223,372,036,854,775,808 ");
  EXPECT_EQ(counted(2, "entry") + ", " + counted(1, "entry") + ", " + counted(2, "key"),
            "2 entries, 1 entry, 2 keys");
  EXPECT_EQ(byteText(1023), "1,023 bytes");
  EXPECT_EQ(byteText(1536), "1.5 KiB");
  EXPECT_EQ(byteText(UINT64_MAX), "16777216.0 TiB");
}

TEST(Output, BarsAreProportionalAndNeverInvisible) {
  const Terminal plain{80, false, false, false};
  const Terminal unicode{80, false, false, true};
  EXPECT_EQ(bar(plain, 0.5, 10), "#####");
  EXPECT_EQ(bar(plain, 0.001, 10), "#");
  EXPECT_EQ(bar(unicode, 0.001, 10), "▏");
  EXPECT_EQ(bar(unicode, 0.25, 10), "██▌");
  EXPECT_EQ(bar(unicode, 0, 10), "");
  EXPECT_EQ(bar(unicode, std::nan(""), 10), "");
  EXPECT_EQ(bar(unicode, 7, 2), "██");
}

TEST(Output, TablesAlignByDisplayWidthAndGiveWayOnTerminals) {
  Table table({{"key", Align::Left, true}, {"n", Align::Right}, {"x"}});
  table.add({"日本", "1"});
  table.add({"a very long key indeed", "12", Cell("end", Ink::Good)});
  table.add({"e\xcc\x81\x1b", "", "z"});
  EXPECT_EQ(table.render({40, false, false, true}),
            "  key                      n  x\n"
            "  日本                     1\n"
            "  a very long key indeed  12  end\n"
            "  e\xcc\x81\\x1b                       z\n");
  EXPECT_EQ(table.render({26, true, true, false}, 0),
            "\x1b[2mkey\x1b[0m                 \x1b[2mn\x1b[0m  \x1b[2mx\x1b[0m\n"
            "日本                1\n"
            "a very long key    12  \x1b[32mend\x1b[0m\n"
            "indeed\n"
            "e\xcc\x81\\x1b                  z\n");
  EXPECT_EQ(table.render({18, true, false, true}, 0),
            "日本\n  n  1\n"
            "a very long key\nindeed\n  n  12\n  x  end\n"
            "e\xcc\x81\\x1b\n  x  z\n")
      << "too narrow for a table";
  Table plain({{""}, {""}, {"", Align::Left, true}});
  plain.add({"[ok]", "device description", "9 entries of it"});
  EXPECT_EQ(plain.render({34, true, false, true}, 0),
            "[ok]  device description\n  9 entries of it\n");
  Table bars({{""}, {""}});
  bars.add({"half", Cell::bar(0.5, 36)});
  EXPECT_EQ(bars.render({80, true, false, false}), "  half  " + std::string(18, '#') + "\n");
  EXPECT_EQ(bars.render({16, true, false, false}), "  half  ####\n");
}

TEST(Output, TextIsWrappedWhereItMayBe) {
  const std::pair<const char*, std::vector<std::string>> cases[] = {
      {"", {""}},
      {"one two three", {"one two", "three"}},
      {"vellum.power.wakeups", {"vellum.", "power.", "wakeups"}},
      {"abcdefghijklm", {"abcdefgh", "ijklm"}},
      {"12345678 x", {"12345678", "x"}},
      {"日本日本日", {"日本日本", "日"}}};
  for (const auto& [text, lines] : cases) EXPECT_EQ(wrapped(text, 8), lines) << text;
}

TEST(Output, NamesAreInTheOrderOfTheirNumbers) {
  const std::vector<std::string> ordered = {"",      "a",    "a2", "a02b", "a10",
                                            "a010b", "a10b", "b1", "é"};
  for (std::size_t i = 0; i < ordered.size(); ++i) {
    for (std::size_t j = 0; j < ordered.size(); ++j) {
      EXPECT_EQ(naturalLess(ordered[i], ordered[j]), i < j) << ordered[i] << " " << ordered[j];
    }
  }
}

TEST(Output, JsonIsSafeToShow) {
  EXPECT_EQ(printableJson("\"a\x7f\xc2\x9b\xe2\x80\xae é\""), "\"a\\u007f\\u009b\\u202e é\"");
}

TEST(Output, DaysAsArguments) {
  const std::vector<std::pair<const char*, std::optional<std::int32_t>>> cases = {
      {"yesterday", 19999},         {"-1", -1},
      {"2026-03-01", 20513},        {"2026-02-29", std::nullopt},
      {"2026-3-1", std::nullopt},   {"0000-01-01", std::nullopt},
      {"2147483648", std::nullopt}, {"12x", std::nullopt}};
  for (const auto& [text, day] : cases) EXPECT_EQ(parseDay(text, 20000), day) << text;
}

}  // namespace
}  // namespace tally::tools
