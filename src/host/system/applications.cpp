#include "host/system/applications.h"

#include <algorithm>
#include <cerrno>
#include <set>

#include "base/text_lines.h"

namespace tally {
namespace {

constexpr std::size_t kLargestEntry = 1u << 20;
constexpr int kDeepestFolder = 8;
constexpr std::string_view kEntrySuffix = ".desktop";

// Calls handler(id, path) for every entry of a directory; the path is below it, an id is the path
// with '-' for '/'.
template <class Handler>
void eachEntry(const Directory& directory, const std::string& path, int depth,
               const Handler& handler) {
  const auto names = directory.list();
  if (!names) return;
  for (const std::string& name : *names) {
    if (name.ends_with(kEntrySuffix)) {
      std::string id = path + name;
      std::ranges::replace(id, '/', '-');
      handler(id, path + name);
    } else if (depth < kDeepestFolder) {
      if (const auto below = directory.openDirectory(name)) {
        eachEntry(*below, path + name + "/", depth + 1, handler);
      }
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

std::vector<ApplicationFolder> applicationFolders(const DeviceRoot& root,
                                                  const std::string& dataHome) {
  std::vector<ApplicationFolder> folders;
  const auto addUser = [&folders, &root](const std::string& data) {
    folders.push_back({{root, data + "/applications"}, UserAppType});
    folders.push_back({{root, data + "/flatpak/exports/share/applications"}, UserAppType});
  };
  const std::string mobile = "/var/mobile/.local/share";
  addUser(mobile);
  if (!dataHome.empty() && dataHome != mobile) addUser(dataHome);
  folders.push_back({{root, "/var/lib/flatpak/exports/share/applications"}, UserAppType});
  folders.push_back({{root, "/usr/local/share/applications"}, SystemAppType});
  folders.push_back({{root, "/usr/share/applications"}, SystemAppType});
  return folders;
}

void DesktopAppRegistry::enumerateBundles(int kind,
                                          const std::function<void(std::string_view)>& handler) {
  if (kind != kBundleKindApplication) return;
  if (const auto* described = description_->getAs<KvArray>(Described::Applications)) {
    for (const auto& item : *described) {
      if (const auto* type = kvCast<KvString>(item.get())) {
        handler(type->view());
      } else {
        description_->reportEntry(Described::Applications,
                                  "contains an item that is not a bundle type");
      }
    }
    return;
  }
  std::set<std::string> seen;
  for (const ApplicationFolder& folder : folders_) {
    const auto directory = folder.directory.open();
    if (!directory) continue;
    eachEntry(*directory, "", 0, [&](const std::string& id, const std::string& path) {
      // A hidden entry of the user still hides the system's.
      if (!seen.insert(id).second) return;
      const auto entry = folder.directory.readFile(path, kLargestEntry);
      // What is exported for a user are links, which are not followed in a user's directory; only
      // applications are exported.
      const bool exported = !entry && entry.error().systemError == ELOOP;
      if (exported || (entry && isVisibleApplication(*entry))) handler(folder.bundleType);
    });
  }
}

}  // namespace tally
