// Imports CSV into the metrics store.
#pragma once

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

#include "host/store/store_schema.h"
#include "tools/frame/tool.h"

namespace tally::tools {

struct BadLine {
  std::uint64_t line = 0;
  std::string_view reason;
};

struct ImportResult {
  std::uint64_t scalars = 0, samples = 0, rejected = 0;
  std::vector<BadLine> firstRejected;  // the first few
  std::string failure;                 // why nothing at all was imported; empty when it succeeded
};

// Reads rows from the file and keeps the good ones. All of them are one transaction. totalBytes is
// the file's size for the progress bar; 0 when it is not known.
ImportResult importStoreCsv(std::FILE* file, std::uint64_t totalBytes, const StoreFile& storeFile,
                            const ToolContext& context);

}  // namespace tally::tools
