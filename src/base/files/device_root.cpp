#include "base/files/device_root.h"

#include <cerrno>
#include <deque>
#include <filesystem>
#include <mutex>
#include <optional>
#include <vector>

namespace tally {
namespace {

constexpr int kMostLinks = 40;

// The first component of a path, which is removed from it with the slash after it.
std::string_view takeComponent(std::string_view& path) {
  const std::size_t end = std::min(path.find('/'), path.size());
  const std::string_view component = path.substr(0, end);
  path.remove_prefix(std::min(end + 1, path.size()));
  return component;
}

// False for a path that climbs or cannot be a name.
bool isWellFormed(std::string_view path) {
  if (path.find('\0') != std::string_view::npos) return false;
  while (!path.empty()) {
    if (takeComponent(path) == "..") return false;
  }
  return true;
}

// Puts the components of a path before those that are still to be walked.
void putFirst(std::deque<std::string>& components, std::string_view path) {
  std::deque<std::string> parts;
  while (!path.empty()) {
    const std::string_view part = takeComponent(path);
    if (!part.empty() && part != ".") parts.emplace_back(part);
  }
  components.insert(components.begin(), parts.begin(), parts.end());
}

Error noPath(std::string_view path) {
  return {std::string(path) + " does not name a file of the device", EINVAL};
}

// The way down from the root. Directories on it stay open, since a link may lead up again.
class Walk {
 public:
  static Result<Walk> start(const Result<Directory>& root, std::string_view path) {
    if (!isWellFormed(path)) return noPath(path);
    if (!root) return root.error();
    std::deque<std::string> components;
    putFirst(components, path);
    return Walk(*root, std::move(components));
  }

  const Directory& here() const { return way_.back(); }
  std::deque<std::string>& left() { return components_; }

  // Replaces the next component, a link that may be followed, by its target. False when it is not
  // such a link, or there were too many.
  bool followLink() {
    const auto target = here().trustedLink(components_.front());
    if (!target || ++links_ > kMostLinks) return false;
    components_.pop_front();
    if (target->starts_with('/')) way_.resize(1, way_.front());
    putFirst(components_, *target);
    return true;
  }

  // One component down, or up where a link says so.
  template <class Enter>
  Status step(const Enter& enter) {
    if (components_.front() == "..") {
      if (way_.size() > 1) way_.pop_back();
      components_.pop_front();
      return Done{};
    }
    auto next = enter(here(), components_.front());
    if (!next && next.error().systemError == ELOOP && followLink()) return Done{};
    if (!next) return next.error();
    components_.pop_front();
    way_.push_back(*std::move(next));
    return Done{};
  }

