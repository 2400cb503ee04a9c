// The unit and the meaning of each figure of the NAND info dictionary.
#pragma once

#include <functional>
#include <string_view>

namespace tally {

struct FigureText {
  std::string_view key, unit, meaning;
};

// Calls the handler for every key that a dictionary may have, each once. Figures of which only the
// name is known have the unit that it implies, else "count", and the title of their group as
// meaning.
void eachFigureText(const std::function<void(const FigureText&)>& handler);

}  // namespace tally
