#include "base/version.h"

namespace tally {

const std::string_view kProgramVersion = TALLYRUN_VERSION;

}  // namespace tally
