// What the sources find on a device: files, and the channels whose values are in them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "host/kernel/channel_row.h"
#include "host/tree/system_tree.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

constexpr std::int64_t kNoReading = static_cast<std::int64_t>(element::kMissingValue);

// What identifies a file's values, where their place in the text is not fixed: the labels of its
// lines, and how many values each line has.
struct FileLayout {
  std::vector<std::string> labels;
  std::size_t columns = 1;
  std::size_t fields() const { return labels.size() * columns; }
  bool operator==(const FileLayout&) const = default;
};

// Fills the fields that the text has, label by label; those that it lacks or that are malformed
// keep kNoReading. Allocates nothing. The text is untrusted.
using FileParser = void (*)(std::string_view text, const FileLayout& layout,
                            std::span<std::int64_t> fields);

// No file but the wall clock, in seconds since 1970.
constexpr std::string_view kClockPath = "clock";

struct FoundFile {
  std::string path;
  KernelSource source;
  FileParser parse;
  FileLayout layout;
};

struct FoundField {
  std::uint32_t file, field;
};
// Where the value of a slot comes from.
struct FoundSlot {
  std::uint32_t file, field;
  std::uint16_t element = 0, slot = 0;
  // The value is the field's percentage of this one. Only of a simple channel.
  std::optional<FoundField> percentOf = std::nullopt;
};
// A value that is known beforehand: the id of a state.
struct FoundConstant {
  std::uint16_t element, slot;
  std::uint64_t value;
};

// A device of a source.
struct FoundDevice {
  std::string name;  // unique among them and the same after each boot; empty: there is just one
  std::string identity = {};  // of what lifetime counters belong to, such as a serial number
  // Among those of its class, by bus path; empty: it has no part in the sweep.
  std::optional<unsigned> ordinal = 0;
  // Its name in the store, which does not depend on what other devices there are; empty: the name.
  std::string lasting = {};
  std::string_view kind = {};  // one of a few words that say what it is, for the sweep
};

struct FoundChannel {
  const ChannelRow* row;
  FoundDevice device;
  std::uint16_t elements = 1;
  std::vector<FoundSlot> slots;
  std::vector<FoundConstant> constants;
  std::string item = {};  // which of several of its row the device has: "temp1"
};

class Findings {
 public:
  // Returns the file's number for slots.
  std::uint32_t addFile(KernelSource source, std::string path, FileParser parse, FileLayout layout);
  void addChannel(FoundChannel channel) { channels_.push_back(std::move(channel)); }
  // A channel for each row, whose value is the field of the file of the same number, after the
  // first fields.
  void addSimple(std::span<const ChannelRow> rows, const FoundDevice& device, std::uint32_t file,
                 std::uint32_t firstField = 0);
  // The same for rows whose files hold one number, for those files that the directory has: a row
  // names its file at the end of its own path.
  void addNumbers(const SystemTree& tree, const std::string& directory,
                  std::span<const ChannelRow> rows, const FoundDevice& device, FileParser parse);
  // A channel whose elements are consecutive fields of a file.
  void addArray(const ChannelRow& row, const FoundDevice& device, std::uint32_t file,
                std::uint32_t firstField, std::size_t count, std::string item = {});

  // A state channel whose residencies are lines of a file, named like its labels. None if there are
  // no labels.
  void addResidencies(const ChannelRow& row, const FoundDevice& device, std::string path,
                      FileParser parse, FileLayout layout);

  const std::vector<FoundFile>& files() const { return files_; }
  const std::vector<FoundChannel>& channels() const { return channels_; }

 private:
  std::vector<FoundFile> files_;
  std::vector<FoundChannel> channels_;
};

// The state id whose name the library shows: the text's first 8 characters, without those that
// cannot be shown.
std::uint64_t stateID(std::string_view name);

// The name of a file within its path.
constexpr std::string_view fileName(std::string_view path) {
  return path.substr(path.rfind('/') + 1);
}

}  // namespace tally
