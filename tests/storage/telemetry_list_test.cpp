// Telemetry lists: which layout and which names a controller gets, and malformed lists.
#include <gtest/gtest.h>

#include "fakes/fake_storage.h"
#include "storage/texts.h"
#include "storage/vendor_counters.h"

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;

constexpr std::size_t kBlock = 4096, kSummary = 32;

// Word n of bus b's block holds 10000 * b + n + 1; word n of its summary -(100 * b + n + 1).
Bytes telemetryList(std::uint32_t buses) {
  Bytes bytes;
  for (std::uint32_t bus = 0; bus < buses; ++bus) {
    for (std::uint32_t word = 0; word < kBlock / 4; ++word) {
      appendValue(bytes, 10000 * bus + word + 1);
    }
  }
  for (std::int32_t bus = 0; bus < static_cast<std::int32_t>(buses); ++bus) {
    for (std::int32_t word = 0; word < 8; ++word) appendValue(bytes, -(100 * bus + word + 1));
  }
  return bytes;
}

KvRef<KvDictionary> characteristics(std::string_view chip, std::string_view manufacturer,
                                    std::int32_t buses) {
  return KvDictionary::create({{"chip-id", KvString::create(chip)},
                               {"manufacturer-id", KvString::create(manufacturer)},
                               {"num-bus", KvNumber::int32(buses)}});
}

class TelemetryListTest : public testing::Test {
 protected:
  // What goes to standard error, and "false" after a failure.
  std::string parse(const Bytes& list, const KvObject* known) {
    return tests::errorsOf(
        [&] { return parseTelemetryList(list.data(), list.size(), known)->value(); });
  }
  // The values of a record.
  std::string figures(std::size_t record, std::initializer_list<std::string_view> names) {
    std::string all;
    for (const auto name : names) all += kvText(records[record].second->get(name)) + " ";
    return all;
  }
  fakes::FakeStorage storage;
  std::vector<std::pair<std::uint32_t, KvRef<KvDictionary>>>& records =
      storage.platform.crashReporting->records;
};

// The layouts differ in the words that are out of step with their neighbours.
TEST_F(TelemetryListTest, EveryControllerHasItsLayoutAndItsNames) {
  const struct {
    const char *chip, *manufacturer;
    std::size_t entries;  // 7 of the summary and those of the arrays
    const char* figures;
  } cases[] = {
      {"Q5M", "4582000000", 7 + 120 + 8, "266 275 304 373 278 393 300 533 338 0 358 385 0 (null) "},
      {"Q5M", "4582603A57FF", 7 + 120 + 8, "266 0 302 0 278 0 298 0 0 0 0 0 0 (null) "},
      {"q7m", "ad82522321ff", 7 + 120 + 8, "264 0 298 0 276 0 294 0 0 0 0 0 0 (null) "},
      {"Q7M", "AD82522321FF", 7 + 120, "9 17 38 92 20 120 36 116 65 0 87 104 (null) (null) "},
      {"Q9M", "", 7 + 120 + 10 + 26 + 12 + 8, "0 17 28 80 20 108 0 104 0 0 75 92 0 76 "},
  };
  for (const auto& c : cases) {
    records.clear();
    const auto known = characteristics(c.chip, c.manufacturer, 1);
    EXPECT_EQ(parse(telemetryList(1), known.get()), "");
    ASSERT_EQ(records.size(), 1u);
    EXPECT_EQ(records[0].first, 176u);
    EXPECT_EQ(records[0].second->size(), c.entries) << c.chip << c.manufacturer;
    EXPECT_EQ(figures(0, {"readStage[8]", "readStage[16]", "readStage[19]", "readStage[22]",
                          "initialReadStage[8]", "initialReadStage[12]", "nandStageOfLife[7]",
                          "dspExceptionParameter[11]", "readStage9NumOfErrorsBin[7]",
                          "readStage9NumOfErrorsBin[8]", "readStage17NumOfErrorsBin[9]",
                          "readStage19NumOfErrorsBin[11]", "algoNANDAccessesBin[7]",
                          "retentionIndication[2]"}),
              c.figures)
        << c.chip << c.manufacturer;
  }
  EXPECT_EQ(figures(0, {"readStage[29]", "readStage[32]", "initialReadStage[13]",
                        "dspExceptionParameter[20]", "dspExceptionParameter[37]"}),
            "9 111 123 127 27 ");
}

