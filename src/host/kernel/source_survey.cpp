#include "host/kernel/source_survey.h"

#include <unistd.h>

#include <cerrno>
#include <set>

#include "host/kernel/source_table.h"

namespace tally {
namespace {

bool isRefused(const SystemTree& tree, const std::string& path) {
  errno = 0;
  const Descriptor file = tree.open(path);
  char byte = 0;
  if (file && retried([&] { return ::read(file.get(), &byte, 1); }) >= 0) return false;
  return errno == EACCES || errno == EPERM;
}

}  // namespace

std::vector<SourceSurvey> surveySources(const SystemTree& tree) {
  std::vector<SourceSurvey> surveys;
  std::string_view name;
  for (const SourceRow& source : sourceTable()) {
    if (source.name != name) surveys.push_back({source.title, 0, 0, ""});
    name = source.name;
    Findings findings;
    if (source.find != nullptr) source.find(tree, findings);
    SourceSurvey& survey = surveys.back();
    survey.channels += findings.channels().size();
    std::set<std::string> asked;
    for (const FoundFile& file : findings.files()) {
      if (!asked.insert(file.path).second || !isRefused(tree, file.path)) continue;
      if (survey.refused++ == 0) survey.example = file.path;
    }
  }
  return surveys;
}

}  // namespace tally
