// Tables of text with aligned columns.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "tools/frame/output.h"

namespace tally::tools {

enum class Align { Left, Right };

struct Column {
  std::string title;  // a table whose titles are all empty has no title line
  Align align = Align::Left;
  bool shrinks = false;  // shrinks if the terminal is too narrow: its text is wrapped
};

struct Cell {
  Cell(std::string content, Ink colour = Ink::Plain) : text(std::move(content)), ink(colour) {}
  Cell(const char* content) : text(content) {}
  // A bar of a share from 0 to 1: the whole of it is so many columns, or fewer where the terminal
  // is too narrow.
  static Cell bar(double share, std::size_t columns);
  std::string text;  // made printable when it is shown
  Ink ink = Ink::Plain;
  std::optional<double> share;  // of a bar
  std::size_t barColumns = 0;
  bool isNote = false;
};

class Table {
 public:
  explicit Table(std::vector<Column> columns) : columns_(std::move(columns)) {}
  // A row may be shorter than the columns.
  void add(std::vector<Cell> row);
  // A line of its own below the row that was added last, across all columns.
  void addNote(std::string text);
  bool empty() const { return rows_.empty(); }
  // The lines, each after so many blanks. On a terminal that is too narrow, columns that shrink are
  // wrapped, and when that is not enough each row becomes a block of lines. A file gets whole
  // lines.
  std::string render(const Terminal& terminal, std::size_t indent = 2) const;
  void print(const ToolContext& context) const;

 private:
  struct Layout {
    std::vector<std::size_t> widths;
    bool fits;
  };
  Layout layout(const Terminal& terminal, std::size_t indent) const;
  bool hasTitles() const;
  void renderRow(std::string& out, const Terminal& terminal, const std::vector<Cell>& row,
                 const Layout& layout, std::size_t indent) const;
  // A row that does not fit: one cell per line after its title, or cells without titles in
  // sequence.
  void renderTitled(std::string& out, const Terminal& terminal, const std::vector<Cell>& row,
                    std::size_t indent) const;
  static void renderNote(std::string& out, const Terminal& terminal, const Cell& note,
                         std::size_t indent);
  void renderRunning(std::string& out, const Terminal& terminal, const std::vector<Cell>& row,
                     std::size_t indent) const;
  std::vector<Column> columns_;
  std::vector<std::vector<Cell>> rows_;
};

}  // namespace tally::tools
