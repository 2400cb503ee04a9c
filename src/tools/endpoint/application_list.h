// Lists of activated applications in files.
#pragma once

#include <string>

#include "base/result.h"
#include "kv/value.h"

namespace tally::tools {

// The elements of an "app_data" message from a file, "-" for standard input: JSON or a property
// list, an array of objects with "bundle_id", "version", "adam_id", "arch" and "uuid" (36
// characters, or data of 16 bytes). The error names the element that is not of this form.
Result<KvRef<KvArray>> readApplicationList(const std::string& path);

}  // namespace tally::tools
