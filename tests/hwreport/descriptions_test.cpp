// Channels, samples and units as text.
#include <fcntl.h>
#include <unistd.h>

#include "hwreport/channel_world.h"

namespace tally {
namespace {

using namespace tests;

std::string textOf(const KvRef<KvString>& string) {
  return string ? std::string(string->view()) : "(nothing)";
}

TEST(UnitLabels, Table) {
  const struct {
    std::uint64_t scale, factor, quantity;
    const char* label;
  } cases[] = {
      {0, 0, 1, "s"},          {0x79, 0, 1, "us"},
      {0x76, 0, 3, "nJ"},      {0x82, 0, 100, "kevents"},
      {0, 0, 55, "??"},        {0, 0, 0, ""},
      {0x8C00, 4, 9, "4KiB"},  {0x8200, 0, 9, "B"},
      {0, 5, 9, ""},           {0x8C00, 5, 100, "events"},
      {0x76, 1, 1, "1Gticks"}, {0x10000, 0, 9, "hwticks?"},
      {0x10000, 1, 1, "s"},
  };
  for (const auto& c : cases) {
    const auto one = channel(1, 1);
    one->set("HwReportChannelInfo",
             HwReportCreateUnitInfo(c.quantity << 56 | c.scale << 32 | c.factor));
    KvString* const label = HwReportChannelGetUnitLabel(one.get());
    ASSERT_NE(label, nullptr);
    EXPECT_EQ(label->view(), c.label) << std::hex << c.scale << " " << c.factor;
    one->remove("HwReportChannelInfo");
    EXPECT_EQ(HwReportChannelGetUnitLabel(one.get()), label) << "cached";
  }
  const auto none = channel(1, 1);
  EXPECT_EQ(HwReportChannelGetUnitLabel(none.get()), nullptr);
  EXPECT_FALSE(none->contains("UnitLabel"));
}

TEST(Descriptions, OfChannels) {
  const auto one = channel(0x435055, typeWord(2, 300, 0x102), nullptr, "G", "S");
  one->set("HwReportChannelInfo", HwReportCreateUnitInfo(1ull << 56));
  EXPECT_EQ(textOf(HwReportChannelCopyDescription(one.get(), 0, "> ")),
            "> D <id 0x10> CPU < 0x435055 (s) | G/g G/S | cat 0x102 | format 0x02 | elts 300 >\n");
  EXPECT_EQ(
      textOf(HwReportChannelCopyDescription(channel(0, 0).get(), 0, nullptr)),
      "D <id 0x10> (null) < 0 ((null)) | G/g (none)/(none) | cat 0000 | format 0000 | elts 0 >\n");
  EXPECT_FALSE(HwReportChannelCopyDescription(nullptr, 0, nullptr));
  EXPECT_FALSE(HwReportChannelCopyDescription(channel(1, kInvalid).get(), 0, nullptr));
}

TEST(Descriptions, OfSamples) {
  const auto with = [](KvRef<KvDictionary> one, std::uint64_t unit,
                       std::vector<std::uint32_t> config = {}) {
    auto information = HwReportCreateUnitInfo(unit);
    if (!config.empty())
      information->set("HwReportChannelConfig", KvData::create(std::as_bytes(std::span(config))));
    one->set("HwReportChannelInfo", information);
    return one;
  };
  constexpr std::uint64_t kMilliseconds = 1ull << 56 | 0x7Cull << 32;
  const auto zeroElements = channel(0x41, typeWord(1, 0));
  std::vector<std::byte> many(65'536 * 64);
  many[16] = std::byte{1};
  zeroElements->set("RawElements", KvData::create(many));
  const std::string nothing = "(nothing)";
  const struct {
    const char* what;
    KvRef<KvDictionary> one;
    std::string text;
  } cases[] = {
      {"simple", with(sampled(1, {{{static_cast<std::uint64_t>(-42)}}}), kMilliseconds),
       "+                               A = {          -42 ms }\n"},
      {"states", with(sampled(2, {{{0x4F4646, 3, 1500}}, {{0x4F4E, 12, 500}}}), kMilliseconds),
       "+                   A[     OFF] = { # 3        1.500e+00 s / 75.0% }\n"
       "+                   A[      ON] = { # 12       5.000e-01 s / 25.0% }\n"},
      {"states that the legend does not know", sampled(2, {{{0x41, 3, 0}}}, 2),
       "+                   A[0x8000000000000000] = { # 9223372036854775808       nan s /  nan% "
       "}\n"},
      {"histogram",
       with(sampled(3, {{{0, 1, 2, 3}}, {{2, 11, 19, 30}}}), kMilliseconds, {10, 0, 0, 2}),
       "+                   A[           0 -           10 ms] = { <no hits>; # 0 }\n"
       "+                   A[          10 -           20 ms] = { m           11; M           19; "
       "s           30; # "
       "           2 }\n"},
      {"histogram without bounds", sampled(3, {{{0, 1, 2, 3}}}), nothing},
      {"histogram with too few bounds",
       with(sampled(3, {{{1}}, {{2}}}), kMilliseconds, {10, 0, 0, 1}), nothing},
      {"arrays", sampled(4, {{{1}}, {{2}}}), "arrays unsupported?arrays unsupported?"},
      {"no elements", zeroElements, ""},
      {"not sampled", channel(1, typeWord(1, 1)), nothing},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(textOf(HwReportSampleCopyDescription(c.one.get(), 0, "+")), c.text) << c.what;
  }
}

TEST(Descriptions, AreWrittenWithOneCall) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_NONBLOCK), 0);
  EXPECT_EQ(HwReportWriteStringUTF8(ends[1], nullptr), HwErrBadArgument);
  EXPECT_EQ(HwReportWriteStringUTF8(ends[1], text("caf\xC3\xA9\n").get()), 0u);
  EXPECT_EQ(HwReportWriteStringUTF8(ends[1], text(std::string_view("a\0b", 3)).get()), 0u);
  char buffer[16] = {};
  EXPECT_EQ(read(ends[0], buffer, sizeof(buffer)), 7);
  EXPECT_STREQ(buffer, "caf\xC3\xA9\na");
  EXPECT_EQ(HwReportWriteStringUTF8(ends[1], text(std::string(1 << 20, 'x')).get()),
            HwErrShortWrite);
  EXPECT_EQ(HwReportWriteStringUTF8(ends[1], text("y").get()), HwErrIO) << "the pipe is full";
  close(ends[0]);
  close(ends[1]);
  EXPECT_EQ(HwReportWriteStringUTF8(ends[1], text("x").get()), HwErrIO);
}

}  // namespace
}  // namespace tally
