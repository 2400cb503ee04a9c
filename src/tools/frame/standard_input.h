// Standard input as a whole.
#pragma once

#include <cstddef>
#include <string>

#include "base/result.h"

namespace tally::tools {

// An error if it cannot be read or is larger than mostBytes.
Result<std::string> readStandardInput(std::size_t mostBytes);

}  // namespace tally::tools
