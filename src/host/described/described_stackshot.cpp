#include "host/described/described_stackshot.h"

#include <cerrno>

#include "base/files/file.h"

namespace tally {
namespace {

// Far above any snapshot of a small device's threads.
constexpr std::size_t kLimit = 64u << 20;

class DescribedConfig final : public StackshotConfig {
 public:
  DescribedConfig(DeviceDirectory folder, std::shared_ptr<DeviceDescription> description,
                  KvRef<KvDictionary> stackshot)
      : folder_(std::move(folder)),
        description_(std::move(description)),
        stackshot_(std::move(stackshot)) {}

  int stackshotConfigSetFlags(std::uint32_t flags) override {
    if (flags != kStackshotFlagKcdata) return EINVAL;
    return status("FlagsStatus");
  }

  int stackshotCapture() override {
    if (const int failure = status("CaptureStatus")) return failure;
    const auto name = stackshot_->getString("File");
    if (!name || !isSafeFileName(*name)) {
      description_->reportEntry("Stackshot.File", "names no file of the device folder");
      return ENOENT;
    }
    auto content = folder_.readFile(*name, kLimit);
    if (!content) {
      description_->reportEntry("Stackshot.File", content.error().message);
      return content.error().systemError != 0 ? content.error().systemError : EIO;
    }
    buffer_ = std::move(*content);
    captured_ = true;
    return 0;
  }

  std::span<const std::byte> stackshotBuffer() override {
    if (!captured_) return {};
    return {reinterpret_cast<const std::byte*>(buffer_.data()), buffer_.size()};
  }

 private:
  int status(std::string_view key) const {
    return static_cast<int>(stackshot_->getInt64(key).value_or(0));
  }

  DeviceDirectory folder_;
  std::shared_ptr<DeviceDescription> description_;
  KvRef<KvDictionary> stackshot_;
  std::string buffer_;
  bool captured_ = false;
};

}  // namespace

std::unique_ptr<StackshotConfig> DescribedStackshot::stackshotConfigCreate() {
  const auto* stackshot = description_->getAs<KvDictionary>(Described::Stackshot);
  if (stackshot == nullptr) return nullptr;
  return std::make_unique<DescribedConfig>(folder_, description_, stackshot->copy());
}

}  // namespace tally
