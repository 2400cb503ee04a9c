// Untrusted text in a form that is safe to show, and the columns that it takes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace tally {

// Characters that a terminal obeys instead of showing them: controls, and those that reorder a line
// or end it.
bool isControl(std::uint32_t character);

// One line that a terminal shows and never obeys: control characters are written as escapes ("\n",
// "\x1b"), so are characters that reorder or end a line ("\u202e"), and bytes that are not UTF-8
// become U+FFFD. Everything else stays.
std::string printable(std::string_view text);

// The terminal columns that printable text takes: 2 for each wide character, none for a combining
// one.
std::size_t displayWidth(std::string_view text);

// The text within so many columns: what does not fit is cut from the end, where the mark says so.
std::string fitted(std::string_view text, std::size_t columns, std::string_view mark);

// The text as lines of at most so many columns, the first of them shorter by what is already on it:
// broken at blanks, in a word that is too long after a separator, else anywhere. Nothing but the
// blanks at the breaks is lost. At least one line. REQUIRES: columns is at least 2.
std::vector<std::string> wrapped(std::string_view text, std::size_t columns,
                                 std::size_t alreadyTaken = 0);

}  // namespace tally
