#include "base/files/temporary_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>

namespace tally {
namespace {

constexpr std::string_view kTemporaryMark = ".tmp~";

}  // namespace

Result<TemporaryFile> TemporaryFile::create(const Directory& directory, std::string_view name,
                                            unsigned mode) {
  static std::atomic<unsigned> counter{0};
  std::string temporary = std::string(name) + std::string(kTemporaryMark) +
                          std::to_string(::getpid()) + "." + std::to_string(counter.fetch_add(1));
  auto file = directory.create(temporary, mode);
  if (!file && file.error().systemError == EEXIST) {
    // Left by a killed run that had the same process number.
    (void)directory.remove(temporary);
    file = directory.create(temporary, mode);
  }
  if (!file) return file.error();
  return TemporaryFile(directory, std::string(name), std::move(temporary), *std::move(file));
}

TemporaryFile::TemporaryFile(TemporaryFile&& other) noexcept
    : directory_(std::move(other.directory_)),
      name_(std::move(other.name_)),
      temporary_(std::exchange(other.temporary_, {})),
      file_(std::move(other.file_)) {}

TemporaryFile::~TemporaryFile() {
  if (!temporary_.empty()) (void)directory_.remove(temporary_);
}

Status TemporaryFile::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const auto count = retried([&] { return ::write(file_.get(), bytes.data(), bytes.size()); });
    if (count < 0) {
      return Error{"cannot write " + directory_.pathOf(temporary_) + ": " + std::strerror(errno),
                   errno};
    }
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return Done{};
}

// A file system with a journal writes it once for all files whose blocks have been chosen by then,
// and each fsync() would only choose those of its own file.
Status TemporaryFile::syncAll(std::span<TemporaryFile* const> files) {
  if (files.size() > 1) {
    for (const TemporaryFile* file : files) {
      (void)::sync_file_range(file->file_.get(), 0, 0, SYNC_FILE_RANGE_WRITE);  // a hint
    }
  }
  for (TemporaryFile* file : files) {
    const auto failure = [file](std::string_view what) {
      const int code = errno;
      return Error{std::string(what) + " " + file->directory_.pathOf(file->temporary_) + ": " +
                       std::strerror(code),
                   code};
    };
    if (retried([&] { return ::fsync(file->file_.get()); }) != 0) return failure("cannot sync");
    if (file->file_.close() != 0) return failure("cannot close");
  }
  return Done{};
}

Status TemporaryFile::rename() {
  if (auto renamed = directory_.rename(temporary_, name_); !renamed) return renamed;
  temporary_.clear();
  return Done{};
}

Status TemporaryFile::commit() {
  TemporaryFile* const self[] = {this};
  if (auto synced = syncAll(self); !synced) return synced;
  if (auto renamed = rename(); !renamed) return renamed;
  return syncDirectory();
}

Status writeFileAtomically(const Directory& directory, std::string_view name,
                           std::string_view contents, unsigned mode) {
  auto file = TemporaryFile::create(directory, name, mode);
  if (!file) return file.error();
  if (auto written = file->write(contents); !written) return written;
  return file->commit();
}

bool isTemporaryName(std::string_view name) {
  return name.find(kTemporaryMark) != std::string_view::npos;
}

}  // namespace tally
