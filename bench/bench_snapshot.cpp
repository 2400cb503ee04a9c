// 100,000 snapshot records as text, beside the same lines made with snprintf; both texts must be
// equal. Described records are rendered too, from a block that gives the same columns.
#include <algorithm>
#include <array>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <functional>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "figures.h"
#include "storage/snapshot.h"
#include "storage/snapshot/snapshot_text.h"

namespace {

using namespace tally;
using Record = std::array<std::uint32_t, kSPXSnapshotRecordBytes / 4>;

constexpr std::size_t kRecords = 100'000;
constexpr int kRounds = 9;

// Figures as a device has them: most small, a few of full length.
std::vector<Record> makeRecords() {
  std::vector<Record> records(kRecords);
  std::mt19937 random(3);
  for (std::size_t i = 0; i < kRecords; ++i) {
    for (auto& word : records[i]) {
      word = static_cast<std::uint32_t>(random()) >> (12 + random() % 20);
    }
    records[i][0] = static_cast<std::uint32_t>(1'700'000'000 + i * 10);
  }
  return records;
}

// The yardstick: each line piece by piece, as the columns change from one group to the next.
std::string renderWithLibrary(const std::vector<Record>& records, std::size_t capacity) {
  std::string text(capacity, '\0');
  std::size_t used = kSnapshotKey.copy(text.data(), text.size());
  const auto add = [&](const char* format, auto... values) {
    const int length = std::snprintf(text.data() + used, text.size() - used, format, values...);
    used += static_cast<std::size_t>(length);
  };
  for (const Record& r : records) {
    add("T=%04u E=%02u HR=%4u HW=%4u NR=%4u NW=%4u TH=%8u.%02u GC=%4u W=%2u BI=%3u BU=%3u V=%5u "
        "BF=%2u/%2u P=%2u H=%2u/%2u X=%2u/%2u L=%3u/%3u C=%2u/%2u S=%4u U=%8u RO=%4u",
        r[0], r[26], r[27], r[28], r[29], r[30], r[39] / 1000, r[39] % 1000 / 10, r[31], r[33],
        r[36], r[37], r[45], r[47], r[48], r[1], r[41], r[40], r[50], r[51], r[43], r[44], r[53],
        r[54], r[42], r[52], r[14]);
    add("/%4u/%4u/%4u", r[17], r[20], r[23]);
    add(" RL=%7u/%7u/%7u/%7u", r[15], r[18], r[21], r[24]);
    add(" RM=%5u/%5u/%5u/%5u", r[16], r[19], r[22], r[25]);
    add(" WO=%4u/%4u/%4u/%4u", r[2], r[5], r[8], r[11]);
    add(" WL=%7u/%7u/%7u/%7u", r[3], r[6], r[9], r[12]);
    add(" WM=%5u/%5u/%5u/%5u\n", r[4], r[7], r[10], r[13]);
  }
  add("%s", "\n");
  text.resize(used);
  return text;
}

void appendWord(std::vector<std::byte>& bytes, std::uint32_t word) {
  const auto* from = reinterpret_cast<const std::byte*>(&word);
  bytes.insert(bytes.end(), from, from + sizeof word);
}

std::vector<std::byte> makeDescription() {
  struct Field {
    std::uint32_t kind, offset, size;
    const char* label;
  };
  static constexpr Field kFields[] = {
      {0, 0, 4, "T=%04u"},    {0, 104, 4, " E=%02u"}, {0, 108, 4, " HR=%4u"},
      {0, 112, 4, " HW=%4u"}, {0, 116, 4, " NR=%4u"}, {0, 120, 4, " NW=%4u"},
      {2, 156, 4, " TH=%8u"}, {0, 124, 4, " GC=%4u"}, {0, 132, 4, " W=%2u"},
      {0, 144, 4, " BI=%3u"}, {0, 148, 4, " BU=%3u"}, {0, 180, 4, " V=%5u"},
      {0, 188, 4, " BF=%2u"}, {0, 192, 4, "/%2u"},    {0, 4, 4, " P=%2u"},
      {0, 164, 4, " H=%2u"},  {0, 160, 4, "/%2u"},    {0, 200, 4, " X=%2u"},
      {0, 204, 4, "/%2u"},    {0, 172, 4, " L=%3u"},  {0, 176, 4, "/%3u"},
      {0, 212, 4, " C=%2u"},  {0, 216, 4, "/%2u"},    {0, 168, 4, " S=%4u"},
      {0, 208, 4, " U=%8u"},  {3, 56, 48, " R%s="},   {3, 8, 48, " W%s="},
  };
  constexpr std::uint32_t kTable = 40;
  std::vector<std::byte> bytes;
  for (const std::uint32_t word : {0u, 6u, kSPXSnapshotRecordBytes,
                                   static_cast<std::uint32_t>(kRecords + 1), 0u, 0u, kTable, 0u}) {
    appendWord(bytes, word);
  }
  bytes.resize(kTable);
  appendWord(bytes, static_cast<std::uint32_t>(std::size(kFields)));
  appendWord(bytes, 0);
  for (const Field& field : kFields) {
    appendWord(bytes, field.kind);
    appendWord(bytes, field.offset);
    appendWord(bytes, field.size);
    std::array<char, 16> label{};
    std::string_view(field.label).copy(label.data(), label.size());
    const auto* from = reinterpret_cast<const std::byte*>(label.data());
    bytes.insert(bytes.end(), from, from + label.size());
  }
  return bytes;
}

double medianSeconds(const std::function<void()>& work) {
  std::vector<double> seconds;
  for (int round = 0; round < kRounds; ++round) {
    const auto start = std::chrono::steady_clock::now();
    work();
    seconds.push_back(
        std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
  }
  std::nth_element(seconds.begin(), seconds.begin() + kRounds / 2, seconds.end());
  return seconds[kRounds / 2];
}

}  // namespace

int main() {
  const auto records = makeRecords();
  const auto length = static_cast<std::uint32_t>(records.size() * sizeof(Record));
  const std::size_t capacity = kSnapshotKey.size() + kRecords * 600;
  std::string text(capacity, '\0'), described(capacity, '\0'), reference;
  std::uint32_t size = 0, describedSize = 0;

  const double library = medianSeconds([&] { reference = renderWithLibrary(records, capacity); });
  const double fixed = medianSeconds([&] {
    size = static_cast<std::uint32_t>(capacity);
    SPXParseSnapshotBuffer(records.data(), length, text.data(), &size);
  });
  const auto description = makeDescription();
  const double inPlace = medianSeconds([&] {
    std::uint32_t cursor = 0;
    describedSize = static_cast<std::uint32_t>(capacity);
    SPXParseSnapshotBufferWithInplaceParser(records.data(), length, described.data(),
                                            &describedSize, description, &cursor);
  });
  const bool equal = std::string_view(text.data(), size) == reference;

  std::printf("%zu records, %.1f MB of text\n", kRecords, static_cast<double>(size) / 1e6);
  std::printf("snprintf                 %7.1f ms\n", library * 1e3);
  std::printf("fixed layout             %7.1f ms  %.1f times faster, %s\n", fixed * 1e3,
              library / fixed, equal ? "equal" : "DIFFERENT");
  std::printf("described, same columns  %7.1f ms  %.1f times faster, %.1f MB\n", inPlace * 1e3,
              library / inPlace, describedSize / 1e6);
  bench::addFigure("100,000 snapshots as text", fixed * 1e3, "ms", "snprintf", library * 1e3,
                   bench::noTarget());
  bench::addFigure("100,000 described snapshots as text", inPlace * 1e3, "ms", "snprintf",
                   library * 1e3, bench::noTarget());
  return equal ? 0 : 1;
}
