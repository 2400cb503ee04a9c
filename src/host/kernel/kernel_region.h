// Samples of the kernel's channels: which files a subscription needs, and what it takes from them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/files/file.h"
#include "host/kernel/daily_amounts.h"
#include "host/kernel/kernel_channels.h"
#include "host/registry/hub_region.h"
#include "host/tree/system_tree.h"
#include "platform/system_log.h"

namespace tally {

// What a region needs of its device. The daily amounts may be null: then counters have none.
struct KernelDevice {
  std::shared_ptr<const SystemTree> tree;
  std::shared_ptr<SystemLog> log;
  std::shared_ptr<DailyAmounts> days;
};

// Each file is read once for a sample, whatever channels it serves, and only those that the
// interests need. A channel whose value cannot be read is missing from that sample. Up to 256 files
// stay open between samples.
class KernelRegion final : public HubRegion {
 public:
  KernelRegion(const std::vector<Interest>& interests,
               std::shared_ptr<const KernelChannels> channels, KernelDevice device);

  std::size_t size() const override;
  bool hasFirstFrame() const override { return false; }
  void writeFrame(std::size_t refresh, std::span<std::byte> memory) override;

 private:
  struct Output {
    std::uint32_t channel, field, offset;
  };
  struct File {
    const FoundFile* found;
    std::vector<Output> outputs;
    Descriptor open;
  };
  struct Reading {
    std::uint32_t file, field;
    std::int64_t value = kNoReading;
  };
  // What a computed channel is the sum of, and what is kept of a counter.
  struct Part {
    Reading reading;
    std::optional<Reading> percentOf;
    std::string key, epoch;
  };
  struct Channel {
    Interest interest;
    std::uint16_t elements;
    std::size_t offset;     // of its run
    const ChannelRow* row;  // null for nobody's
    std::vector<FoundConstant> constants;
    std::vector<Part> parts;  // none of one that is read as it is
    bool isDaily = false, present = false;
  };

  void addChannel(const Interest& interest, const FoundChannel& found);
  void addDailyChannel(const Interest& interest, const DailyChannel& daily);
  std::uint32_t fileOf(std::uint32_t found);
  std::string epochOf(const FoundChannel& channel) const;
  // The text of a file in buffer_; empty if it cannot be read.
  std::string_view read(File& file);
  std::string_view clockText();
  std::string_view readOnce(const File& file, int descriptor);
  void report(const File& file, int error);
  void takeFields(File& file, std::span<std::byte> memory);
  Part partOf(const FoundSlot& slot);
  std::int64_t computed(const Channel& channel);

  std::shared_ptr<const KernelChannels> channels_;
  KernelDevice device_;
  std::string boot_;
  std::vector<Channel> served_;
  std::vector<File> files_;
  std::map<std::uint32_t, std::uint32_t> fileNumbers_;  // by number among what was found
  std::vector<std::vector<Reading*>> readingsOfFile_;
  std::size_t elements_ = 0, open_ = 0, generation_ = 0;
  bool hasDailyCounters_ = false;
  std::string buffer_;
  std::vector<std::int64_t> fields_;
};

}  // namespace tally
