// Lines in the order of their keys, however many: what does not fit into memory goes to temporary
// files without names.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"

namespace tally::tools {

class SortedLines {
 public:
  explicit SortedLines(std::size_t memory = std::size_t{8} << 20) : memory_(memory) {}
  // Keys are ordered by their bytes. What fails here is reported by each().
  void add(std::string_view key, std::string_view line);
  // Forgets all lines.
  void clear();
  // Hands over all lines in ascending order of their keys, lines of the same key as they were
  // added, and forgets them.
  using Handler = std::function<void(std::string_view key, std::string_view line)>;
  Status each(const Handler& handler);

 private:
  struct Entry {
    std::size_t offset;
    std::uint32_t keySize, lineSize;
  };
  using File = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;
  class Run;

  void sortEntries();
  std::string_view keyOf(const Entry& entry) const;
  void spill();
  void keep(File file, std::size_t level);
  File makeFile();
  void write(const File& file, std::string_view key, std::string_view line);
  bool finishFile(const File& file);
  void merge(std::vector<File> files, const Handler& handler);

  const std::size_t memory_;
  std::string text_;  // keys and lines, in the order of their addition
  std::vector<Entry> entries_;
  std::vector<std::vector<File>>
      levels_;  // sorted files; each level's are older than the one below
  Status status_ = Done{};
};

}  // namespace tally::tools
