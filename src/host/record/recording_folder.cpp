#include "host/record/recording_folder.h"

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <utility>
#include <vector>

#include "base/files/directory.h"

namespace tally {
namespace {

struct Place {
  std::string parent, name;
};

Place placeOf(std::string path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos) return {".", path};
  return {slash == 0 ? "/" : path.substr(0, slash), path.substr(slash + 1)};
}

std::string incomplete(const std::string& name) { return name + ".incomplete"; }

// Makes directories one below the other, and keeps those open that lead to the latest.
class DirectoryPath {
 public:
  explicit DirectoryPath(Directory top) : open_{{"", std::move(top)}} {}

  Result<Directory> make(std::string_view path) {
    std::vector<std::string> names;
    for (std::size_t end = 0; !path.empty(); path.remove_prefix(std::min(end + 1, path.size()))) {
      end = std::min(path.find('/'), path.size());
      if (end > 0) names.emplace_back(path.substr(0, end));
    }
    std::size_t same = 0;
    while (same < names.size() && same + 1 < open_.size() && open_[same + 1].first == names[same]) {
      ++same;
    }
    open_.resize(same + 1, open_.front());
    for (; same < names.size(); ++same) {
      if (!isSafeFileName(names[same])) {
        return Error{"cannot make " + open_.back().second.pathOf(names[same]), EINVAL};
      }
      auto made = open_.back().second.makeDirectory(names[same]);
      if (!made) return made;
      open_.emplace_back(names[same], *made);
    }
    return open_.back().second;
  }

 private:
  std::vector<std::pair<std::string, Directory>> open_;
};

Status writeEntry(DirectoryPath& directories, const std::string& path, const RecordedEntry& entry) {
  using Type = TreeEntry::Type;
  const std::size_t slash = path.rfind('/');
  const auto directory =
      directories.make(entry.type == Type::Directory ? path : path.substr(0, slash));
  if (!directory) return directory.error();
  if (entry.type == Type::Directory) return Done{};
  const std::string name = path.substr(slash + 1);
  if (!isSafeFileName(name)) return Error{"cannot make " + directory->pathOf(name), EINVAL};
  if (entry.type == Type::Link) return directory->makeLink(entry.text, name);
  return directory->writeNew(name, entry.text);
}

Status writeAll(const RecordedTree& recorded, const Directory& top) {
  DirectoryPath directories(top);
  for (const auto& [path, entry] : recorded.entries) {
    if (auto written = writeEntry(directories, path, entry); !written) return written;
  }
  for (const auto& [milliseconds, files] : recorded.samples) {
    const std::string folder = "/samples/" + std::to_string(milliseconds);
    for (const auto& [path, content] : files) {
      auto written = writeEntry(directories, folder + path, {TreeEntry::Type::File, content});
      if (!written) return written;
    }
  }
  return top.syncVolume();
}

}  // namespace

Status checkRecordingFolder(const std::string& path) {
  const Place place = placeOf(path);
  if (!isSafeFileName(place.name)) return Error{path + " is not the name of a new directory"};
  const auto parent = Directory::open(place.parent);
  if (!parent) return parent.error();
  if (parent->identity(incomplete(place.name))) {
    return Error{parent->pathOf(incomplete(place.name)) +
                 " was left by a recording that was stopped; remove it"};
  }
  if (!parent->identity(place.name)) return Done{};
  const auto there = parent->openDirectory(place.name);
  const auto names = there ? there->list() : there.error();
  if (!names) return names.error();
  return names->empty() ? Status(Done{}) : Error{path + " is not empty"};
}

Status writeRecording(const RecordedTree& recorded, const std::string& path) {
  const Place place = placeOf(path);
  const auto parent = Directory::open(place.parent);
  if (!parent) return parent.error();
  const std::string temporary = incomplete(place.name);
  const auto top = parent->makeDirectory(temporary);
  auto written = top ? writeAll(recorded, *top) : Status(top.error());
  if (written) written = parent->rename(temporary, place.name);
  if (written) return parent->sync();
  if (auto removed = parent->removeTree(temporary); !removed) {
    return Error{written.error().message + "; " + removed.error().message,
                 written.error().systemError};
  }
  return written;
}

}  // namespace tally
