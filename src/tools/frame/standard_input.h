// Standard input as a whole.
#pragma once

#include <cstddef>
#include <string>

#include "base/result.h"

namespace tally::tools {

// An error when it cannot be read or holds more than so many bytes.
Result<std::string> readStandardInput(std::size_t mostBytes);

}  // namespace tally::tools
