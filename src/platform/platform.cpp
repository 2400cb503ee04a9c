// The platform in force.
#include "platform/platform.h"

namespace tally {
namespace {

Platform* current = nullptr;
Platform& (*makeDefault)() = nullptr;

}  // namespace

Platform& platform() { return current != nullptr ? *current : makeDefault(); }

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

}  // namespace tally
