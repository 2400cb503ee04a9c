// The directory of a recording.
#pragma once

#include <string>

#include "base/result.h"
#include "host/record/recorded_tree.h"

namespace tally {

// Whether a recording can be written to a path: nothing is there, or an empty directory.
Status checkRecordingFolder(const std::string& path);

// Writes the recording. The directory appears as a whole: until then it is called PATH.incomplete,
// and after a failure nothing is left.
Status writeRecording(const RecordedTree& recorded, const std::string& path);

}  // namespace tally
