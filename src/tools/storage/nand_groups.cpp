#include "tools/storage/nand_groups.h"

#include <algorithm>

#include "base/number_text.h"
#include "storage/nand_info/figure_groups.h"

namespace tally::tools {
namespace {

// A name that ends in a number, and the number.
struct Numbered {
  std::string_view base;
  std::int64_t number;
};
std::optional<Numbered> numberedName(std::string_view name) {
  const std::size_t start = name.find_last_not_of("0123456789") + 1;
  const auto number = parseInt64(name.substr(start));
  if (!number) return std::nullopt;
  return Numbered{name.substr(0, start), *number};
}

// The figures of a group in their order; consecutive numbered ones join one family.
void addFigure(std::vector<NandFigure>& figures, std::string_view name, std::int64_t value) {
  const auto numbered = numberedName(name);
  if (numbered) {
    for (NandFigure& figure : figures) {
      const auto former = figure.first ? std::nullopt : numberedName(figure.name);
      const std::string_view base = former ? former->base : std::string_view(figure.name);
      const std::int64_t first = figure.first.value_or(former ? former->number : -1);
      const auto next = first + static_cast<std::int64_t>(figure.values.size());
      if (first < 0 || base != numbered->base || next != numbered->number) continue;
      figure.first = first;
      figure.name = std::string(numbered->base);
      figure.values.push_back(value);
      return;
    }
  }
  figures.push_back({std::string(name), {value}});
}

}  // namespace

std::vector<NandGroup> groupNandInfo(const KvDictionary& info, std::string_view text) {
  std::vector<NandGroup> groups;
  groups.reserve(std::size(kFigureGroups) + 1);
  for (const FigureGroupTitle& group : kFigureGroups) groups.push_back({group.title, {}});
  for (const auto& [key, value] : info) {
    const auto* number = kvCast<KvNumber>(value.get());
    if (number == nullptr || key->view().find(text) == std::string_view::npos) continue;
    const FigureGroup group = figureGroup(key->view());
    const auto place = std::ranges::find(kFigureGroups, group, &FigureGroupTitle::group);
    std::string_view name = key->view();
    if (name.starts_with(kNandPrefix)) name.remove_prefix(kNandPrefix.size());
    addFigure(groups[static_cast<std::size_t>(place - kFigureGroups.begin())].figures, name,
              number->asInt64());
  }
  std::erase_if(groups, [](const NandGroup& group) { return group.figures.empty(); });
  return groups;
}

}  // namespace tally::tools
