// Tables of text with aligned columns.
#pragma once

#include <string>
#include <vector>

#include "tools/output.h"

namespace tally::tools {

enum class Align { Left, Right };

struct Column {
  std::string title;  // a table whose titles are all empty has no title line
  Align align = Align::Left;
  bool shrinks = false;  // gives way when the terminal is too narrow
};

struct Cell {
  Cell(std::string content, Ink colour = Ink::Plain) : text(std::move(content)), ink(colour) {}
  Cell(const char* content) : text(content) {}
  std::string text;  // made printable when it is shown
  Ink ink = Ink::Plain;
};

class Table {
 public:
  explicit Table(std::vector<Column> columns) : columns_(std::move(columns)) {}
  // A row may be shorter than the columns.
  void add(std::vector<Cell> row);
  bool empty() const { return rows_.empty(); }
  // The lines, each behind so many blanks. Columns that shrink are cut to the terminal's width, but
  // never in a file, where nothing may be lost.
  std::string render(const Terminal& terminal, std::size_t indent = 2) const;
  void print(const ToolContext& context) const;

 private:
  std::vector<std::size_t> widths(const Terminal& terminal, std::size_t indent) const;
  std::vector<Column> columns_;
  std::vector<std::vector<Cell>> rows_;
};

}  // namespace tally::tools
