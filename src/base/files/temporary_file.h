// Files that replace others as a whole.
#pragma once

#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "base/files/directory.h"
#include "base/files/file.h"
#include "base/result.h"

namespace tally {

// A file being written under a temporary name. Unless it gets its name the destructor removes it.
class TemporaryFile {
 public:
  // Makes a new file in the directory that will be called name.
  static Result<TemporaryFile> create(const Directory& directory, std::string_view name,
                                      unsigned mode = 0600);
  TemporaryFile(TemporaryFile&& other) noexcept;
  TemporaryFile& operator=(TemporaryFile&&) = delete;
  ~TemporaryFile();
  // Writes all bytes or fails.
  Status write(std::string_view bytes);
  // fsync, rename to the final name, fsync of the directory.
  Status commit();
  // The three steps of it, for files that are committed together: all contents are durable before
  // the first file gets its name.
  static Status syncAll(std::span<TemporaryFile* const> files);
  Status rename();
  Status syncDirectory() const { return directory_.sync(); }

 private:
  TemporaryFile(Directory directory, std::string name, std::string temporary, Descriptor file)
      : directory_(std::move(directory)),
        name_(std::move(name)),
        temporary_(std::move(temporary)),
        file_(std::move(file)) {}
  Directory directory_;
  std::string name_, temporary_;
  Descriptor file_;
};

// Replaces a file so that, whenever the process or the machine dies, it is the old one or the new
// one. Nothing is left over on failure.
Status writeFileAtomically(const Directory& directory, std::string_view name,
                           std::string_view contents, unsigned mode = 0600);

// True for the names that TemporaryFile gives, so that what a killed run left can be removed.
bool isTemporaryName(std::string_view name);

}  // namespace tally
