// The platform in force.
#include "platform/platform.h"

namespace tally {
namespace {

Platform* current = nullptr;

}  // namespace

Platform& platform() { return *current; }

PlatformScope::PlatformScope(Platform services) : services_(std::move(services)), former_(current) {
  current = &services_;
}

// The services may still log while they are destroyed, so the former platform comes back first.
PlatformScope::~PlatformScope() { current = former_; }

}  // namespace tally
