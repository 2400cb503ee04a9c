// What the handles of hwreport_c.h point to.
#pragma once

#include <memory>
#include <vector>

#include "base/c_border.h"
#include "hwreport/channels.h"
#include "hwreport/hwreport_c.h"
#include "hwreport/samples.h"
#include "platform/platform.h"

struct hwreport_device final : tally::CHandle<0x68776401> {
  std::shared_ptr<tally::Platform> services;
};

struct hwreport_channels final : tally::CHandle<0x68776402> {
  tally::KvRef<tally::KvDictionary> collection;
  std::vector<tally::KvDictionary*> list;  // the collection's, in the order of its walk
};

// The subscription keeps the registry, so it goes before the services.
struct hwreport_subscription final : tally::CHandle<0x68776403> {
  std::shared_ptr<tally::Platform> services;
  tally::KvRef<tally::KvDictionary> subscribed;
  tally::KvRef<tally::HwReportSubscription> connection;
};

namespace tally {

// The channel of a set, or null with the failure kept.
inline KvDictionary* channelOfSet(hwreport_channels* channels, std::size_t index) noexcept {
  if (cHandle(channels) == nullptr) {
    cBadArgument("not a set of channels");
    return nullptr;
  }
  if (index < channels->list.size()) return channels->list[index];
  cBadArgument("the set has no channel of that index");
  return nullptr;
}

}  // namespace tally
