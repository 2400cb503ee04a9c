// The os-release file: what the running system calls itself.
#pragma once

#include <map>
#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// The assignments of the file, with quotes and escapes resolved; other lines are skipped. The last
// assignment of a name applies.
std::map<std::string, std::string, std::less<>> parseOsRelease(std::string_view text);

// "ProductName", "ProductVersion" and "ProductBuildVersion" from NAME, VERSION_ID and the first of
// BUILD_ID, VERSION and VERSION_ID that is there. What the file does not tell is absent.
KvRef<KvDictionary> systemVersionFromOsRelease(std::string_view text);

// The version as one text, "NAME VERSION (BUILD)"; "unknown" when the dictionary tells nothing.
std::string osVersionText(const KvDictionary& systemVersion);

}  // namespace tally
