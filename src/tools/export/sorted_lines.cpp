#include "tools/export/sorted_lines.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>

namespace tally::tools {
namespace {

// Sorted files of one level that are merged into one of the next: few are open at a time, and each
// line is written as often as there are levels.
constexpr std::size_t kFilesOfLevel = 8;

Error temporaryFileError(int code) {
  return Error{std::string("cannot sort in temporary files: ") + std::strerror(code)};
}

}  // namespace

// A sorted file that is being read.
class SortedLines::Run {
 public:
  explicit Run(File file) : file_(std::move(file)) { std::rewind(file_.get()); }
  // False at the end.
  bool next() {
    std::uint32_t sizes[2];
    if (std::fread(sizes, sizeof sizes, 1, file_.get()) != 1) return false;
    key_.resize(sizes[0]);
    line_.resize(sizes[1]);
    return take(key_) && take(line_);
  }
  bool failed() const { return std::ferror(file_.get()) != 0; }
  const std::string& key() const { return key_; }
  const std::string& line() const { return line_; }

 private:
  bool take(std::string& text) {
    return std::fread(text.data(), 1, text.size(), file_.get()) == text.size();
  }
  File file_;
  std::string key_, line_;
};

std::string_view SortedLines::keyOf(const Entry& entry) const {
  return std::string_view(text_).substr(entry.offset, entry.keySize);
}

void SortedLines::add(std::string_view key, std::string_view line) {
  entries_.push_back({text_.size(), static_cast<std::uint32_t>(key.size()),
                      static_cast<std::uint32_t>(line.size())});
  text_.append(key).append(line);
  if (text_.size() + entries_.size() * sizeof(Entry) > memory_) spill();
}

void SortedLines::clear() {
  text_.clear();
  entries_.clear();
  levels_.clear();
}

void SortedLines::sortEntries() {
  std::stable_sort(entries_.begin(), entries_.end(),
                   [this](const Entry& a, const Entry& b) { return keyOf(a) < keyOf(b); });
}

SortedLines::File SortedLines::makeFile() {
  File file(std::tmpfile(), std::fclose);
  if (!file && status_) status_ = temporaryFileError(errno);
  return file;
}

void SortedLines::write(const File& file, std::string_view key, std::string_view line) {
  const std::uint32_t sizes[] = {static_cast<std::uint32_t>(key.size()),
                                 static_cast<std::uint32_t>(line.size())};
  std::fwrite(sizes, sizeof sizes, 1, file.get());
  std::fwrite(key.data(), 1, key.size(), file.get());
  std::fwrite(line.data(), 1, line.size(), file.get());
}

bool SortedLines::finishFile(const File& file) {
  const bool failed = std::ferror(file.get()) != 0;
  if (std::fflush(file.get()) == 0 && !failed) return true;
  if (status_) status_ = temporaryFileError(errno);
  return false;
}

void SortedLines::spill() {
  if (File file = makeFile(); status_ && file) {
    sortEntries();
    for (const Entry& entry : entries_) {
      write(file, keyOf(entry),
            std::string_view(text_).substr(entry.offset + entry.keySize, entry.lineSize));
    }
    if (finishFile(file)) keep(std::move(file), 0);
  }
  text_.clear();
  entries_.clear();
}

void SortedLines::keep(File file, std::size_t level) {
  if (levels_.size() == level) levels_.emplace_back();
  levels_[level].push_back(std::move(file));
  if (levels_[level].size() < kFilesOfLevel) return;
  File merged = makeFile();
  if (!merged) return;
  merge(std::exchange(levels_[level], {}),
        [&](std::string_view key, std::string_view line) { write(merged, key, line); });
  if (finishFile(merged)) keep(std::move(merged), level + 1);
}

// The files are in the order of their age.
void SortedLines::merge(std::vector<File> files, const Handler& handler) {
  std::vector<std::optional<Run>> runs;
  const auto advance = [&](std::optional<Run>& run) {
    if (run->next()) return;
    if (run->failed() && status_) status_ = temporaryFileError(errno);
    run.reset();
  };
  for (File& file : files) advance(runs.emplace_back(std::in_place, std::move(file)));
  for (;;) {
    std::optional<Run>* least = nullptr;
    for (auto& run : runs) {
      if (run && (least == nullptr || run->key() < (*least)->key())) least = &run;
    }
    if (least == nullptr) return;
    handler((*least)->key(), (*least)->line());
    advance(*least);
  }
}

Status SortedLines::each(const Handler& handler) {
  if (levels_.empty() && status_) {
    sortEntries();
    for (const Entry& entry : entries_) {
      handler(keyOf(entry),
              std::string_view(text_).substr(entry.offset + entry.keySize, entry.lineSize));
    }
  } else {
    spill();
    std::vector<File> files;
    for (auto level = levels_.rbegin(); level != levels_.rend(); ++level) {
      for (File& file : *level) files.push_back(std::move(file));
    }
    if (status_) merge(std::move(files), handler);
  }
  clear();
  return status_;
}

}  // namespace tally::tools
