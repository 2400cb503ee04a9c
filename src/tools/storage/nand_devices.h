// The flash disks of the device: the list of them, and one that a command is to read.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/flash/flash_disks.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"

namespace tally::tools {

void addNandDevices(CLI::App& nand, ToolContext& context);

// Adds a command that asks the driver of the device's storage, or with --device that of another
// disk; device, which may be null, is told which.
using ChosenDisk = std::shared_ptr<std::optional<std::string>>;
Command addNandDiskCommand(CLI::App& nand, ToolContext& context, const char* name,
                           const char* description, const ChosenDisk& device,
                           std::function<int()> run);

// The disk that was chosen, or without a choice that of the device's storage. Empty if the kernel
// shows no such disk.
std::optional<FlashDisk> findDisk(const ToolContext& context,
                                  const std::optional<std::string>& name);

// "10-20 %", "3 %", "100 % or more".
std::string rangeText(const PercentRange& range);
Json rangeJson(const PercentRange& range);

}  // namespace tally::tools
