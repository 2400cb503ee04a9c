// Moves files out of the way of new ones without removing them.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "base/files/directory.h"

namespace tally {

// What is between a file's name and its number once it is set aside: "NAME.damaged-1".
inline std::string asideMark(std::string_view word) { return "." + std::string(word) + "-"; }

// Renames the file to the first of NAME.WORD-1 to NAME.WORD-`most` that is free, and returns its
// new name; EEXIST when none is. Nothing is replaced. Survives a power cut once the directory is
// synced.
Result<std::string> setAside(const Directory& directory, std::string_view name,
                             std::string_view word, std::uint32_t most);

}  // namespace tally
