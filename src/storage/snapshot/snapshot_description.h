// The description block of described snapshots: the place of each field, and its label.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "storage/snapshot/label_format.h"

namespace tally {

enum class SnapshotFieldKind : std::uint8_t { Plain, Thousandths, Priorities };

// A field that prints something.
struct SnapshotField {
  SnapshotFieldKind kind = SnapshotFieldKind::Plain;
  std::uint32_t offset = 0;   // in the record
  std::uint32_t triples = 0;  // of Priorities
  LabelFormat label;
};

// A block that is supported as a whole. It borrows the block, and is on the stack, so the number of
// fields is bounded.
class SnapshotDescription {
 public:
  static constexpr std::size_t kMostFields = 256;

  // Why the block is rejected; empty when it is accepted. The object is then ready.
  std::string_view parse(std::span<const std::byte> block);

  std::uint32_t recordBytes() const noexcept { return recordBytes_; }
  // As the block says; the last one that it counts is never printed.
  std::uint32_t recordCount() const noexcept { return recordCount_; }
  // The number of whole records in so many bytes that may be printed.
  std::uint32_t printableRecords(std::size_t bytes) const noexcept;
  // A record with 0 there is empty.
  std::uint32_t emptyMarkOffset() const noexcept { return emptyMarkOffset_; }
  std::span<const SnapshotField> fields() const noexcept { return {fields_.data(), fieldCount_}; }
  // False: the header is the key of all columns.
  bool hasTitle() const noexcept { return hasTitle_; }
  std::string_view title() const noexcept { return title_; }

 private:
  std::string_view parseFields(std::span<const std::byte> block, std::uint32_t tableOffset);
  std::string_view parseField(std::span<const std::byte> descriptor, bool first);

  std::uint32_t recordBytes_ = 0, recordCount_ = 0, emptyMarkOffset_ = 0;
  bool hasTitle_ = false;
  std::string_view title_;
  std::array<SnapshotField, kMostFields> fields_;
  std::size_t fieldCount_ = 0;
};

}  // namespace tally
