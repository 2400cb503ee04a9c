#include "base/printable.h"

#include <algorithm>
#include <cstdint>
#include <iterator>

#include "base/hex.h"
#include "base/utf8.h"

namespace tally {
namespace {

struct Range {
  std::uint32_t first, last;
};

// Characters that change how what follows is laid out: bidirectional controls, line and paragraph
// separators, the byte order mark.
constexpr Range kLayoutControls[] = {
    {0x061C, 0x061C}, {0x200E, 0x200F}, {0x2028, 0x202E}, {0x2066, 0x2069}, {0xFEFF, 0xFEFF}};
// Combining marks and joiners of the common scripts, in order.
constexpr Range kNoWidth[] = {
    {0x0300, 0x036F}, {0x0483, 0x0489}, {0x0591, 0x05BD}, {0x0610, 0x061A}, {0x064B, 0x065F},
    {0x06D6, 0x06DC}, {0x093C, 0x093C}, {0x0941, 0x0948}, {0x094D, 0x094D}, {0x0E31, 0x0E31},
    {0x0E34, 0x0E3A}, {0x0E47, 0x0E4E}, {0x1AB0, 0x1AFF}, {0x1DC0, 0x1DFF}, {0x200B, 0x200D},
    {0x20D0, 0x20FF}, {0x3099, 0x309A}, {0xFE00, 0xFE0F}, {0xFE20, 0xFE2F}, {0xE0100, 0xE01EF}};
constexpr Range kWide[] = {
    {0x1100, 0x115F},   {0x231A, 0x231B},   {0x2329, 0x232A},   {0x23E9, 0x23EC},
    {0x2E80, 0x303E},   {0x3041, 0x33FF},   {0x3400, 0x4DBF},   {0x4E00, 0x9FFF},
    {0xA000, 0xA4CF},   {0xA960, 0xA97F},   {0xAC00, 0xD7A3},   {0xF900, 0xFAFF},
    {0xFE30, 0xFE6F},   {0xFF00, 0xFF60},   {0xFFE0, 0xFFE6},   {0x1F300, 0x1F64F},
    {0x1F680, 0x1F6FF}, {0x1F900, 0x1F9FF}, {0x1FA70, 0x1FAFF}, {0x20000, 0x3FFFD}};

template <std::size_t kCount>
bool isIn(const Range (&ranges)[kCount], std::uint32_t character) {
  const auto range = std::find_if(std::begin(ranges), std::end(ranges),
                                  [=](const Range& r) { return character <= r.last; });
  return range != std::end(ranges) && character >= range->first;
}

std::size_t widthOf(std::uint32_t character) {
  if (character < 0x300) return 1;
  if (isIn(kNoWidth, character)) return 0;
  return isIn(kWide, character) ? 2 : 1;
}

}  // namespace

bool isControl(std::uint32_t character) {
  return character < 0x20 || (character >= 0x7F && character < 0xA0) ||
         isIn(kLayoutControls, character);
}

std::string printable(std::string_view text) {
  const std::string valid = repairUtf8(text);
  std::string out;
  out.reserve(valid.size());
  for (std::size_t i = 0; i < valid.size();) {
    const std::size_t begin = i;
    const std::uint32_t character = takeCharacter(valid, i);
    if (character == '\n') {
      out += "\\n";
    } else if (character == '\t') {
      out += "\\t";
    } else if (isControl(character)) {
      const bool isShort = character < 0x100;
      out += isShort ? "\\x" : "\\u";
      appendHex(out, character, isShort ? 2 : 4);
    } else {
      out.append(valid, begin, i - begin);
    }
  }
  return out;
}

std::size_t displayWidth(std::string_view text) {
  std::size_t width = 0;
  for (std::size_t i = 0; i < text.size();) width += widthOf(takeCharacter(text, i));
  return width;
}

std::string fitted(std::string_view text, std::size_t columns, std::string_view mark) {
  if (displayWidth(text) <= columns) return std::string(text);
  const std::size_t markWidth = displayWidth(mark);
  if (markWidth > columns) return "";
  std::size_t width = 0;
  std::size_t end = 0;
  for (std::size_t i = 0; i < text.size(); end = i) {
    width += widthOf(takeCharacter(text, i));
    if (width + markWidth > columns) break;
  }
  return std::string(text.substr(0, end)) + std::string(mark);
}

std::vector<std::string> wrapped(std::string_view text, std::size_t columns,
                                 std::size_t alreadyTaken) {
  constexpr std::string_view kSeparators = "/.,-_:;=";
  std::vector<std::string> lines;
  std::size_t begin = 0, width = std::min(alreadyTaken, columns), blank = 0, separator = 0;
  const auto breakAt = [&](std::size_t end, std::size_t next) {
    lines.emplace_back(text.substr(begin, end - begin));
    begin = next;
    blank = separator = width = 0;
    return next;
  };
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t at = i;
    width += widthOf(takeCharacter(text, i));
    if (width > columns && at > begin) {
      if (text[at] == ' ') {
        i = breakAt(at, at + 1);
      } else if (blank > begin) {
        i = breakAt(blank, blank + 1);
      } else {
        const std::size_t cut = separator > begin ? separator : at;
        i = breakAt(cut, cut);
      }
      continue;
    }
    if (text[at] == ' ' && at > begin && text[at - 1] != ' ') blank = at;
    if (kSeparators.find(text[at]) != kSeparators.npos) separator = i;
  }
  if (begin < text.size() || lines.empty()) lines.emplace_back(text.substr(begin));
  return lines;
}

}  // namespace tally
