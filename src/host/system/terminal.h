// What a terminal, or a file in its place, can show.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tally {

struct Terminal {
  std::size_t columns = 80;
  bool interactive = false;  // a person is watching
  bool escapes = false;      // it obeys escape sequences, and the user wants them: colour, progress
  bool unicode = false;      // block characters and lines may be used
};

// The variables that say how to write to a terminal; empty when unset.
struct TerminalEnvironment {
  std::string columns, noColor, term;  // COLUMNS, NO_COLOR, TERM
  std::string all, ctype, lang;        // LC_ALL, LC_CTYPE, LANG
};

// For the terminal or file of a descriptor. The width is that of the terminal, else COLUMNS, else
// 80, and always from 40 to 200, where tables stay readable.
Terminal terminalOf(int descriptor);
// The same from what was found; columns is 0 if the descriptor is not a terminal or does not report
// its width.
Terminal makeTerminal(bool interactive, std::size_t columns,
                      const TerminalEnvironment& environment);

}  // namespace tally
