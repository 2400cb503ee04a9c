// Sampled statistics channels, for people and for programs.
#pragma once

#include <string>

#include "kv/value.h"
#include "tools/output.h"

namespace tally::tools {

// Driver, group, name, format, categories and unit of a channel.
Json channelIdentity(KvDictionary* channel);
// The same with its values; null for a value that is missing.
Json sampledChannel(KvDictionary* channel);

// Prints channels below a heading for each driver and group: simple values in a table, states with
// residency bars, histograms with bars.
class ChannelPrinter {
 public:
  explicit ChannelPrinter(const ToolContext& context) : context_(context) {}
  void add(KvDictionary* channel);
  // Prints what is still held back.
  void finish();

 private:
  const ToolContext& context_;
  std::string place_;                                        // the heading in force
  std::vector<std::pair<std::string, std::string>> simple_;  // name and value, for one table
};

}  // namespace tally::tools
