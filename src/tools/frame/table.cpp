#include "tools/frame/table.h"

#include <algorithm>

#include "base/printable.h"

namespace tally::tools {
namespace {

constexpr std::size_t kGap = 2;
constexpr std::size_t kNarrowestText = 12, kNarrowestBar = 6;  // of a column that shrinks

std::size_t widthOf(const Cell& cell) {
  return cell.share ? cell.barColumns : displayWidth(cell.text);
}

// The lines of a cell in a column; more than one only where the text is wider than the column.
std::vector<std::string> linesOf(const Cell& cell, const Terminal& terminal, std::size_t width) {
  if (cell.share) return {bar(terminal, *cell.share, std::min(width, cell.barColumns))};
  return displayWidth(cell.text) <= width ? std::vector{cell.text} : wrapped(cell.text, width);
}

}  // namespace

Cell Cell::bar(double share, std::size_t columns) {
  Cell cell("");
  cell.share = share;
  cell.barColumns = columns;
  return cell;
}

void Table::add(std::vector<Cell> row) {
  for (Cell& cell : row) cell.text = printable(cell.text);
  rows_.push_back(std::move(row));
}

void Table::addNote(std::string text) {
  Cell note(printable(text), Ink::Faint);
  note.isNote = true;
  rows_.push_back({std::move(note)});
}

bool Table::hasTitles() const {
  return std::ranges::any_of(columns_, [](const Column& column) { return !column.title.empty(); });
}

Table::Layout Table::layout(const Terminal& terminal, std::size_t indent) const {
  Layout layout{{}, true};
  std::vector<std::size_t> least;
  for (const Column& column : columns_) {
    layout.widths.push_back(displayWidth(column.title));
    least.push_back(column.shrinks ? kNarrowestText : SIZE_MAX);
  }
  for (const auto& row : rows_) {
    for (std::size_t i = 0; i < row.size() && !row[i].isNote; ++i) {
      layout.widths[i] = std::max(layout.widths[i], widthOf(row[i]));
      if (row[i].share) least[i] = kNarrowestBar;
    }
  }
  if (!terminal.interactive || layout.widths.empty()) return layout;
  std::size_t total = indent + kGap * (layout.widths.size() - 1);
  for (const std::size_t width : layout.widths) total += width;
  // The widest gives way first.
  for (; total > terminal.columns; --total) {
    std::size_t widest = layout.widths.size();
    for (std::size_t i = 0; i < layout.widths.size(); ++i) {
      if (layout.widths[i] <= least[i]) continue;
      if (widest == layout.widths.size() || layout.widths[i] > layout.widths[widest]) widest = i;
    }
    if (widest == layout.widths.size()) break;
    --layout.widths[widest];
  }
  layout.fits = total <= terminal.columns;
  return layout;
}

void Table::renderRow(std::string& out, const Terminal& terminal, const std::vector<Cell>& row,
                      const Layout& layout, std::size_t indent) const {
  std::vector<std::vector<std::string>> cells;
  std::size_t height = 1;
  for (std::size_t i = 0; i < row.size(); ++i) {
    cells.push_back(linesOf(row[i], terminal, layout.widths[i]));
    height = std::max(height, cells.back().size());
  }
  for (std::size_t line = 0; line < height; ++line) {
    out.append(indent, ' ');
    std::size_t owed = 0;  // blanks that are written only when something follows
    for (std::size_t i = 0; i < cells.size(); ++i) {
      const std::string text = line < cells[i].size() ? cells[i][line] : "";
      const std::size_t width = layout.widths[i];
      const std::size_t pad = width - std::min(width, displayWidth(text));
      if (columns_[i].align == Align::Right) owed += pad;
      if (!text.empty()) {
        out.append(owed, ' ').append(inked(terminal, row[i].ink, text));
        owed = 0;
      }
      if (columns_[i].align == Align::Left) owed += pad;
      owed += kGap;
    }
    out += '\n';
  }
}

void Table::renderTitled(std::string& out, const Terminal& terminal, const std::vector<Cell>& row,
                         std::size_t indent) const {
  std::size_t titles = 0;
  for (std::size_t i = 1; i < columns_.size(); ++i) {
    titles = std::max(titles, displayWidth(columns_[i].title));
  }
  for (std::size_t i = 0; i < row.size(); ++i) {
    const Cell& cell = row[i];
    if (cell.text.empty() && !(cell.share.value_or(0) > 0)) continue;
    std::size_t left = i == 0 ? indent : indent + kGap;
    out.append(left, ' ');
    if (i > 0) {
      std::string label = columns_[i].title;
      label.append(titles + kGap - displayWidth(label), ' ');
      left += titles + kGap;
      out += inked(terminal, Ink::Faint, label);
    }
    const auto lines = linesOf(cell, terminal, terminal.columns - left);
    for (std::size_t line = 0; line < lines.size(); ++line) {
      if (line > 0) out.append(left, ' ');
      out.append(inked(terminal, cell.ink, lines[line])) += '\n';
    }
  }
}

void Table::renderRunning(std::string& out, const Terminal& terminal, const std::vector<Cell>& row,
                          std::size_t indent) const {
  const std::size_t next = indent + kGap;  // where what does not fit goes on
  const auto begin = [&out](std::size_t blanks) {
    out.append(blanks, ' ');
    return blanks;
  };
  std::size_t taken = 0;  // of the line that is being written
  for (const Cell& cell : row) {
    const std::size_t width = widthOf(cell);
    if (width == 0) continue;
    if (taken == 0) {
      taken = begin(indent);
    } else if (taken + kGap + width <= terminal.columns) {
      taken += begin(kGap);
    } else {
      out += '\n';
      taken = begin(next);
    }
    const auto lines = linesOf(cell, terminal, terminal.columns - std::max(taken, next));
    for (std::size_t line = 0; line < lines.size(); ++line) {
      if (line > 0) {
        out += '\n';
        taken = begin(next);
      }
      out += inked(terminal, cell.ink, lines[line]);
    }
    taken += displayWidth(lines.back());
  }
  out += '\n';
}

void Table::renderNote(std::string& out, const Terminal& terminal, const Cell& note,
                       std::size_t indent) {
  const auto lines =
      terminal.interactive ? wrapped(note.text, terminal.columns - indent) : std::vector{note.text};
  for (const std::string& line : lines) {
    out.append(indent, ' ').append(inked(terminal, note.ink, line)) += '\n';
  }
}

std::string Table::render(const Terminal& terminal, std::size_t indent) const {
  const Layout layout = this->layout(terminal, indent);
  std::string out;
  if (hasTitles() && layout.fits) {
    std::vector<Cell> titles;
    for (const Column& column : columns_) titles.emplace_back(column.title, Ink::Faint);
    renderRow(out, terminal, titles, layout, indent);
  }
  for (const auto& row : rows_) {
    if (!row.empty() && row.front().isNote) {
      renderNote(out, terminal, row.front(), indent + kGap);
    } else if (layout.fits) {
      renderRow(out, terminal, row, layout, indent);
    } else if (hasTitles()) {
      renderTitled(out, terminal, row, indent);
    } else {
      renderRunning(out, terminal, row, indent);
    }
  }
  return out;
}

void Table::print(const ToolContext& context) const {
  tools::print(context.out, render(context.output));
}

}  // namespace tally::tools
