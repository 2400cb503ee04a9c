#include "faults/disk.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <random>
#include <utility>
#include <vector>

namespace tally::faults {
namespace {

namespace fs = std::filesystem;

struct Contents {
  int file = -1;  // stays open: the store's locks end when any descriptor of its file is closed
  bool changed = false;
  std::string synced;
};

struct Change {
  NameChange::Kind kind;
  std::string name, to;
  std::string kept;  // what was removed or replaced
};

struct Disk {
  std::string folder, kept;
  std::map<ino_t, Contents> contents;
  std::map<std::string, std::vector<Change>> names;  // by directory, those that are not synced
  int filesKept = 0;
};
Disk* disk = nullptr;

using Random = std::mt19937;

void require(bool holds) {
  if (!holds) std::abort();
}

bool isFollowed(const std::string& path) {
  return disk != nullptr && path.starts_with(disk->folder);
}

std::string contentsOf(int file) {
  std::string bytes(
      static_cast<std::size_t>(fs::file_size("/proc/self/fd/" + std::to_string(file))), '\0');
  require(::pread(file, bytes.data(), bytes.size(), 0) == std::ssize(bytes));
  return bytes;
}

// Some pieces of what was written and the rest of what was there.
std::string mixed(const std::string& synced, const std::string& written, Random& random) {
  constexpr std::size_t kPiece = 64;
  std::string bytes(random() % 2 == 0 ? written.size() : (synced.size() + written.size()) / 2,
                    '\0');
  for (std::size_t begin = 0; begin < bytes.size(); begin += kPiece) {
    const std::string& from = random() % 2 == 0 ? synced : written;
    const std::size_t end = std::min({begin + kPiece, bytes.size(), from.size()});
    for (std::size_t i = begin; i < end; ++i) bytes[i] = from[i];
  }
  return bytes;
}

std::string arrived(const Contents& contents, Loss loss, Random& random) {
  const auto fate = loss == Loss::AtRandom ? random() % 3 : 0;
  if (fate == 0) return contents.synced;
  std::string written = contentsOf(contents.file);
  return fate == 1 ? written : mixed(contents.synced, written, random);
}

// What fails is in a directory that is gone itself.
void undo(const fs::path& directory, const Change& change) {
  std::error_code gone;
  switch (change.kind) {
    case NameChange::Kind::Create:
      fs::remove_all(directory / change.name, gone);
      return;
    case NameChange::Kind::Rename:
      fs::rename(directory / change.to, directory / change.name, gone);
      if (!change.kept.empty()) fs::rename(change.kept, directory / change.to, gone);
      return;
    case NameChange::Kind::Remove:
      fs::rename(change.kept, directory / change.name, gone);
  }
}

}  // namespace

void followDisk(const std::string& folder, const std::string& kept) {
  fs::remove_all(kept);
  fs::create_directory(kept);
  disk = new Disk{folder, kept, {}, {}, 0};
}

void contentsChange(const std::string& path) {
  if (!isFollowed(path)) return;
  struct stat status {};
  require(::stat(path.c_str(), &status) == 0);
  Contents& contents = disk->contents[status.st_ino];
  if (contents.changed) return;
  if (contents.file < 0) contents.file = ::open(path.c_str(), O_RDWR | O_CLOEXEC);
  contents.synced = contentsOf(contents.file);
  contents.changed = true;
}

void contentsSynced(const std::string& path) {
  struct stat status {};
  if (!isFollowed(path) || ::stat(path.c_str(), &status) != 0) return;
  const auto found = disk->contents.find(status.st_ino);
  if (found != disk->contents.end()) found->second.changed = false;
}

NameChange::NameChange(Kind kind, const std::string& path, const std::string& to)
    : kind_(kind), path_(path), to_(to) {
  if (!isFollowed(path)) return;
  const bool exists = fs::exists(fs::symlink_status(path));
  matters_ = exists == (kind != Kind::Create);
  const std::string& lost = kind == Kind::Rename ? to : path;
  if (kind == Kind::Create || !matters_ || !fs::exists(lost)) return;
  kept_ = disk->kept + "/" + std::to_string(disk->filesKept++);
  fs::create_hard_link(lost, kept_);
}

int NameChange::done(int result) const {
  if (!matters_ || result < 0) return result;
  const fs::path path(path_), to(to_);
  require(kind_ != Kind::Rename || to.parent_path() == path.parent_path());
  disk->names[path.parent_path().native()].push_back(
      {kind_, path.filename().native(), to.filename().native(), kept_});
  return result;
}

void namesSynced(const std::string& directory) {
  if (isFollowed(directory)) disk->names.erase(directory);
}

void cutPower(Loss loss, unsigned seed) {
  const Disk left = *std::exchange(disk, nullptr);  // changes made here are no longer recorded
  Random random(seed);
  for (const auto& [inode, contents] : left.contents) {
    if (!contents.changed) continue;
    const std::string bytes = arrived(contents, loss, random);
    require(::ftruncate(contents.file, 0) == 0 &&
            ::pwrite(contents.file, bytes.data(), bytes.size(), 0) == std::ssize(bytes));
  }
  for (const auto& [directory, changes] : left.names) {
    const std::size_t arrive = loss == Loss::Everything ? 0
                               : loss == Loss::Contents ? changes.size()
                                                        : random() % (changes.size() + 1);
    for (std::size_t i = changes.size(); i > arrive; --i) undo(directory, changes[i - 1]);
  }
  fs::remove_all(left.kept);
}

}  // namespace tally::faults
