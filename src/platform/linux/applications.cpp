#include "platform/linux/applications.h"

#include <sys/stat.h>

#include <algorithm>
#include <set>

#include "base/file.h"
#include "platform/linux/text_lines.h"

namespace tally {
namespace {

constexpr std::size_t kLargestEntry = 1u << 20;
constexpr int kDeepestFolder = 8;
constexpr std::string_view kEntrySuffix = ".desktop";

bool isFolder(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

// Calls handler(id, path) for every entry of a folder; an id is the path below it with '-' for '/'.
template <class Handler>
void eachEntry(const std::string& folder, const std::string& idPrefix, int depth,
               const Handler& handler) {
  const auto names = listFolder(folder);
  if (!names) return;
  for (const std::string& name : *names) {
    const std::string path = folder + "/" + name;
    if (name.ends_with(kEntrySuffix)) {
      handler(idPrefix + name, path);
    } else if (depth < kDeepestFolder && isFolder(path)) {
      eachEntry(path, idPrefix + name + "-", depth + 1, handler);
    }
  }
}

}  // namespace

bool isVisibleApplication(std::string_view desktopEntry) {
  bool inEntry = false, application = false, hidden = false, noDisplay = false;
  eachLine(desktopEntry, [&](std::string_view whole) {
    const std::string_view line = trimmed(whole);
    if (line.starts_with('[')) inEntry = line == "[Desktop Entry]";
    const std::size_t equals = line.find('=');
    if (!inEntry || line.starts_with('#') || equals == std::string_view::npos) return;
    const std::string_view key = trimmed(line.substr(0, equals));
    const std::string_view value = trimmed(line.substr(equals + 1));
    if (key == "Type") application = value == "Application";
    if (key == "Hidden") hidden = value == "true";
    if (key == "NoDisplay") noDisplay = value == "true";
  });
  return application && !hidden && !noDisplay;
}

std::vector<ApplicationFolder> applicationFolders(const std::string& prefix,
                                                  const std::string& dataHome) {
  std::vector<ApplicationFolder> folders;
  const auto addUser = [&folders](const std::string& data) {
    folders.push_back({data + "/applications", UserAppType});
    folders.push_back({data + "/flatpak/exports/share/applications", UserAppType});
  };
  const std::string mobile = prefix + "/var/mobile/.local/share";
  addUser(mobile);
  if (!dataHome.empty() && dataHome != mobile) addUser(dataHome);
  folders.push_back({prefix + "/var/lib/flatpak/exports/share/applications", UserAppType});
  folders.push_back({prefix + "/usr/local/share/applications", SystemAppType});
  folders.push_back({prefix + "/usr/share/applications", SystemAppType});
  return folders;
}

void DesktopAppRegistry::enumerateBundles(int kind,
                                          const std::function<void(std::string_view)>& handler) {
  if (kind != kBundleKindApplication) return;
  if (const auto* described = description_->getAs<KvArray>("Applications")) {
    for (const auto& item : *described) {
      if (const auto* type = kvCast<KvString>(item.get())) {
        handler(type->view());
      } else {
        description_->reportEntry("Applications", "holds what is not a bundle type");
      }
    }
    return;
  }
  std::set<std::string> seen;
  for (const ApplicationFolder& folder : folders_) {
    eachEntry(folder.path, "", 0, [&](const std::string& id, const std::string& path) {
      // A hidden entry of the user still hides the system's.
      if (!seen.insert(id).second) return;
      const auto entry = readFile(path, kLargestEntry);
      if (entry && isVisibleApplication(*entry)) handler(folder.bundleType);
    });
  }
}

}  // namespace tally
