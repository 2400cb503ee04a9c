// Lists of activated applications in files.
#pragma once

#include <string>

#include "base/result.h"
#include "kv/value.h"

namespace tally::tools {

// The elements of an "app_data" message from a file, "-" for standard input: JSON or a property
// list, an array of objects with the fields of kApplicationFields (a UUID as 36 characters, or as
// data). The error names the element that is not of this form.
Result<KvRef<KvArray>> readApplicationList(const std::string& path);

}  // namespace tally::tools
