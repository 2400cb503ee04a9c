#include "storage/snapshot/snapshot_description.h"

#include <algorithm>

#include "base/byte_reader.h"
#include "storage/snapshot/snapshot_text.h"

namespace tally {
namespace {

constexpr std::size_t kVersionOffset = 4;
constexpr std::size_t kStrideOffset = 8;
constexpr std::size_t kCountOffset = 12;
constexpr std::size_t kTableOffset = 24;
constexpr std::size_t kTitleOffset = 32;
constexpr std::uint32_t kFirstVersionWithTitle = 6;

constexpr std::size_t kTableHeaderBytes = 8;
constexpr std::size_t kDescriptorBytes = 28;
constexpr std::size_t kFieldOffset = 4;
constexpr std::size_t kFieldSize = 8;
constexpr std::size_t kLabel = 12;

constexpr std::uint16_t kThousandthsKind = 2;
constexpr std::uint16_t kPrioritiesKind = 3;

// The text up to its zero byte, or to the end of the bytes.
std::string_view textOf(std::span<const std::byte> bytes) {
  const auto end = std::find(bytes.begin(), bytes.end(), std::byte{0});
  return {reinterpret_cast<const char*>(bytes.data()),
          static_cast<std::size_t>(end - bytes.begin())};
}

}  // namespace

std::string_view SnapshotDescription::parse(std::span<const std::byte> block) {
  const ByteReader reader(block);
  if (!reader.has(0, kTitleOffset)) return "it is shorter than its fixed part";
  recordBytes_ = *reader.read<std::uint32_t>(kStrideOffset);
  recordCount_ = *reader.read<std::uint32_t>(kCountOffset);
  if (recordBytes_ == 0) return "its records have no bytes";
  hasTitle_ = *reader.read<std::uint32_t>(kVersionOffset) >= kFirstVersionWithTitle;
  if (hasTitle_) {
    title_ = textOf(block.subspan(kTitleOffset));
    if (kTitleOffset + title_.size() == block.size()) return "its title has no end";
  }
  return parseFields(block, *reader.read<std::uint32_t>(kTableOffset));
}

std::string_view SnapshotDescription::parseFields(std::span<const std::byte> block,
                                                  std::uint32_t tableOffset) {
  const ByteReader reader(block);
  const auto count = reader.read<std::uint32_t>(tableOffset);
  if (!count || !reader.has(tableOffset, kTableHeaderBytes)) return "its table lies outside";
  if (*count == 0) return "it describes no field";
  if (*count > kMostFields) return "it describes more than the 256 fields that are read";
  fieldCount_ = 0;
  for (std::size_t i = 0; i < *count; ++i) {
    const auto descriptor = reader.slice(
        std::size_t{tableOffset} + kTableHeaderBytes + i * kDescriptorBytes, kDescriptorBytes);
    if (!descriptor) return "its table ends early";
    if (const auto fault = parseField(*descriptor, i == 0); !fault.empty()) return fault;
  }
  return {};
}

std::string_view SnapshotDescription::parseField(std::span<const std::byte> descriptor,
                                                 bool first) {
  constexpr std::string_view kOutside = "a field lies outside the record";
  constexpr std::string_view kBadLabel = "a label format holds anything but one integer conversion";
  const ByteReader reader(descriptor);
  const auto kind = *reader.read<std::uint16_t>(0);
  const auto offset = *reader.read<std::uint32_t>(kFieldOffset);
  const auto size = *reader.read<std::uint32_t>(kFieldSize);
  const auto isInside = [&](std::uint64_t bytes) { return offset + bytes <= recordBytes_; };
  if (first) {
    if (!isInside(kValueBytes)) return kOutside;
    emptyMarkOffset_ = offset;
  }
  const std::string_view format = textOf(descriptor.subspan(kLabel));
  if (kind > kPrioritiesKind || (kind < kThousandthsKind && format.empty())) return {};

  SnapshotField& field = fields_[fieldCount_++];
  field = {};
  field.offset = offset;
  const bool isPriorities = kind == kPrioritiesKind;
  if (isPriorities) {
    field.kind = SnapshotFieldKind::Priorities;
    field.triples = size / kPriorityBytes;
  } else if (kind == kThousandthsKind) {
    field.kind = SnapshotFieldKind::Thousandths;
  }
  if (!isInside(isPriorities ? size : std::max<std::uint64_t>(size, kValueBytes))) return kOutside;
  const auto label =
      LabelFormat::parse(format, isPriorities ? LabelArgument::Letter : LabelArgument::Number);
  if (!label) return kBadLabel;
  field.label = *label;
  return {};
}

std::uint32_t SnapshotDescription::printableRecords(std::size_t bytes) const noexcept {
  const std::uint32_t counted = recordCount_ == 0 ? 0 : recordCount_ - 1;
  return static_cast<std::uint32_t>(std::min<std::size_t>(counted, bytes / recordBytes_));
}

}  // namespace tally
