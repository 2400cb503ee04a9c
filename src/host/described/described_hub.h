// The statistics hub of a device description.
#pragma once

#include <memory>

#include "host/described/described_files.h"
#include "host/registry/registry_source.h"

namespace tally {

// description is the hub entry's "Hub", null when it has none: failures to inject ("OpenStatus",
// "StartStatus", "ConfigureStatus", "MapStatus", "UpdateStatus") and "RawFrames", regions served
// verbatim. Otherwise the drivers among the entries give the values, in "HwReportValues".
std::unique_ptr<UserClient> openDescribedHub(KvRef<KvDictionary> description,
                                             std::shared_ptr<const RegistrySource::Entries> drivers,
                                             std::shared_ptr<DescribedFiles> files,
                                             RegistryResult* result);

}  // namespace tally
