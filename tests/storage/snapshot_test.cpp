// Snapshots as text, against lines made with snprintf, at every capacity, and from malformed
// blocks.
#include "storage/snapshot.h"

#include <gtest/gtest.h>

#include <cstdarg>
#include <cstdio>
#include <limits>
#include <random>
#include <string>

#include "fakes/statistics_buffer.h"
#include "storage/snapshot/label_format.h"
#include "storage/snapshot/snapshot_text.h"

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;

constexpr char kUntouched = '#';
constexpr std::uint32_t kLargest = std::numeric_limits<std::uint32_t>::max();

[[gnu::format(printf, 1, 2)]] std::string printed(const char* format, ...) {
  char text[512];
  std::va_list arguments;
  va_start(arguments, format);
  const int length = std::vsnprintf(text, sizeof text, format, arguments);
  va_end(arguments);
  EXPECT_LT(length, static_cast<int>(sizeof text));
  return text;
}

using FixedRecord = std::array<std::uint32_t, kSPXSnapshotRecordBytes / 4>;

std::string fixedLine(const FixedRecord& r) {
  std::string line = printed(
      "T=%04u E=%02u HR=%4u HW=%4u NR=%4u NW=%4u TH=%8u.%02u GC=%4u W=%2u BI=%3u BU=%3u V=%5u "
      "BF=%2u/%2u P=%2u H=%2u/%2u X=%2u/%2u L=%3u/%3u C=%2u/%2u S=%4u U=%8u RO=%4u",
      r[0], r[26], r[27], r[28], r[29], r[30], r[39] / 1000, r[39] % 1000 / 10, r[31], r[33], r[36],
      r[37], r[45], r[47], r[48], r[1], r[41], r[40], r[50], r[51], r[43], r[44], r[53], r[54],
      r[42], r[52], r[14]);
  line += printed("/%4u/%4u/%4u RL=%7u/%7u/%7u/%7u RM=%5u/%5u/%5u/%5u", r[17], r[20], r[23], r[15],
                  r[18], r[21], r[24], r[16], r[19], r[22], r[25]);
  line += printed(" WO=%4u/%4u/%4u/%4u WL=%7u/%7u/%7u/%7u WM=%5u/%5u/%5u/%5u\n", r[2], r[5], r[8],
                  r[11], r[3], r[6], r[9], r[12], r[4], r[7], r[10], r[13]);
  return line;
}

template <class Words>
Bytes bytesOf(const std::vector<Words>& records) {
  Bytes bytes;
  for (const auto& record : records) {
    for (const std::uint32_t word : record) appendValue(bytes, word);
  }
  return bytes;
}

struct Rendered {
  std::uint32_t size;
  std::string text;  // the whole buffer, of the capacity
  int result = -1;
};

// Of fixed records, or of those that a block describes.
Rendered render(const Bytes& records, std::uint32_t capacity, const Bytes* block = nullptr,
                std::uint32_t* cursor = nullptr) {
  Rendered r{capacity, {}};
  std::vector<char> exact(capacity, kUntouched);  // its bounds are watched
  const auto length = static_cast<std::uint32_t>(records.size());
  r.result = block == nullptr
                 ? SPXParseSnapshotBuffer(records.data(), length, exact.data(), &r.size)
                 : SPXParseSnapshotBufferWithInplaceParser(records.data(), length, exact.data(),
                                                           &r.size, *block, cursor);
  r.text.assign(exact.begin(), exact.end());
  return r;
}

// Values of every length, each word another one, so that a column from a wrong place shows.
std::vector<FixedRecord> fixedRecords(std::size_t count) {
  std::vector<FixedRecord> records(count);
  std::mt19937 random(7);
  for (auto& record : records) {
    for (auto& word : record) word = static_cast<std::uint32_t>(random()) >> (random() % 32);
  }
  return records;
}

