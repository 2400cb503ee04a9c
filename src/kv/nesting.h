// How deeply values may be nested.
#pragma once

namespace tally {

// Containers inside one another: more than any real value has, and few enough for a small stack.
// A value that is nested deeper mostly contains itself.
constexpr int kMaximumDepth = 512;
constexpr const char* kTooDeep = "nested deeper than 512 levels";

}  // namespace tally
