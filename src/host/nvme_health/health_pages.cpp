#include "host/nvme_health/health_pages.h"

#include <fcntl.h>
#include <linux/nvme_ioctl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <string>
#include <vector>

#include "base/files/directory.h"
#include "base/files/temporary_file.h"
#include "base/nvme_health_file.h"

namespace tally {
namespace {

// Get Log Page: the 128 words of page 2, of all namespaces.
constexpr std::uint8_t kGetLogPage = 0x02;
constexpr std::uint32_t kAllNamespaces = 0xFFFFFFFF;
constexpr std::uint32_t kHealthPage = 0x007F0002;
static_assert((kHealthPage >> 16) + 1 == kHealthPageSize / 4);
constexpr std::uint32_t kMilliseconds = 5000;

using Page = std::array<char, kHealthPageSize>;

Result<Page> askController(const std::string& name) {
  const std::string path = "/dev/" + name;
  const Descriptor device(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  if (!device) return systemError("cannot open", path);
  struct stat status {};
  if (::fstat(device.get(), &status) != 0) return systemError("cannot examine", path);
  if (!S_ISCHR(status.st_mode)) return systemError("cannot ask", path, ENOTTY);
  Page page{};
  nvme_admin_cmd command{};
  command.opcode = kGetLogPage;
  command.nsid = kAllNamespaces;
  command.addr = reinterpret_cast<std::uintptr_t>(page.data());
  command.data_len = kHealthPageSize;
  command.cdw10 = kHealthPage;
  command.timeout_ms = kMilliseconds;
  const int answer = ::ioctl(device.get(), NVME_IOCTL_ADMIN_CMD, &command);
  if (answer < 0) return systemError("cannot ask", path);
  // A status of the controller, which has no text.
  if (answer > 0) return Error{"cannot ask " + path + ": NVMe status " + std::to_string(answer)};
  return page;
}

std::vector<std::string> controllers() {
  std::vector<std::string> found;
  const auto directory = Directory::open("/sys/class/nvme");
  if (!directory) return found;  // no such disk
  const auto names = directory->list();
  if (!names) return found;
  for (const std::string& name : *names) {
    if (isNvmeController(name)) found.push_back(name);
  }
  return found;
}

// What a controller left that is gone would speak for the next one of its name.
Status removeOthers(const Directory& folder, const std::vector<std::string>& kept) {
  const auto names = folder.list();
  if (!names) return names.error();
  Status all = Done{};
  for (const std::string& name : *names) {
    const bool isPage = name.starts_with(kHealthPagePrefix);
    const std::string controller = isPage ? name.substr(kHealthPagePrefix.size()) : "";
    if (!isPage || std::ranges::count(kept, controller) > 0) continue;
    if (auto removed = folder.remove(name); !removed) all = removed;
  }
  return all;
}

}  // namespace

Status leaveHealthPages() {
  const auto root = Directory::open("/run");
  if (!root) return root.error();
  constexpr std::string_view kName = kHealthPageFolder.substr(kHealthPageFolder.rfind('/') + 1);
  const auto folder = root->makeDirectory(kName);
  if (!folder) return folder.error();
  Status first = Done{};
  std::vector<std::string> answered;
  for (const std::string& controller : controllers()) {
    const auto page = askController(controller);
    const Status left = page ? writeFileAtomically(*folder, healthPageName(controller),
                                                   {page->data(), page->size()}, 0644)
                             : Status(page.error());
    if (left || page) answered.push_back(controller);
    if (!left && first) first = left;
  }
  const Status removed = removeOthers(*folder, answered);
  return first ? removed : first;
}

}  // namespace tally
