// The results of a device registry's operations. Drivers may return other codes, which are passed
// on.
#pragma once

#include "platform/device_registry.h"

namespace tally {

constexpr RegistryResult kRegistrySuccess = 0;
constexpr RegistryResult kRegistryNoMemory = 0xE00002BD;
constexpr RegistryResult kRegistryBadArgument = 0xE00002C2;
constexpr RegistryResult kRegistryUnsupported = 0xE00002C7;
constexpr RegistryResult kRegistryNotOpen = 0xE00002CD;
constexpr RegistryResult kRegistryNotFound = 0xE00002F0;

}  // namespace tally
