// A statistics hub: serves the raw elements of the channels that a client is interested in.
#pragma once

#include <functional>
#include <memory>
#include <vector>

#include "host/registry/hub_region.h"
#include "host/registry/registry_source.h"

namespace tally {

// The region of these channels; null when it would be too large. A channel that is not served is
// left out.
using RegionMaker = std::function<std::unique_ptr<HubRegion>(const std::vector<Interest>&)>;

// failures, which may be null, names the calls that are to fail: see injectedResult().
std::unique_ptr<UserClient> openStatisticsHub(RegionMaker makeRegion, KvRef<KvDictionary> failures,
                                              RegistryResult* result);

}  // namespace tally
