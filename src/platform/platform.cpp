// The platform in force.
#include "platform/platform.h"

#include <optional>

namespace tally {
namespace {

Platform* current = nullptr;
thread_local Platform* ofThread = nullptr;
Platform& (*makeDefault)() = nullptr;

// Made with its owner, since ending must not need memory.
struct OwnedPlatform {
  explicit OwnedPlatform(Platform made) : services(std::move(made)) { last.log = services->log; }
  OwnedPlatform(const OwnedPlatform&) = delete;
  OwnedPlatform& operator=(const OwnedPlatform&) = delete;
  ~OwnedPlatform() {
    const ThreadPlatformScope scope(last);
    services.reset();
  }
  Platform last;  // only the log
  std::optional<Platform> services;
};

}  // namespace

Platform& platform() {
  if (ofThread != nullptr) return *ofThread;
  return current != nullptr ? *current : makeDefault();
}

void setDefaultPlatform(Platform& (*make)()) { makeDefault = make; }

PlatformScope::PlatformScope(Platform services) : services_(std::move(services)), former_(current) {
  current = &services_;
}

// Services may log while they end (preferences that cannot be written), so the log goes last.
PlatformScope::~PlatformScope() {
  Platform ending;
  ending.log = services_.log;
  std::swap(ending, services_);
  ending = Platform();
  if (services_.log) services_.log->writeOmitted();
  current = former_;
}

ThreadPlatformScope::ThreadPlatformScope(Platform& services) noexcept
    : former_(std::exchange(ofThread, &services)) {}

ThreadPlatformScope::~ThreadPlatformScope() { ofThread = former_; }

std::shared_ptr<Platform> sharePlatform(Platform services) {
  const auto owned = std::make_shared<OwnedPlatform>(std::move(services));
  return {owned, &*owned->services};
}

}  // namespace tally
