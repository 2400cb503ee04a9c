// What the programs of an invented maker record in a day, beside what the device counts itself.
#pragma once

#include <cstddef>
#include <cstdint>

#include "base/result.h"
#include "host/store/store_importer.h"
#include "kv/value.h"
#include "simulation/fleet_plan.h"

namespace tally::simulation {

// The group of the whitelist that admits them.
inline constexpr std::string_view kMakerGroup = "Quillet";
KvRef<KvDictionary> makerGroup();

// A day's scalars and samples; `day` counts from the fleet's first one, storeDay is what the
// device's clock says.
Status addMakerMetrics(StoreImporter& importer, const FleetPlan& plan, std::size_t device, int day,
                       std::int32_t storeDay);

}  // namespace tally::simulation
