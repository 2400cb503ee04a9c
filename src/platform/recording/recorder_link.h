// The daily job's way to the recorder.
#pragma once

#include <chrono>

#include "base/result.h"

namespace tally {

class RecorderLink {
 public:
  virtual ~RecorderLink() = default;
  // Has the recorder commit what it holds, and waits for that, at most so long. True when it did,
  // false when there is none; an error when it could not or did not answer.
  virtual Result<bool> commit(std::chrono::milliseconds) { return false; }
};

}  // namespace tally
