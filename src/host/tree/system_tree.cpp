#include "host/tree/system_tree.h"

#include <dirent.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>

#include "base/natural_order.h"
#include "base/number_text.h"
#include "base/text_lines.h"

namespace tally {
namespace {

constexpr int kMostLinks = 40;  // as many as the kernel follows

// The text of a link; empty if it is not one.
std::string linkText(int root, const std::string& path) {
  std::array<char, PATH_MAX> text;
  const ssize_t length = ::readlinkat(root, path.c_str(), text.data(), text.size());
  return length > 0 ? std::string(text.data(), static_cast<std::size_t>(length)) : std::string();
}

// The path below the root with all links resolved, for kernels that do not do it themselves.
// Empty, with errno, when there are too many.
std::string resolvedBelow(int root, std::string_view path) {
  std::string left(path), resolved;
  int links = 0;
  while (!left.empty()) {
    const std::size_t end = std::min(left.find('/'), left.size());
    const std::string name = left.substr(0, end);
    left.erase(0, std::min(end + 1, left.size()));
    if (name.empty() || name == ".") continue;
    if (name == "..") {
      const std::size_t last = resolved.rfind('/');
      resolved.resize(last == std::string::npos ? 0 : last);
      continue;
    }
    const std::string next = resolved.empty() ? name : resolved + "/" + name;
    const std::string target = linkText(root, next);
    if (target.empty()) {
      resolved = next;
      continue;
    }
    if (++links > kMostLinks) {
      errno = ELOOP;
      return {};
    }
    if (target.front() == '/') resolved.clear();
    left = left.empty() ? target : target + "/" + left;
  }
  return resolved.empty() ? "." : resolved;
}

int openBelow(int root, const std::string& path, int flags) {
  const std::string relative = path.substr(std::min(path.find_first_not_of('/'), path.size()));
  open_how how{};
  how.flags = static_cast<std::uint64_t>(flags | O_CLOEXEC);
  how.resolve = RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS;
  const char* const name = relative.empty() ? "." : relative.c_str();
  const auto opened = static_cast<int>(
      retried([&] { return ::syscall(SYS_openat2, root, name, &how, sizeof how); }));
  if (opened >= 0 || errno != ENOSYS) return opened;
  const std::string resolved = resolvedBelow(root, relative);
  if (resolved.empty()) return -1;
  return retried([&] { return ::openat(root, resolved.c_str(), flags | O_NOFOLLOW | O_CLOEXEC); });
}

std::vector<std::string> namesIn(int directory) {
  std::vector<std::string> names;
  // The listing closes its descriptor.
  DIR* const listing = directory < 0 ? nullptr : ::fdopendir(::dup(directory));
  if (listing == nullptr) return names;
  while (const dirent* entry = ::readdir(listing)) {
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
  }
  ::closedir(listing);
  std::ranges::sort(names, naturalLess);
  return names;
}

}  // namespace

// The samples that a recording holds below /samples: directories named by milliseconds since the
// first one, each with the files that had changed by then.
struct SystemTree::Recording {
  std::vector<std::int64_t> times;  // rising, without that of the first sample
  std::chrono::steady_clock::time_point begin = std::chrono::steady_clock::now();
  std::size_t latest = 0;  // how many of them have been reached

  void advance() {
    const auto elapsed = std::chrono::steady_clock::now() - begin;
    const auto now = std::chrono::duration_cast<std::chrono::milliseconds>(elapsed).count();
    while (latest < times.size() && times[latest] <= now) ++latest;
  }
};

SystemTree::SystemTree(const DeviceRoot& root, bool follow)
    : prefix_(root.prefix()), follow_(follow && !prefix_.empty()) {}
SystemTree::~SystemTree() = default;

int SystemTree::root() const {
  if (!root_) {
    root_ = Descriptor(
        ::open(prefix_.empty() ? "/" : prefix_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  }
  return root_.get();
}

int SystemTree::openAt(const std::string& path, int flags) const {
  if (root() < 0) return -1;
  if (follow_) {
    (void)generation();
    for (std::size_t sample = recording_->latest; sample > 0; --sample) {
      const std::string changed =
          "/samples/" + std::to_string(recording_->times[sample - 1]) + path;
      const int opened = openBelow(root(), changed, flags);
      if (opened >= 0) return opened;
    }
  }
  return openBelow(root(), path, flags);
}

std::size_t SystemTree::generation() const {
  if (!follow_) return 0;
  if (!recording_) {
    recording_ = std::make_unique<Recording>();
    const Descriptor samples(root() < 0 ? -1
                                        : openBelow(root(), "/samples", O_RDONLY | O_DIRECTORY));
    for (const std::string& name : namesIn(samples.get())) {
      if (const auto time = parseInt64(name); time && *time > 0) recording_->times.push_back(*time);
    }
    std::ranges::sort(recording_->times);
  }
  recording_->advance();
  return recording_->latest;
}

Descriptor SystemTree::open(const std::string& path) const {
  Descriptor file(openAt(path, O_RDONLY | O_NONBLOCK | O_NOCTTY));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0) return {};
  if (S_ISREG(status.st_mode)) return file;
  errno = EINVAL;
  return {};
}

std::vector<std::string> SystemTree::list(const std::string& path) const {
  const Descriptor directory(openAt(path, O_RDONLY | O_DIRECTORY));
  return namesIn(directory.get());
}

bool SystemTree::exists(const std::string& path) const {
  return Descriptor(openAt(path, O_PATH)).get() >= 0;
}

std::optional<std::string> SystemTree::text(const std::string& path, std::size_t limit) const {
  const Descriptor file = open(path);
  if (!file) return std::nullopt;
  constexpr std::size_t kFirstPiece = 4096;
  std::string content(std::min(kFirstPiece, limit) + 1, '\0');
  std::size_t length = 0;
  while (true) {
    const ssize_t got = retried(
        [&] { return ::read(file.get(), content.data() + length, content.size() - length); });
    if (got < 0) return std::nullopt;
    length += static_cast<std::size_t>(got);
    if (got == 0 || length > limit) break;
    if (length == content.size()) content.resize(std::min(limit + 1, 2 * length));
  }
  if (length > limit) {
    errno = EFBIG;
    return std::nullopt;
  }
  content.resize(length);
  return std::string(trimmed(content));
}

std::optional<std::int64_t> SystemTree::number(const std::string& path) const {
  const auto content = text(path);
  return content ? parseInt64(*content) : std::nullopt;
}

std::optional<std::string> SystemTree::resolve(const std::string& path) const {
  const Descriptor place(openAt(path, O_PATH));
  if (!place) return std::nullopt;
  const auto pathOf = [](int descriptor) {
    return linkText(AT_FDCWD, "/proc/self/fd/" + std::to_string(descriptor));
  };
  const std::string whole = pathOf(place.get()), top = prefix_.empty() ? "" : pathOf(root());
  if (whole.empty() || !whole.starts_with(top)) return std::nullopt;
  return whole.substr(top.size());
}

}  // namespace tally
