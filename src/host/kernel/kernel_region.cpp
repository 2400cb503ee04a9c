#include "host/kernel/kernel_region.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cstring>

#include "host/kernel/source_table.h"

namespace tally {
namespace {

constexpr std::size_t kMostOpenFiles = 256;
constexpr std::size_t kFirstBuffer = 16u << 10, kLargestFile = 4u << 20;

template <class T>
void put(std::span<std::byte> memory, std::size_t offset, T value) {
  std::memcpy(memory.data() + offset, &value, sizeof value);
}

// A device that went, that sleeps or is busy: nothing that an operator could mend.
bool isOrdinary(int error) {
  constexpr int kOrdinary[] = {ENOENT, ENODEV,  ENXIO,     EAGAIN,     EBUSY,
                               EINVAL, ENODATA, EREMOTEIO, EOPNOTSUPP, EOVERFLOW};
  return std::ranges::find(kOrdinary, error) != std::end(kOrdinary);
}

std::int64_t percentage(std::int64_t value, std::int64_t whole) {
  if (value < 0 || whole <= 0) return kNoReading;
  return static_cast<std::int64_t>(100.0 * static_cast<double>(value) / static_cast<double>(whole));
}

}  // namespace

KernelRegion::KernelRegion(const std::vector<Interest>& interests,
                           std::shared_ptr<const KernelChannels> channels, KernelDevice device)
    : channels_(std::move(channels)), device_(std::move(device)) {
  boot_ = device_.tree->text("/proc/sys/kernel/random/boot_id").value_or("");
  for (const Interest& interest : interests) {
    if (const DailyChannel* daily = channels_->dailyChannel(interest.channel);
        daily != nullptr && interest.driver == KernelChannels::kDailyID) {
      addDailyChannel(interest, *daily);
    } else if (const FoundChannel* found = channels_->channel(interest.channel)) {
      addChannel(interest, *found);
    }
  }
  // A region cannot be empty. The run of nobody's channel takes its place.
  if (elements_ == 0) {
    constexpr std::uint64_t kNobody = element::kMissingValue;
    served_.push_back({{kNobody, kNobody, 0}, 1, 0, nullptr, {}, {}});
    elements_ = 1;
  }
  std::size_t most = 0;
  readingsOfFile_.resize(files_.size());
  for (const File& file : files_) most = std::max(most, file.found->layout.fields());
  for (Channel& channel : served_) {
    for (Part& part : channel.parts) {
      readingsOfFile_[part.reading.file].push_back(&part.reading);
      if (part.percentOf) readingsOfFile_[part.percentOf->file].push_back(&*part.percentOf);
    }
  }
  fields_.resize(most);
  buffer_.resize(kFirstBuffer);
  generation_ = device_.tree->generation();
}

std::size_t KernelRegion::size() const { return elements_ * element::kSize; }

std::uint32_t KernelRegion::fileOf(std::uint32_t found) {
  const auto [place, isNew] =
      fileNumbers_.try_emplace(found, static_cast<std::uint32_t>(files_.size()));
  if (isNew) files_.push_back({&channels_->findings().files()[found], {}, {}});
  return place->second;
}

void KernelRegion::addChannel(const Interest& interest, const FoundChannel& found) {
  const auto number = static_cast<std::uint32_t>(served_.size());
  Channel channel{interest,  found.elements,  elements_ * element::kSize,
                  found.row, found.constants, {}};
  if (interest.type == 0) {
    channel.interest.type = typeOf(*found.row, kRawCategory, found.elements).bits;
  }
  for (const FoundSlot& slot : found.slots) {
    if (slot.percentOf) {
      channel.parts.push_back(partOf(slot));
      continue;
    }
    const std::size_t offset =
        channel.offset + slot.element * element::kSize + element::slot(slot.slot);
    files_[fileOf(slot.file)].outputs.push_back(
        {number, slot.field, static_cast<std::uint32_t>(offset)});
  }
  elements_ += channel.elements;
  served_.push_back(std::move(channel));
}

KernelRegion::Part KernelRegion::partOf(const FoundSlot& slot) {
  Part part{{fileOf(slot.file), slot.field}, std::nullopt, {}, {}};
  if (slot.percentOf) part.percentOf = Reading{fileOf(slot.percentOf->file), slot.percentOf->field};
  return part;
}

void KernelRegion::addDailyChannel(const Interest& interest, const DailyChannel& daily) {
  const bool counts = isCounter(daily.row->semantics);
  if (counts && !device_.days) return;
  hasDailyCounters_ = hasDailyCounters_ || counts;
  Channel channel{interest, 1, elements_ * element::kSize, daily.row, {}, {}, true};
  if (interest.type == 0) channel.interest.type = typeOf(*daily.row, kSweptCategory, 1).bits;
  for (const std::uint32_t number : daily.channels) {
    const FoundChannel& found = channels_->findings().channels()[number];
    std::string key = channels_->lastingName(number);
    if (daily.row->scope == CounterScope::Lifetime) key.append("@").append(found.device.identity);
    Part part = partOf(found.slots.front());
    part.key = std::move(key);
    part.epoch = epochOf(found);
    channel.parts.push_back(std::move(part));
  }
  ++elements_;
  served_.push_back(std::move(channel));
}

std::string KernelRegion::epochOf(const FoundChannel& channel) const {
  switch (channel.row->scope) {
    case CounterScope::Boot:
      return boot_;
    case CounterScope::Creation:
      return boot_ + "/" + channel.device.identity;
    case CounterScope::Lifetime:
      return channel.device.identity;
  }
  return {};
}

std::string_view KernelRegion::readOnce(const File& file, int descriptor) {
  // /sys gives a file at once, /proc in pieces.
  const bool inPieces = !file.found->path.starts_with("/sys/");
  std::size_t length = 0;
  while (true) {
    const ssize_t got = retried([&] {
      return ::pread(descriptor, buffer_.data() + length, buffer_.size() - length,
                     static_cast<off_t>(length));
    });
    if (got < 0) return {};
    length += static_cast<std::size_t>(got);
    if (got == 0 || (!inPieces && length < buffer_.size())) return {buffer_.data(), length};
    if (length < buffer_.size()) continue;
    if (buffer_.size() >= kLargestFile) {
      errno = EFBIG;
      return {};
    }
    buffer_.resize(buffer_.size() * 2);
  }
}

std::string_view KernelRegion::clockText() {
  using std::chrono::system_clock;
  const double now = device_.days
                         ? device_.days->secondsSince1970()
                         : static_cast<double>(system_clock::to_time_t(system_clock::now()));
  const auto written = std::to_chars(buffer_.data(), buffer_.data() + buffer_.size(),
                                     static_cast<std::int64_t>(now));
  return {buffer_.data(), written.ptr};
}

std::string_view KernelRegion::read(File& file) {
  if (file.found->path == kClockPath) return clockText();
  errno = 0;
  if (file.open) {
    const std::string_view text = readOnce(file, file.open.get());
    if (!text.empty()) return text;
    // Its device may have been made again under the same name.
    file.open = Descriptor();
    --open_;
  }
  errno = 0;
  Descriptor opened = device_.tree->open(file.found->path);
  const std::string_view text = opened ? readOnce(file, opened.get()) : std::string_view();
  if (text.empty()) {
    report(file, errno);
    return {};
  }
  if (open_ < kMostOpenFiles) {
    file.open = std::move(opened);
    ++open_;
  }
  return text;
}

void KernelRegion::report(const File& file, int error) {
  if (error == 0 || isOrdinary(error)) return;
  const std::string source(sourceRow(file.found->source).name);
  device_.log->fault("statistics of the kernel: " + source, "{}: {}; its channels are missing",
                     file.found->path, std::strerror(error));
}

void KernelRegion::takeFields(File& file, std::span<std::byte> memory) {
  const std::span fields(fields_.data(), file.found->layout.fields());
  std::ranges::fill(fields, kNoReading);
  const std::string_view text = read(file);
  if (!text.empty()) file.found->parse(text, file.found->layout, fields);
  for (const Output& output : file.outputs) {
    const std::int64_t value = fields[output.field];
    put(memory, output.offset, value);
    if (value != kNoReading) served_[output.channel].present = true;
  }
}

std::int64_t KernelRegion::computed(const Channel& channel) {
  std::int64_t sum = kNoReading;
  for (const Part& part : channel.parts) {
    std::optional<std::int64_t> value = part.reading.value;
    if (part.percentOf) value = percentage(part.reading.value, part.percentOf->value);
    if (*value == kNoReading) continue;
    if (channel.isDaily && isCounter(channel.row->semantics)) {
      value = device_.days->amount(
          part.key, {static_cast<std::uint64_t>(*value), part.epoch, channel.row->width,
                     channel.row->semantics == Semantics::UnsteadyCounter});
    }
    if (!value) continue;
    if (sum == kNoReading) sum = 0;
    if (__builtin_add_overflow(sum, *value, &sum)) sum = INT64_MAX;
  }
  return sum;
}

void KernelRegion::writeFrame(std::size_t, std::span<std::byte> memory) {
  if (const std::size_t now = device_.tree->generation(); now != generation_) {
    generation_ = now;
    open_ = 0;
    for (File& file : files_) file.open = Descriptor();
  }
  for (Channel& channel : served_) {
    channel.present = false;
    std::fill_n(memory.data() + channel.offset, channel.elements * element::kSize, std::byte{0});
    for (std::uint16_t i = 0; i < channel.elements; ++i) {
      for (std::size_t slot = 0; slot < element::kSlotCount; ++slot) {
        put(memory, channel.offset + i * element::kSize + element::slot(slot),
            element::kMissingValue);
      }
    }
    for (const FoundConstant& known : channel.constants) {
      put(memory, channel.offset + known.element * element::kSize + element::slot(known.slot),
          known.value);
    }
  }
  for (std::size_t i = 0; i < files_.size(); ++i) {
    takeFields(files_[i], memory);
    for (Reading* reading : readingsOfFile_[i]) reading->value = fields_[reading->field];
  }
  if (hasDailyCounters_) device_.days->beginSample();
  for (Channel& channel : served_) {
    if (!channel.parts.empty()) {
      const std::int64_t value = computed(channel);
      channel.present = value != kNoReading;
      put(memory, channel.offset + element::slot(simple_slot::kValue), value);
    }
    // Missing this once: a run that is of no channel.
    const std::uint64_t driver = channel.present ? channel.interest.driver : element::kMissingValue;
    const std::uint64_t id = channel.present ? channel.interest.channel : element::kMissingValue;
    const TypeWord type{channel.interest.type};
    for (std::uint16_t i = 0; i < channel.elements; ++i) {
      const std::size_t offset = channel.offset + i * element::kSize;
      put(memory, offset + element::kDriverID, driver);
      put(memory, offset + element::kChannelID, id);
      put(memory, offset + element::kTypeWord, type.withElementCount(channel.elements).bits);
    }
  }
}

}  // namespace tally
