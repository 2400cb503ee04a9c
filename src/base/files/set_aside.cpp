#include "base/files/set_aside.h"

#include <cerrno>

namespace tally {

Result<std::string> setAside(const Directory& directory, std::string_view name,
                             std::string_view word, std::uint32_t most) {
  const std::string stem = std::string(name) + asideMark(word);
  for (std::uint32_t number = 1; number <= most; ++number) {
    std::string aside = stem + std::to_string(number);
    const auto renamed = directory.renameToNew(name, aside);
    if (renamed) return aside;
    if (renamed.error().systemError != EEXIST) return renamed.error();
  }
  return Error{"as many as " + std::to_string(most) + " files like " + directory.pathOf(name) +
                   " are set aside already",
               EEXIST};
}

}  // namespace tally