 private:
  Walk(Directory root, std::deque<std::string> components)
      : way_{std::move(root)}, components_(std::move(components)) {}
  std::vector<Directory> way_;
  std::deque<std::string> components_;
  int links_ = 0;
};

Result<Directory> enterExisting(const Directory& parent, const std::string& name) {
  return parent.openDirectory(name);
}

}  // namespace

struct DeviceRoot::Opened {
  std::mutex mutex;
  std::optional<Directory> root;
};

DeviceRoot::DeviceRoot(std::string path)
    : prefix_(std::move(path)), opened_(std::make_shared<Opened>()) {
  prefix_.resize(prefix_.find_last_not_of('/') + 1);
}

Result<Directory> DeviceRoot::openRoot() const {
  const std::lock_guard lock(opened_->mutex);
  if (opened_->root) return *opened_->root;
  auto root = Directory::open(prefix_.empty() ? "/" : prefix_);
  if (root) opened_->root = *root;
  return root;
}

// In one call where there is no link on the way; else, and on kernels without that call, one
// component at a time.
Result<Directory> DeviceRoot::open(std::string_view path) const {
  if (!isWellFormed(path)) return noPath(path);
  const auto root = openRoot();
  if (!root) return root;
  const std::string_view below = path.substr(std::min(path.find_first_not_of('/'), path.size()));
  if (below.empty()) return root;
  auto opened = root->openBelow(below);
  if (opened) return opened;
  const int code = opened.error().systemError;
  if (code != ENOENT) return walk(path);
  if (root->exists()) return opened;
  const std::lock_guard lock(opened_->mutex);
  opened_->root.reset();  // somebody has replaced it; the next use finds the new one
  return opened;
}

Result<Directory> DeviceRoot::walk(std::string_view path) const {
  auto walk = Walk::start(openRoot(), path);
  if (!walk) return walk.error();
  while (!walk->left().empty()) {
    if (auto stepped = walk->step(enterExisting); !stepped) return stepped.error();
  }
  return walk->here();
}

Result<Directory> DeviceRoot::make(std::string_view path, unsigned mode) const {
  constexpr unsigned kParentMode = 0755;
  auto existing = open(path);
  if (existing || existing.error().systemError != ENOENT) return existing;
  if (!prefix_.empty()) {
    std::error_code failure;
    std::filesystem::create_directories(prefix_, failure);
    if (failure) {
      return Error{"cannot make directory " + prefix_ + ": " + failure.message(), failure.value()};
    }
  }
  auto walk = Walk::start(openRoot(), path);
  if (!walk) return walk.error();
  while (!walk->left().empty()) {
    const unsigned made = walk->left().size() == 1 ? mode : kParentMode;
    const auto enter = [made](const Directory& parent, const std::string& name) {
      auto present = parent.openDirectory(name);
      if (present || present.error().systemError != ENOENT) return present;
      return parent.makeDirectory(name, made);
    };
    if (auto stepped = walk->step(enter); !stepped) return stepped.error();
  }
  return walk->here();
}

Result<DeviceRoot::Location> DeviceRoot::locate(std::string_view path, bool followsLinks) const {
  if (!path.starts_with('/')) {
    return Error{std::string(path) + " is not an absolute path of the device", EINVAL};
  }
  // A last component that is a link shows itself when it is opened, so that this is asked for then.
  const std::size_t slash = path.rfind('/');
  const std::string_view name = path.substr(slash + 1);
  if (!followsLinks && !name.empty() && name != "." && name != "..") {
    const auto directory = open(path.substr(0, slash));
    if (!directory) return directory.error();
    return Location{*directory, std::string(name)};
  }
  auto walk = Walk::start(openRoot(), path);
  if (!walk) return walk.error();
  while (!walk->left().empty()) {
    if (walk->left().size() == 1 && walk->left().front() != "..") {
      if (walk->followLink()) continue;
      return Location{walk->here(), walk->left().front()};
    }
    if (auto stepped = walk->step(enterExisting); !stepped) return stepped.error();
  }
  return Error{std::string(path) + " is not a regular file"};
}

template <class Read>
auto DeviceRoot::readAt(std::string_view path, Read read) const
    -> decltype(read(std::declval<const Directory&>(), std::string())) {
  const auto direct = locate(path, /*followsLinks=*/false);
  if (!direct) return direct.error();
  auto content = read(direct->directory, direct->name);
  if (content || content.error().systemError != ELOOP) return content;
  const auto target = locate(path, /*followsLinks=*/true);
  if (!target) return target.error();
  return read(target->directory, target->name);
}

Result<std::string> DeviceRoot::readFile(std::string_view path, std::size_t limit) const {
  return readAt(path, [limit](const Directory& directory, const std::string& name) {
    return directory.readFile(name, limit);
  });
}

Result<FileReader> DeviceRoot::openForReading(std::string_view path, std::size_t limit) const {
  return readAt(path, [limit](const Directory& directory, const std::string& name) {
    return directory.openForReading(name, limit);
  });
}

std::optional<FileIdentity> DeviceRoot::identity(std::string_view path) const {
  auto location = locate(path, /*followsLinks=*/false);
  auto identity = location ? location->directory.identity(location->name) : std::nullopt;
  if (!identity || identity->regular) return identity;
  location = locate(path, /*followsLinks=*/true);
  return location ? location->directory.identity(location->name) : std::nullopt;
}

Result<std::vector<std::string>> DeviceDirectory::list() const {
  const auto directory = open();
  if (directory) return directory->list();
  if (directory.error().systemError == ENOENT) return std::vector<std::string>();
  return directory.error();
}

}  // namespace tally
