// Statistics channels and their samples, for people and for programs.
#pragma once

#include <optional>
#include <string>

#include "kv/value.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"

namespace tally::tools {

// Prints sampled channels one after another, with a heading for each driver and each group.
class ChannelPrinter {
 public:
  // seconds: between the two samples whose difference is shown; empty for a single sample.
  ChannelPrinter(const ToolContext& context, std::optional<double> seconds);
  ~ChannelPrinter() { printValues(); }
  ChannelPrinter(const ChannelPrinter&) = delete;
  ChannelPrinter& operator=(const ChannelPrinter&) = delete;

  void print(KvDictionary& channel);

 private:
  void printHeadings(const KvDictionary& channel);
  void addValue(KvDictionary& channel);
  void printStates(KvDictionary& channel);
  void printBuckets(KvDictionary& channel);
  void printArray(KvDictionary& channel);
  void printTitle(KvDictionary& channel);
  void printTable(const Table& table);
  void printValues();
  Table emptyValues() const;

  const ToolContext& context_;
  const std::optional<double> seconds_;
  std::optional<std::string> driver_, group_;  // of the last channel
  Table values_;                               // consecutive simple channels
};

// The description of a channel: "driver", "driverID", "name", "id", "format", "categories",
// "group", "subgroup", "unit", "unitLabel". 64-bit words are hexadecimal strings, what is missing
// is null.
Json jsonOfChannel(KvDictionary& channel);
// Adds "semantics", "scope", "width" in bits, "file" and "description"; null if they are not known.
void addDetails(Json& document, const KvDictionary& channel);
// The same in one line; empty if nothing is known.
std::string detailsText(const KvDictionary& channel);
// The same with its "value", "states", "buckets" or "values".
Json jsonOfSample(KvDictionary& channel);

}  // namespace tally::tools
