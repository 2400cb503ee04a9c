#include "base/device_root.h"

#include <cerrno>
#include <deque>
#include <filesystem>

namespace tally {
namespace {

constexpr int kMostLinks = 40;

// The components of a path, before those that are still to be walked. False for one that climbs or
// cannot be a name, unless it is the target of a link.
bool putFirst(std::deque<std::string>& components, std::string_view path, bool mayClimb) {
  std::deque<std::string> parts;
  while (!path.empty()) {
    const std::size_t end = std::min(path.find('/'), path.size());
    const std::string_view part = path.substr(0, end);
    path.remove_prefix(std::min(end + 1, path.size()));
    if (part.find('\0') != std::string_view::npos || (part == ".." && !mayClimb)) return false;
    if (!part.empty() && part != ".") parts.emplace_back(part);
  }
  components.insert(components.begin(), parts.begin(), parts.end());
  return true;
}

// The way down from the root. Directories on it stay open, since a link may lead up again.
class Walk {
 public:
  static Result<Walk> start(const std::string& prefix, std::string_view path) {
    std::deque<std::string> components;
    if (!putFirst(components, path, /*mayClimb=*/false)) {
      return Error{std::string(path) + " does not name a file of the device", EINVAL};
    }
    auto root = Directory::open(prefix.empty() ? "/" : prefix);
    if (!root) return root.error();
    return Walk(*std::move(root), std::move(components));
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
    return putFirst(components_, *target, /*mayClimb=*/true);
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

DeviceRoot::DeviceRoot(std::string path) : prefix_(std::move(path)) {
  prefix_.resize(prefix_.find_last_not_of('/') + 1);
}

Result<Directory> DeviceRoot::open(std::string_view path) const {
  auto walk = Walk::start(prefix_, path);
  if (!walk) return walk.error();
  while (!walk->left().empty()) {
    if (auto stepped = walk->step(enterExisting); !stepped) return stepped.error();
  }
  return walk->here();
}

Result<Directory> DeviceRoot::make(std::string_view path, unsigned mode) const {
  constexpr unsigned kParentMode = 0755;
  if (!prefix_.empty()) {
    std::error_code failure;
    std::filesystem::create_directories(prefix_, failure);
    if (failure) {
      return Error{"cannot make directory " + prefix_ + ": " + failure.message(), failure.value()};
    }
  }
  auto walk = Walk::start(prefix_, path);
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

Result<DeviceRoot::Location> DeviceRoot::locate(std::string_view path) const {
  if (!path.starts_with('/')) {
    return Error{std::string(path) + " is not an absolute path of the device", EINVAL};
  }
  auto walk = Walk::start(prefix_, path);
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

Result<std::string> DeviceRoot::readFile(std::string_view path, std::size_t limit) const {
  const auto location = locate(path);
  if (!location) return location.error();
  return location->directory.readFile(location->name, limit);
}

std::optional<FileIdentity> DeviceRoot::identity(std::string_view path) const {
  const auto location = locate(path);
  return location ? location->directory.identity(location->name) : std::nullopt;
}

Result<std::vector<std::string>> DeviceDirectory::list() const {
  const auto directory = open();
  if (directory) return directory->list();
  if (directory.error().systemError == ENOENT) return std::vector<std::string>();
  return directory.error();
}

}  // namespace tally
