// The wear of a disk over time, as `tallyctl nand health` shows it.
#pragma once

#include "platform/flash/flash_disks.h"
#include "tools/frame/output.h"

namespace tally::tools {

// The history that the daily job has recorded, and the forecast from it.
void printWear(const ToolContext& context, const FlashDisk& disk);
Json wearJson(const ToolContext& context, const FlashDisk& disk);

}  // namespace tally::tools
