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
  // A link that leads up fails while anything on the machine is renamed, unless it is tried again.
  constexpr int kTries = 8;
  for (int i = 0; i < kTries; ++i) {
    const auto opened = static_cast<int>(
        retried([&] { return ::syscall(SYS_openat2, root, name, &how, sizeof how); }));
    if (opened >= 0 || (errno != ENOSYS && errno != EAGAIN)) return opened;
    if (errno == ENOSYS) break;
  }
  // A last link that is not to be followed is not resolved either.
  const bool keepsLast = (flags & O_NOFOLLOW) != 0;
  const std::size_t last = keepsLast ? relative.rfind('/') + 1 : relative.size();
  std::string resolved = resolvedBelow(root, relative.substr(0, last));
  if (resolved.empty()) return -1;
  if (keepsLast) resolved += "/" + relative.substr(last);
  return retried([&] { return ::openat(root, resolved.c_str(), flags | O_NOFOLLOW | O_CLOEXEC); });
}

// The path of an open file, below the root.
std::optional<std::string> pathBelow(int root, int file) {
  const auto pathOf = [](int descriptor) {
    return linkText(AT_FDCWD, "/proc/self/fd/" + std::to_string(descriptor));
  };
  const std::string whole = pathOf(file);
  std::string top = pathOf(root);
  if (top == "/") top.clear();
  if (whole.empty() || !whole.starts_with(top)) return std::nullopt;
  return whole.substr(top.size());
}

std::string samplePath(std::int64_t milliseconds) {
  return "/samples/" + std::to_string(milliseconds);
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

SystemTree::SystemTree(const DeviceRoot& root, bool follow, TreeObserver observer)
    : prefix_(root.prefix()), follow_(follow && !prefix_.empty()), observer_(std::move(observer)) {}
SystemTree::~SystemTree() = default;

int SystemTree::root() const {
  const std::lock_guard lock(opening_);
  if (!root_) {
    root_ = Descriptor(
        ::open(prefix_.empty() ? "/" : prefix_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  }
  return root_.get();
}

int SystemTree::openAt(const std::string& path, int flags) const {
  if (observer_) {
    observer_(path, (flags & O_PATH) != 0        ? TreeUse::Exists
                    : (flags & O_DIRECTORY) != 0 ? TreeUse::List
                                                 : TreeUse::Read);
  }
  if (root() < 0) return -1;
  const int changed = follow_ ? openSample(path, flags) : -1;
  return changed >= 0 ? changed : openBelow(root(), path, flags);
}

// The file of the latest sample that has it; -1 if it has not changed yet.
int SystemTree::openSample(const std::string& path, int flags) const {
  const std::size_t latest = generation();
  // Samples hold the files alone; the links that lead to them are in the tree.
  if (latest == 0 || (flags & (O_PATH | O_DIRECTORY)) != 0) return -1;
  const Descriptor place(openBelow(root(), path, O_PATH));
  const auto resolved = place ? pathBelow(root(), place.get()) : std::nullopt;
  for (std::size_t sample = latest; sample > 0; --sample) {
    const int opened = openBelow(
        root(), samplePath(recording_->times[sample - 1]) + resolved.value_or(path), flags);
    if (opened >= 0) return opened;
  }
  return -1;
}

std::size_t SystemTree::generation() const {
  const int top = follow_ ? root() : -1;
  if (!follow_) return 0;
  const std::lock_guard lock(opening_);
  if (!recording_) {
    recording_ = std::make_unique<Recording>();
    const Descriptor samples(top < 0 ? -1 : openBelow(top, "/samples", O_RDONLY | O_DIRECTORY));
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

std::optional<std::string> SystemTree::fact(const std::string& path, std::size_t limit) const {
  if (isThisMachine() || isRecording()) return text(path, limit);
  const auto content = readFile(path, limit);
  return content ? std::optional(std::string(trimmed(*content))) : std::nullopt;
}

std::optional<TreeEntry> SystemTree::examine(const std::string& path) const {
  const Descriptor place(openAt(path, O_PATH | O_NOFOLLOW));
  struct stat status {};
  if (!place || ::fstat(place.get(), &status) != 0) return std::nullopt;
  using enum TreeEntry::Type;
  if (S_ISLNK(status.st_mode)) return TreeEntry{Link, linkText(place.get(), "")};
  return TreeEntry{S_ISREG(status.st_mode)   ? File
                   : S_ISDIR(status.st_mode) ? Directory
                                             : Other,
                   ""};
}

std::optional<std::string> SystemTree::resolve(const std::string& path) const {
  const Descriptor place(openAt(path, O_PATH));
  return place ? pathBelow(root(), place.get()) : std::nullopt;
}

}  // namespace tally
