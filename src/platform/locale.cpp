#include "platform/locale.h"

#include <algorithm>
#include <cctype>
#include <cstddef>
#include <string_view>

namespace tally {
namespace {

char fold(char c) {
  if (c == '_') return '-';
  return static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
}

bool sameTag(std::string_view a, std::string_view b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [](char x, char y) { return fold(x) == fold(y); });
}

std::size_t subtagEnd(std::string_view tag, std::size_t begin) {
  return std::min(tag.find_first_of("-_", begin), tag.size());
}

std::string_view language(std::string_view tag) { return tag.substr(0, subtagEnd(tag, 0)); }

// A region is two letters or three digits; a script ("Hans") has four letters.
bool isRegion(std::string_view subtag) {
  const auto all = [subtag](int (*test)(int)) {
    return std::all_of(subtag.begin(), subtag.end(),
                       [test](char c) { return test(static_cast<unsigned char>(c)) != 0; });
  };
  return (subtag.size() == 2 && all(std::isalpha)) || (subtag.size() == 3 && all(std::isdigit));
}

// "zh-Hans-CN" -> "zh-Hans".
std::string_view withoutRegion(std::string_view tag) {
  for (std::size_t end = language(tag).size(); end < tag.size();) {
    const std::size_t begin = end + 1;
    const std::size_t next = subtagEnd(tag, begin);
    if (isRegion(tag.substr(begin, next - begin))) return tag.substr(0, end);
    end = next;
  }
  return tag;
}

}  // namespace

std::vector<std::string> BestLocalizations(const std::vector<std::string>& available,
                                           const std::vector<std::string>& preferred) {
  std::vector<std::string> best;
  const auto add = [&](auto serves) {
    const auto found = std::find_if(available.begin(), available.end(), serves);
    if (found == available.end()) return false;
    if (std::find(best.begin(), best.end(), *found) == best.end()) best.push_back(*found);
    return true;
  };
  for (const std::string& wanted : preferred) {
    if (language(wanted).empty()) continue;
    add([&](const std::string& tag) { return sameTag(tag, wanted); }) ||
        add([&](const std::string& tag) { return sameTag(tag, withoutRegion(wanted)); }) ||
        add([&](const std::string& tag) { return sameTag(language(tag), language(wanted)); });
  }
  if (best.empty() && !available.empty()) best.push_back(available.front());
  return best;
}

}  // namespace tally
