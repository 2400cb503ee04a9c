// The sources of the kernel's statistics: which there are, and how their devices are found.
#pragma once

#include <span>
#include <string_view>

#include "host/kernel/channel_row.h"
#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

struct SourceRow {
  KernelSource source;
  std::string_view name;   // of its driver, and the front of its channels' names
  std::string_view title;  // of its channels' group
  std::string_view
      device;  // what a channel's name has between the source's and its own, for people
  // Adds what there is on the device now. Null: the source before it does, whose file it shares.
  void (*find)(const SystemTree& tree, Findings& findings);
};

// Those that share a name are next to each other.
std::span<const SourceRow> sourceTable();
const SourceRow& sourceRow(KernelSource source);

}  // namespace tally
