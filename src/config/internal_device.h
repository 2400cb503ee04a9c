// Whether this is an internal (engineering) build of the operating system.
#pragma once

namespace tally {

// Asked of the device once per process, on first use, from any thread; then remembered.
bool TBIsInternalDevice();

}  // namespace tally
