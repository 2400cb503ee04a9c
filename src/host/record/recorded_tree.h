// A copy of the files that a tree was asked for.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "host/tree/system_tree.h"

namespace tally {

constexpr std::size_t kLargestRecordedFile = 4u << 20, kLargestRecording = 64u << 20;
// Where the log pages are left that only a privileged program may read.
constexpr const char* kLogPageFolder = "/run/tallyd";

struct RecordedEntry {
  TreeEntry::Type type;
  std::string text;  // of a file its content, of a link its target
};

struct RecordedTree {
  std::map<std::string, RecordedEntry> entries;  // by path, each after its directory
  // What had changed by then: in milliseconds since the first sample, contents by path.
  std::map<std::int64_t, std::map<std::string, std::string>> samples;
  std::vector<std::string> faults;  // what is not in it, and why
};

}  // namespace tally
