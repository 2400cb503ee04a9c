// Snapshots whose fields a description block names.
#include "storage/snapshot.h"

#include <array>
#include <cstring>

#include "base/byte_reader.h"
#include "storage/snapshot/snapshot_description.h"
#include "storage/snapshot/snapshot_text.h"

namespace tally {
namespace {

constexpr std::string_view kTitleBefore = "- SPX Snapshot - \n";
constexpr std::uint32_t kPerMillisecond = 1000;

// The text within its capacity. Lines are written after what is committed, and are committed once
// they are whole. A piece that reaches the capacity leaves no space for the zero byte: it does not
// fit.
class LineText {
 public:
  LineText(char* text, std::uint32_t capacity) : text_(text), capacity_(capacity) {}

  bool append(std::string_view piece) {
    if (piece.size() >= capacity_ - length_) return false;
    std::memcpy(text_ + length_, piece.data(), piece.size());
    length_ += piece.size();
    return true;
  }
  // Lets write(to) put at most so many bytes at `to` and return their end.
  template <std::size_t Most, class Write>
  bool appendPiece(const Write& write) {
    if (capacity_ - length_ > Most) {
      char* const to = text_ + length_;
      length_ += static_cast<std::size_t>(write(to) - to);
      return true;
    }
    std::array<char, Most> piece;
    const char* const end = write(piece.data());
    return append({piece.data(), static_cast<std::size_t>(end - piece.data())});
  }
  void commit() { committed_ = length_; }
  // Cuts the text back to what is committed and returns the bytes used.
  std::uint32_t finish() {
    text_[committed_] = '\0';
    return static_cast<std::uint32_t>(committed_ + 1);
  }

 private:
  char* text_;
  std::size_t capacity_, length_ = 0, committed_ = 0;
};

bool appendHeader(LineText& text, const SnapshotDescription& description) {
  if (!description.hasTitle()) return text.append(kSnapshotKey);
  return text.append(kTitleBefore) && text.append(description.title()) && text.append("\n");
}

std::uint32_t valueAt(const ByteReader& record, std::size_t offset) {
  return record.read<std::uint32_t>(offset).value_or(0);
}

bool appendPriorities(LineText& text, const ByteReader& record, const SnapshotField& field) {
  std::size_t figureOffset = field.offset;
  for (const PriorityFigure& figure : kPriorityFigures) {
    const bool labelled = text.appendPiece<LabelFormat::kLongestText>(
        [&](char* to) { return field.label.appendLetter(to, figure.letter); });
    if (!labelled) return false;
    for (std::uint32_t i = 0; i < field.triples; ++i) {
      const std::uint32_t value = valueAt(record, figureOffset + i * kPriorityBytes);
      const bool fitted = text.appendPiece<kLongestNumber + 1>([&](char* to) {
        if (i > 0) *to++ = '/';
        return appendColumn(to, value, figure.width);
      });
      if (!fitted) return false;
    }
    figureOffset += kValueBytes;
  }
  return true;
}

bool appendRecord(LineText& text, const ByteReader& record,
                  const SnapshotDescription& description) {
  for (const SnapshotField& field : description.fields()) {
    if (field.kind == SnapshotFieldKind::Priorities) {
      if (!appendPriorities(text, record, field)) return false;
      continue;
    }
    std::uint32_t value = valueAt(record, field.offset);
    if (field.kind == SnapshotFieldKind::Thousandths) value /= kPerMillisecond;
    const bool fitted = text.appendPiece<LabelFormat::kLongestText>(
        [&](char* to) { return field.label.appendNumber(to, value); });
    if (!fitted) return false;
  }
  return text.append("\n");
}

// True when all records from the cursor on are in the text.
bool appendRecords(LineText& text, std::span<const std::byte> records,
                   const SnapshotDescription& description, std::uint32_t& cursor) {
  if (cursor == 0 && !appendHeader(text, description)) return false;
  const std::uint32_t limit = description.printableRecords(records.size());
  while (cursor < limit) {
    const std::size_t stride = description.recordBytes();
    const ByteReader record(records.subspan(cursor * stride, stride));
    ++cursor;
    if (valueAt(record, description.emptyMarkOffset()) == 0) continue;
    if (!appendRecord(text, record, description)) return false;
    text.commit();
  }
  return true;
}

}  // namespace

int SPXParseSnapshotBufferWithInplaceParser(const void* records, std::uint32_t recordsLength,
                                            char* text, std::uint32_t* textSize,
                                            std::span<const std::byte> description,
                                            std::uint32_t* recordCursor) {
  if (description.data() == nullptr || text == nullptr || *textSize == 0) return 0;
  if (records == nullptr) recordsLength = 0;
  LineText out(text, *textSize);
  SnapshotDescription parsed;
  const bool whole = parsed.parse(description).empty() &&
                     appendRecords(out, {static_cast<const std::byte*>(records), recordsLength},
                                   parsed, *recordCursor);
  *textSize = out.finish();
  return whole ? 1 : 0;
}

}  // namespace tally