TEST(Snapshot, OnlyWholeFixedRecordsArePrinted) {
  auto records = fixedRecords(3);
  records[1].fill(kLargest);
  const Bytes bytes = bytesOf(records);
  for (const std::ptrdiff_t length : {0, 251, 252, 503, 504, 756}) {
    std::string expected(kSnapshotKey);
    for (int i = 0; i < length / 252; ++i) expected += fixedLine(records.at(i));
    const auto r = render(Bytes(bytes.begin(), bytes.begin() + length), 8192);
    EXPECT_EQ(r.result, 1) << length;
    EXPECT_EQ(r.text.substr(0, r.size), expected + "\n") << length;
  }
  FixedRecord hysteresis{};
  hysteresis[39] = 123456;
  EXPECT_NE(render(bytesOf(std::vector{hysteresis}), 8192).text.find(" TH=     123.45 GC="),
            std::string::npos);
}

TEST(LabelFormat, PrintsNumbersAsPrintfDoes) {
  const std::uint32_t values[] = {0, 7, 8, 255, 256, 40000, 0x80000000, kLargest};
  const char* formats[] = {"",       "T=",   " A=%u",  "%d",       "%i!",    "%5u|",
                           "%-5u|",  "%05d", "% d",    "%+05d",    "%.3u",   "%-8.3d|",
                           "%08.3d", "%x",   "%#X",    "%#010x",   "%#.0o",  "%.u",
                           "%hd",    "%hhu", "%hhx",   "100%% %u", "%99u",   "%.99d",
                           "%#06o",  "%+u",  "%#-6x|", "%00005u",  "%-05d|", "%%%%%u%%"};
  for (const char* format : formats) {
    const auto label = LabelFormat::parse(format, LabelArgument::Number);
    ASSERT_TRUE(label) << format;
    for (const std::uint32_t value : values) {
      char expected[256], text[LabelFormat::kLongestText];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
#pragma GCC diagnostic ignored "-Wformat-security"
      std::snprintf(expected, sizeof expected, format, value);
#pragma GCC diagnostic pop
      EXPECT_EQ(std::string(text, label->appendNumber(text, value)), expected) << format;
    }
  }
  for (const auto& [format, expected] : std::vector<std::pair<const char*, const char*>>{
           {" R%c=", " RO="}, {" R%s=", " RO="}, {"%3c|", "  O|"}, {"%-3s|", "O  |"}, {"x", "x"}}) {
    char text[LabelFormat::kLongestText];
    const auto label = LabelFormat::parse(format, LabelArgument::Letter);
    ASSERT_TRUE(label) << format;
    EXPECT_EQ(std::string(text, label->appendLetter(text, 'O')), expected);
  }
  // A field has 32 bits, whatever the driver's printf took for a long.
  for (const char* format : {"%ld", "%lli", "%zd", "%jd", "%td"}) {
    char text[LabelFormat::kLongestText];
    const auto label = LabelFormat::parse(format, LabelArgument::Number);
    ASSERT_TRUE(label) << format;
    EXPECT_EQ(std::string(text, label->appendNumber(text, kLargest)), "-1");
  }
}

TEST(LabelFormat, RejectsAllButASingleConversion) {
  const char* refused[] = {
      "%n",    "%s",     "%hn",          "%p", "%c",  "%f",  "%a",   "%u%n", "%u %u", "%d%s",
      "%",     "x%",     "%5",           "%-", "%.",  "%l",  "%hhh", "%*u",  "%.*u",  "%1$u",
      "%100u", "%.100u", "%4294967301u", "%L", "%'u", "%u%", "%m",   "%%%",  "%lc",   "%q"};
  for (const char* format : refused) {
    EXPECT_FALSE(LabelFormat::parse(format, LabelArgument::Number)) << format;
  }
  for (const char* format : {"%n", "%u", "%d", "%s%s", "%c%n", "%ls", "%*c", "%p", "%100c"}) {
    EXPECT_FALSE(LabelFormat::parse(format, LabelArgument::Letter)) << format;
  }
}

