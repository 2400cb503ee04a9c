// The order in which people expect names that contain numbers.
#pragma once

#include <string_view>

namespace tally {

// True when a comes before b: by bytes, but runs of digits by their value, so that
// "bus2" comes before "bus10". Names that differ only in leading zeros are ordered too.
bool naturalLess(std::string_view a, std::string_view b);

}  // namespace tally
