#include "host/record/tree_recorder.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "base/nvme_health_file.h"

namespace tally {
namespace {

using Type = TreeEntry::Type;

constexpr int kMostLinks = 40;  // as many as the kernel follows

// Besides what the sources ask for: what the platform reads of a machine once, and log pages.
constexpr const char* kAlways[] = {
    "/etc/os-release",           "/usr/lib/os-release",        "/proc/uptime",
    "/proc/sys/kernel/ostype",   "/proc/sys/kernel/osrelease", "/proc/sys/kernel/arch",
    "/proc/sys/kernel/hostname",
};

std::size_t nextSlash(const std::string& path, std::size_t from) {
  return std::min(path.find('/', from), path.size());
}

}  // namespace

TreeRecorder::TreeRecorder(const DeviceRoot& root)
    : asked_(std::make_shared<Asked>()),
      observed_(std::make_shared<const SystemTree>(
          root, false,
          [asked = asked_](const std::string& path, TreeUse use) {
            const std::lock_guard lock(asked->adding);
            asked->paths[path].insert(use);
          })),
      tree_(root) {}
TreeRecorder::~TreeRecorder() = default;

void TreeRecorder::fault(const std::string& path, const std::string& reason) {
  if (faulty_.insert(path).second) recorded_.faults.push_back(path + ": " + reason);
}

bool TreeRecorder::takeRoom(const std::string& path, std::size_t bytes) {
  constexpr std::size_t kOfAnEntry = 64;  // so that empty ones are bounded too
  bytes += path.size() + kOfAnEntry;
  if (bytes > kLargestRecording - bytes_) {
    fault("the recording", "is full; the rest is left out");
    return false;
  }
  bytes_ += bytes;
  return true;
}

bool TreeRecorder::addEntry(const std::string& path, TreeEntry::Type type, std::string text) {
  const auto known = recorded_.entries.find(path);
  if (known != recorded_.entries.end()) {
    // A file that was only known to exist is now read.
    if (known->second.text.empty() && takeRoom(path, text.size())) known->second.text = text;
    return true;
  }
  if (!takeRoom(path, text.size())) return false;
  recorded_.entries.emplace(path, RecordedEntry{type, std::move(text)});
  return true;
}

std::string TreeRecorder::read(const std::string& path) {
  errno = 0;
  const Descriptor file = tree_.open(path);
  if (!file) {
    fault(path, std::strerror(errno));
    return {};
  }
  const auto content = readDescriptor(file.get(), path, kLargestRecordedFile);
  if (content) return *content;
  const int error = content.error().systemError;
  fault(path, error == EFBIG ? "too large" : std::strerror(error));
  return {};
}

void TreeRecorder::addFile(const std::string& path, bool isRead) {
  const auto known = recorded_.entries.find(path);
  if (known != recorded_.entries.end() && (!isRead || latest_.contains(path))) return;
  std::string content = isRead ? read(path) : std::string();
  if (isRead) latest_[path] = content;
  addEntry(path, Type::File, std::move(content));
}

void TreeRecorder::addNames(const std::string& directory) {
  for (const std::string& name : tree_.list(directory)) {
    const std::string path = (directory == "/" ? "" : directory) + "/" + name;
    // Processes are not devices.
    if (directory == "/proc" && name.find_first_not_of("0123456789") == std::string::npos) continue;
    const auto entry = tree_.examine(path);
    if (!entry || (entry->type != Type::Link && entry->type != Type::Directory)) continue;
    if (!addEntry(path, entry->type, entry->target)) return;
  }
}

void TreeRecorder::add(const std::string& path, const std::set<TreeUse>& uses) {
  std::string left = path, here;
  int links = 0;
  while (!left.empty()) {
    const std::size_t begin = std::min(left.find_first_not_of('/'), left.size());
    const std::size_t end = nextSlash(left, begin);
    const std::string name = left.substr(begin, end - begin);
    left.erase(0, end);
    if (name.empty() || name == ".") continue;
    if (name == "..") {
      here.resize(std::min(here.rfind('/'), here.size()));
      continue;
    }
    const std::string next = here + "/" + name;
    const auto entry = tree_.examine(next);
    if (!entry) return;
    // "self" in /proc is the recorder's own process.
    const bool isOfProcess = next.starts_with("/proc/");
    if (entry->type == Type::Link && !isOfProcess) {
      if (++links > kMostLinks || !addEntry(next, Type::Link, entry->target)) return;
      if (entry->target.starts_with('/')) here.clear();
      left = entry->target + "/" + left;
      continue;
    }
    here = next;
    if (left.find_first_not_of('/') == std::string::npos) break;
    if (!addEntry(here, Type::Directory, "")) return;
  }
  const bool isListed = uses.contains(TreeUse::List), isRead = uses.contains(TreeUse::Read);
  const auto entry = tree_.examine(here.empty() ? "/" : here);
  if (!entry) return;
  if (entry->type == Type::File || (entry->type == Type::Link && isRead)) {
    addFile(here, isRead);
  } else if (entry->type == Type::Directory || entry->type == Type::Link) {
    if (!here.empty() && !addEntry(here, Type::Directory, "")) return;
    if (isListed) addNames(here.empty() ? "/" : here);
  }
}

void TreeRecorder::take() {
  std::map<std::string, std::set<TreeUse>> paths;
  {
    const std::lock_guard lock(asked_->adding);
    paths = asked_->paths;
  }
  for (const char* const path : kAlways) paths[path].insert(TreeUse::Read);
  for (const std::string& name : tree_.list(kLogPageFolder)) {
    const std::string page = std::string(kLogPageFolder) + "/" + name;
    if (!isHealthPageName(name)) continue;
    const auto entry = tree_.examine(page);
    const bool isPage = entry && entry->type == Type::File && read(page).size() == kHealthPageSize;
    if (isPage) paths[page].insert(TreeUse::Read);
  }
  for (const auto& [path, uses] : paths) add(path, uses);
}

bool TreeRecorder::takeSample(std::int64_t milliseconds) {
  std::map<std::string, std::string>& changed = recorded_.samples[milliseconds];
  for (auto& [path, content] : latest_) {
    std::string now = read(path);
    if (now == content || now.empty()) continue;
    if (!takeRoom(path, now.size())) return false;
    changed[path] = content = std::move(now);
  }
  return true;
}

RecordedTree TreeRecorder::finish() {
  std::erase_if(recorded_.samples, [](const auto& sample) { return sample.second.empty(); });
  return std::move(recorded_);
}

}  // namespace tally