struct Descriptor {
  std::uint16_t kind;
  std::uint32_t offset, size;
  std::string label;
};

constexpr std::uint32_t kTableOffset = 64;

void appendText(Bytes& bytes, const std::string& text, std::size_t end) {
  for (const char letter : text) appendValue(bytes, letter);
  bytes.resize(end);
}

struct Block {
  std::uint32_t version = 6, stride = 40, count = 6, table = kTableOffset;
  std::string title = "storage processor 3";
  std::vector<Descriptor> fields{{0, 0, 4, "T=%04u"},     {1, 4, 4, " E=%2u"}, {2, 8, 4, " TH=%u"},
                                 {3, 12, 24, " R%s="},    {0, 36, 4, ""},      {9, 4000, 9, "%n%n"},
                                 {0, 36, 4, " no number"}};

  Bytes bytes() const {
    Bytes all;
    for (const std::uint32_t word : {0u, version, stride, count, 0u, 0u, table, 0u}) {
      appendValue(all, word);
    }
    appendText(all, title, kTableOffset);
    appendValue(all, static_cast<std::uint32_t>(fields.size()));
    appendValue(all, 0u);
    for (const Descriptor& field : fields) {
      appendValue(all, field.kind);
      appendValue(all, std::uint16_t{0});
      appendValue(all, field.offset);
      appendValue(all, field.size);
      appendText(all, field.label, all.size() + 16);
    }
    return all;
  }
};

// Ten words a record; the third record is empty. The block counts one record more.
std::vector<std::array<std::uint32_t, 10>> describedRecords() {
  std::vector<std::array<std::uint32_t, 10>> records(5);
  for (std::size_t i = 0; i < records.size(); ++i) {
    for (std::size_t word = 0; word < 10; ++word) {
      records[i][word] = static_cast<std::uint32_t>((i + 1) * 1000 + word * 37);
    }
  }
  records[2][0] = 0;
  records[3].fill(kLargest);
  return records;
}

Bytes describedBytes() { return bytesOf(describedRecords()); }

std::string describedLine(const std::array<std::uint32_t, 10>& r) {
  if (r[0] == 0) return "";
  return printed("T=%04u E=%2u TH=%u RO=%4u/%4u RL=%7u/%7u RM=%5u/%5u no number\n", r[0], r[1],
                 r[2] / 1000, r[3], r[6], r[4], r[7], r[5], r[8]);
}

Rendered renderDescribed(const Block& block, std::uint32_t capacity, std::uint32_t& cursor,
                         const Bytes& records = describedBytes()) {
  const Bytes description = block.bytes();
  return render(records, capacity, &description, &cursor);
}

// From every cursor and at every capacity: whole lines only, and the cursor after the line that
// did not fit.
TEST(Snapshot, DescribedLinesAtEveryCapacity) {
  const auto records = describedRecords();
  const Bytes bytes = describedBytes();
  for (const std::uint32_t version : {5u, 6u}) {
    Block block;
    block.version = version;
    const Bytes description = block.bytes();
    const std::string header =
        version < 6 ? std::string(kSnapshotKey) : "- SPX Snapshot - \n" + block.title + "\n";
    std::size_t longest = header.size() + 1;
    for (const auto& record : records) longest += describedLine(record).size();
    for (std::uint32_t start = 0; start <= 7; ++start) {
      for (std::uint32_t capacity = 0; capacity <= longest + 1; ++capacity) {
        std::uint32_t cursor = start, expectedCursor = start;
        std::string committed, line = start == 0 ? header : "";
        bool fits = capacity > 0 && line.size() < capacity;
        while (fits && expectedCursor < records.size()) {
          const std::string added = describedLine(records[expectedCursor++]);
          if (added.empty()) continue;
          line += added;
          fits = line.size() < capacity;
          if (fits) committed = line;
        }
        const auto r = render(bytes, capacity, &description, &cursor);
        ASSERT_EQ(r.result, fits ? 1 : 0) << start << " " << capacity;
        ASSERT_EQ(cursor, expectedCursor) << start << " " << capacity;
        ASSERT_EQ(r.size, capacity == 0 ? 0 : committed.size() + 1);
        if (capacity > 0) {
          ASSERT_EQ(r.text.substr(0, r.size), committed + '\0');
        }
      }
    }
  }
}

