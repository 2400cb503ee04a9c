// The daily dump of the lists, with its notices sent elsewhere.
#pragma once

#include <cstdio>

namespace tally {

// DumpStorageStructuredLog, which reports invalid digits on standard output. A program whose own
// output goes there passes another file.
bool dumpStorageLists(bool requestFlag, std::FILE* notices);

}  // namespace tally
