// The order in which people expect names that hold numbers.
#pragma once

#include <string_view>

namespace tally::tools {

// True when a comes before b: by bytes, but runs of digits by the number that they are, so that
// "bus2" comes before "bus10". Names that differ in leading zeros alone have an order too.
bool naturalLess(std::string_view a, std::string_view b);

}  // namespace tally::tools