TEST(Snapshot, WrongCountsAndLengthsEndWithTheRecords) {
  const std::tuple<std::uint32_t, std::size_t, std::uint32_t> cases[] = {
      {0, 200, 0},       {1, 200, 0},        {2, 200, 1},       {5, 200, 4}, {6, 199, 4},
      {kLargest, 81, 2}, {kLargest, 200, 5}, {kLargest, 39, 0}, {6, 0, 0}};
  for (const auto& [count, length, records] : cases) {
    Block block;
    block.count = count;
    Bytes bytes = describedBytes();
    bytes.resize(length);
    bytes.shrink_to_fit();
    std::uint32_t cursor = 0;
    EXPECT_EQ(renderDescribed(block, 4096, cursor, bytes).result, 1);
    EXPECT_EQ(cursor, records) << count << " " << length;
  }
}

TEST(Snapshot, DescriptionsThatCannotBeHonouredAreRefusedWhole) {
  const struct {
    const char* what;
    void (*change)(Block&);
  } cases[] = {{"no record bytes", [](Block& b) { b.stride = 0; }},
               {"record shorter than a field", [](Block& b) { b.stride = 39; }},
               {"table outside", [](Block& b) { b.table = 100'000; }},
               {"table wraps around", [](Block& b) { b.table = kLargest - 3; }},
               {"table over the title", [](Block& b) { b.table = 32; }},
               {"too many fields", [](Block& b) { b.fields.resize(257, b.fields[0]); }},
               {"first field outside", [](Block& b) { b.fields[0].offset = 37; }},
               {"size wraps around", [](Block& b) { b.fields[3].size = kLargest; }},
               {"%n", [](Block& b) { b.fields[1].label = "%n"; }},
               {"%s for a number", [](Block& b) { b.fields[2].label = "x%s"; }},
               {"a number for a letter", [](Block& b) { b.fields[3].label = "R%u="; }},
               {"label without an end", [](Block& b) { b.fields[1].label = "0123456789abcde%"; }},
               {"title without an end", [](Block& b) {
                  b.title.assign(32, 'x');
                  b.fields.assign(193, {0x7878, 0x78787878, 0x78787878, "xxxxxxxxxxxxxxxx"});
                }}};
  for (const auto& c : cases) {
    Block block;
    c.change(block);
    std::uint32_t cursor = 0;
    testing::internal::CaptureStderr();
    const auto r = renderDescribed(block, 4096, cursor);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "") << c.what;
    EXPECT_EQ(std::tuple(r.result, cursor, r.size, r.text[0]), std::tuple(0, 0u, 1u, '\0'))
        << c.what;
  }
  std::uint32_t cursor = 3;  // and one that is null
  const Bytes null;
  const auto none = render(describedBytes(), 100, &null, &cursor);
  EXPECT_EQ(std::tuple(none.result, cursor, none.size), std::tuple(0, 3u, 100u));
  EXPECT_EQ(none.text, std::string(100, kUntouched));
}

// A label of all 16 bytes needs no zero byte, and does not run into the next descriptor.
TEST(Snapshot, LabelsEndWithTheirField) {
  Block block;
  block.fields = {{0, 0, 4, "0123456789abcd%u"}, {1, 4, 4, "|%u"}};
  std::uint32_t cursor = 0;
  const auto r = renderDescribed(block, 4096, cursor);
  EXPECT_NE(r.text.find("0123456789abcd1000|1037\n"), std::string::npos);
}

}  // namespace
}  // namespace tally
