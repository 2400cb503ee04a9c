// Snapshots of the fixed layout. The columns are a table; a line is written straight into the text
// while the longest one fits, and otherwise into a buffer of its own.
#include "storage/snapshot.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <iterator>
#include <string_view>

#include "base/byte_reader.h"
#include "storage/snapshot/snapshot_text.h"

namespace tally {
namespace {

enum class Figure : std::uint8_t { Plain, Milliseconds, Centiseconds };  // of microseconds

struct Column {
  std::string_view label;
  std::uint8_t offset;
  std::uint8_t width;
  char fill = ' ';
  Figure figure = Figure::Plain;
};

constexpr std::uint8_t kWrites = 8, kReads = 56;
constexpr std::size_t kPriorities = 4;

constexpr Column kInterval[] = {
    {"T=", 0, 4, '0'},
    {" E=", 104, 2, '0'},
    {" HR=", 108, 4},
    {" HW=", 112, 4},
    {" NR=", 116, 4},
    {" NW=", 120, 4},
    {" TH=", 156, 8, ' ', Figure::Milliseconds},
    {".", 156, 2, '0', Figure::Centiseconds},
    {" GC=", 124, 4},
    {" W=", 132, 2},
    {" BI=", 144, 3},
    {" BU=", 148, 3},
    {" V=", 180, 5},
    {" BF=", 188, 2},
    {"/", 192, 2},
    {" P=", 4, 2},
    {" H=", 164, 2},
    {"/", 160, 2},
    {" X=", 200, 2},
    {"/", 204, 2},
    {" L=", 172, 3},
    {"/", 176, 3},
    {" C=", 212, 2},
    {"/", 216, 2},
    {" S=", 168, 4},
    {" U=", 208, 8},
};
struct Group {
  std::string_view label;
  std::uint8_t offset;
  std::uint8_t width;
};
constexpr Group kGroups[] = {
    {" RO=", kReads, 4},  {" RL=", kReads + 4, 7},  {" RM=", kReads + 8, 5},
    {" WO=", kWrites, 4}, {" WL=", kWrites + 4, 7}, {" WM=", kWrites + 8, 5},
};

constexpr std::size_t kColumns = std::size(kInterval) + std::size(kGroups) * kPriorities;

constexpr std::array<Column, kColumns> makeColumns() {
  std::array<Column, kColumns> columns{};
  std::size_t next = 0;
  for (const Column& column : kInterval) columns[next++] = column;
  for (const Group& group : kGroups) {
    for (std::size_t priority = 0; priority < kPriorities; ++priority) {
      columns[next++] = {priority == 0 ? group.label : "/",
                         static_cast<std::uint8_t>(group.offset + priority * kPriorityBytes),
                         group.width};
    }
  }
  return columns;
}
constexpr std::array<Column, kColumns> kLineColumns = makeColumns();

constexpr std::size_t longestLine() {
  std::size_t length = 1;
  for (const Column& column : kLineColumns) length += column.label.size() + kLongestNumber;
  return length;
}

std::uint32_t shownFigure(std::uint32_t value, Figure figure) {
  switch (figure) {
    case Figure::Milliseconds:
      return value / 1000;
    case Figure::Centiseconds:
      return value % 1000 / 10;
    case Figure::Plain:
      break;
  }
  return value;
}

// REQUIRES: a whole record, and space for the longest line.
char* appendLine(char* to, std::span<const std::byte> record) {
  const ByteReader reader(record);
  for (const Column& column : kLineColumns) {
    to += column.label.copy(to, column.label.size());
    const std::uint32_t value = *reader.read<std::uint32_t>(column.offset);
    to = appendColumn(to, shownFigure(value, column.figure), column.width, column.fill);
  }
  *to++ = '\n';
  return to;
}

// The text within its capacity, which includes the zero byte at its end.
class BoundedText {
 public:
  BoundedText(char* text, std::uint32_t capacity) : text_(text), room_(capacity - 1u) {}
  std::size_t room() const { return room_ - length_; }
  std::size_t length() const { return length_; }
  char* end() { return text_ + length_; }
  void advance(std::size_t bytes) { length_ += bytes; }
  // False when the text was truncated.
  bool append(std::string_view piece) {
    const std::size_t taken = std::min(piece.size(), room());
    std::memcpy(end(), piece.data(), taken);
    length_ += taken;
    return taken == piece.size();
  }
  void terminate() { *end() = '\0'; }

 private:
  char* text_;
  std::size_t room_, length_ = 0;
};

bool appendLines(BoundedText& text, std::span<const std::byte> records) {
  constexpr std::size_t kLongestLine = longestLine();
  for (; records.size() >= kSPXSnapshotRecordBytes;
       records = records.subspan(kSPXSnapshotRecordBytes)) {
    const auto record = records.first(kSPXSnapshotRecordBytes);
    if (text.room() >= kLongestLine) {
      text.advance(static_cast<std::size_t>(appendLine(text.end(), record) - text.end()));
      continue;
    }
    std::array<char, kLongestLine> line;
    const char* const end = appendLine(line.data(), record);
    if (!text.append({line.data(), static_cast<std::size_t>(end - line.data())})) return false;
  }
  return true;
}

}  // namespace

int SPXParseSnapshotBuffer(const void* records, std::uint32_t recordsLength, char* text,
                           std::uint32_t* textSize) {
  if (text == nullptr || *textSize == 0) return 0;
  if (records == nullptr) recordsLength = 0;
  BoundedText out(text, *textSize);
  const bool whole = out.append(kSnapshotKey) &&
                     appendLines(out, {static_cast<const std::byte*>(records), recordsLength}) &&
                     out.append("\n");
  out.terminate();
  if (!whole) return 0;
  *textSize = static_cast<std::uint32_t>(out.length());
  return 1;
}

}  // namespace tally
