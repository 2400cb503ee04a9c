#include "host/kernel/source_survey.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <map>

#include "host/kernel/channel_table.h"
#include "host/kernel/source_table.h"

namespace tally {
namespace {

bool isRefusal(int error) { return error == EACCES || error == EPERM; }

// The errno that keeps a file from being read; 0 if nothing does, or if there is no file. That a
// device has no value just now keeps nothing.
int obstacle(const SystemTree& tree, const std::string& path) {
  errno = 0;
  const Descriptor file = tree.open(path);
  if (!file) return errno == ENOENT ? 0 : errno;
  char byte = 0;
  if (retried([&] { return ::read(file.get(), &byte, 1); }) >= 0) return 0;
  return isRefusal(errno) || errno == EOPNOTSUPP ? errno : 0;
}

// A source that finds nothing may have been refused the file in which it looks.
std::vector<std::string> filesOf(const SourceRow& source, const Findings& findings) {
  std::vector<std::string> paths;
  for (const FoundFile& file : findings.files()) paths.push_back(file.path);
  if (source.find == nullptr || !findings.channels().empty()) return paths;
  for (const ChannelRow& row : rowsOf(source.source)) {
    const bool isOne = row.file.starts_with('/') && row.file.find('*') == row.file.npos;
    if (isOne) paths.emplace_back(row.file);
  }
  return paths;
}

void add(UnreadableFiles& files, const std::string& path, int error) {
  if (files.count++ > 0) return;
  files.example = path;
  files.error = error;
}

}  // namespace

std::vector<SourceSurvey> surveySources(const SystemTree& tree) {
  std::vector<SourceSurvey> surveys;
  std::string_view name;
  for (const SourceRow& source : sourceTable()) {
    if (source.name != name) surveys.push_back({source.title, 0, {}, {}});
    name = source.name;
    Findings findings;
    if (source.find != nullptr) source.find(tree, findings);
    SourceSurvey& survey = surveys.back();
    std::map<std::string, int> obstacles;
    for (const std::string& path : filesOf(source, findings)) {
      const auto [known, isNew] = obstacles.try_emplace(path, 0);
      if (!isNew) continue;
      const int error = known->second = obstacle(tree, path);
      if (error != 0) add(isRefusal(error) ? survey.refused : survey.broken, path, error);
    }
    survey.channels += static_cast<std::size_t>(
        std::ranges::count_if(findings.channels(), [&](const FoundChannel& channel) {
          return std::ranges::none_of(channel.slots, [&](const FoundSlot& slot) {
            const int error = obstacles[findings.files()[slot.file].path];
            return error != 0 && !isRefusal(error);
          });
        }));
  }
  return surveys;
}

}  // namespace tally
