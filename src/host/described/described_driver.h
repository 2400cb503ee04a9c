// A driver's user client whose answers come from its description.
#pragma once

#include <memory>

#include "host/described/described_files.h"
#include "host/registry/registry_source.h"

namespace tally {

// description is the entry's "UserClient". It and the files are shared.
std::unique_ptr<UserClient> openDescribedDriver(KvRef<KvDictionary> description,
                                                std::shared_ptr<DescribedFiles> files,
                                                RegistryResult* result);

}  // namespace tally
