// The group of each figure of the NAND info dictionary.
#pragma once

#include <string_view>

#include "storage/statistics/figure_group.h"

namespace tally {

// Of the figure with that key; Other for a key that is not known.
FigureGroup figureGroup(std::string_view key);

}  // namespace tally