TEST_F(TelemetryListTest, EveryBusIsARecordOfItsOwn) {
  EXPECT_EQ(parse(telemetryList(3), characteristics("Q7M", "AD82", 3).get()), "");
  ASSERT_EQ(records.size(), 3u);
  EXPECT_EQ(figures(2, {"RD", "PE", "Max_PE_rate", "t0", "Ret", "block_type", "num_pages",
                        "readStage[0]", "initialReadStage[22]"}),
            "-201 -202 -203 -204 -205 -206 -207 20001 0 ");
}

// Nothing is logged before everything was checked.
TEST_F(TelemetryListTest, WhatIsRefused) {
  const std::string refusedLength = "ERROR: Attempting to parse beyond the bounds of the buffer\n";
  const auto with = [](std::string_view key, KvRef<KvObject> value) {
    auto known = characteristics("Q7M", "AD82", 2);
    known->set(key, std::move(value));
    return known;
  };
  const auto buses = [&](KvRef<KvObject> count) { return with("num-bus", count); };
  const std::string noCount = "ERROR: could not determine the number of channels\n";
  const struct {
    KvRef<KvObject> known;
    std::size_t missing;  // bytes at the end of a list of two buses
    std::string line;
  } cases[] = {
      {nullptr, 0, "ERROR: Could not parse the Device Characteristics dictionary\n"},
      {with("chip-id", nullptr), 0, "ERROR: Could not determine the chip-id\n"},
      {with("chip-id", KvNumber::int32(7)), 0,
       "ERROR: chip-id is not stored as a KvStringTypeID\n"},
      {with("chip-id", KvString::create(std::string(64, 'Q'))), 0,
       "ERROR: Unable to obtain chip-id as conversion from the UniChar contents of KvString "
       "failed, or the buffer of 64 bytes is too small\n"},
      {with("manufacturer-id", nullptr), 0, "ERROR: Could not determine the manufacturer-id\n"},
      {buses(nullptr), 0, noCount},
      {buses(KvString::create("2")), 0, noCount},
      {buses(KvNumber::int32(2)), 1, refusedLength},
      {buses(KvNumber::int32(-1)), 0, refusedLength},
      {buses(KvNumber::int32(1040448)), 0, refusedLength},  // * 4128 is 32768 in 32 bits
      {buses(KvNumber::int32(1)), 2 * (kBlock + kSummary), refusedLength},
  };
  for (const auto& c : cases) {
    Bytes list = telemetryList(2);
    list.resize(list.size() - c.missing);
    EXPECT_EQ(parse(list, c.known.get()), c.line + "false");
    EXPECT_TRUE(records.empty()) << c.line;
  }
  EXPECT_EQ(parse({}, buses(KvNumber::int64(0)).get()), "");
  EXPECT_TRUE(records.empty());
}

TEST(VendorCounters, HexTexts) {
  const struct {
    const char* text;
    std::size_t length;
    std::uint32_t number;
    const char* noted;
  } cases[] = {
      {"AD82", 2, 0xAD, ""},     {"", 8, 0, ""},
      {"12", 0, 0, ""},          {"1x2", 3, 0x1002, "unrecognized hex character: x"},
      {"ff", SIZE_MAX, 255, ""},
  };
  for (const auto& c : cases) {
    testing::internal::CaptureStdout();
    EXPECT_EQ(hexStringToInt32(c.text, c.length), c.number) << c.text;
    EXPECT_EQ(testing::internal::GetCapturedStdout(), c.noted);
  }
  EXPECT_EQ(hexStringToByte("f10", 3), 0xF1);
}

}  // namespace
}  // namespace tally
