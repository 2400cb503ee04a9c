// Stores of newer versions of the program, which an older one keeps for them.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "host/store/store_schema.h"

namespace tally {

// After a system is rolled back, the store may be one that this program does not understand. It is
// folded into one file and renamed to NAME.newer-1, or the next number that is free, so that
// recording goes on in an empty store. Nothing is ever removed: the newer program reads it again.

// Sets the store aside if it is a newer one, and says so through file.notify. An error when it
// stays, and says why: above all while another process has it open, which may be the newer program
// at work.
Status setNewerStoreAside(const StoreFile& file);
// Waits for a process that is about to do so. False if none ever did.
bool awaitSettingAside(const StoreFile& file);

// Far more often than a device can be rolled back.
constexpr std::uint32_t kMostStoresSetAside = 9999;

struct StoreSetAside {
  std::string name;  // in the store's directory
  std::uint32_t number = 0;
  std::uint64_t bytes = 0;
};
// In the order of their numbers. None when the directory cannot be listed.
std::vector<StoreSetAside> storesSetAside(const StoreFile& file);
// The one of that number, as a store that can be read.
StoreFile storeSetAside(const StoreFile& file, std::uint32_t number);

}  // namespace tally
