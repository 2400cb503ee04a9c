#include "tools/table.h"

#include <algorithm>

#include "base/printable.h"

namespace tally::tools {
namespace {

constexpr std::size_t kGap = 2;
constexpr std::size_t kNarrowest = 12;  // of a column that shrinks

}  // namespace

void Table::add(std::vector<Cell> row) {
  for (Cell& cell : row) cell.text = printable(cell.text);
  rows_.push_back(std::move(row));
}

std::vector<std::size_t> Table::widths(const Terminal& terminal, std::size_t indent) const {
  std::vector<std::size_t> widths;
  for (const Column& column : columns_) widths.push_back(displayWidth(column.title));
  for (const auto& row : rows_) {
    for (std::size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], displayWidth(row[i].text));
    }
  }
  if (!terminal.interactive) return widths;
  std::size_t total = indent + kGap * (widths.size() - 1);
  for (const std::size_t width : widths) total += width;
  // The widest gives way first.
  while (total > terminal.columns) {
    std::size_t widest = widths.size();
    for (std::size_t i = 0; i < widths.size(); ++i) {
      const bool canShrink = columns_[i].shrinks && widths[i] > kNarrowest;
      if (canShrink && (widest == widths.size() || widths[i] > widths[widest])) widest = i;
    }
    if (widest == widths.size()) break;
    --widths[widest];
    --total;
  }
  return widths;
}

std::string Table::render(const Terminal& terminal, std::size_t indent) const {
  const auto width = widths(terminal, indent);
  const std::string_view mark = terminal.unicode ? "…" : "~";
  std::string out;
  const auto line = [&](const auto& textOf, std::size_t count) {
    std::string text(indent, ' ');
    std::size_t owed = 0;  // blanks that are written only when something follows
    for (std::size_t i = 0; i < count; ++i) {
      const Cell cell = textOf(i);
      const std::string shown = fitted(cell.text, width[i], mark);
      const std::size_t pad = width[i] - std::min(width[i], displayWidth(shown));
      if (columns_[i].align == Align::Right) owed += pad;
      if (!shown.empty()) {
        text.append(owed, ' ').append(inked(terminal, cell.ink, shown));
        owed = 0;
      }
      if (columns_[i].align == Align::Left) owed += pad;
      owed += kGap;
    }
    out += text + "\n";
  };
  const bool titled = std::any_of(columns_.begin(), columns_.end(),
                                  [](const Column& column) { return !column.title.empty(); });
  if (titled) {
    line([&](std::size_t i) { return Cell(columns_[i].title, Ink::Faint); }, columns_.size());
  }
  for (const auto& row : rows_) line([&](std::size_t i) { return row[i]; }, row.size());
  return out;
}

void Table::print(const ToolContext& context) const {
  tools::print(context.out, render(context.output));
}

}  // namespace tally::tools
