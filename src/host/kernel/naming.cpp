#include "host/kernel/naming.h"

#include <algorithm>
#include <map>
#include <utility>

#include "base/natural_order.h"

namespace tally {
namespace {

constexpr std::size_t kLongestName = 200;

bool isNumbered(std::string_view text, std::string_view stem) {
  return text.starts_with(stem) && text.size() > stem.size() &&
         text.find_first_not_of("0123456789", stem.size()) == std::string_view::npos;
}

// Removes "/nvme/nvme0" or "/hwmon3" from the end: numbers that are given out anew at each boot.
bool dropClass(std::string& path) {
  constexpr std::pair<std::string_view, std::string_view> kMembers[] = {
      {"thermal", "thermal_zone"}, {"thermal", "cooling_device"}, {"ieee80211", "phy"}};
  constexpr std::string_view kBare[] = {"hwmon", "wakeup"};
  const std::size_t last = path.rfind('/');
  if (last == std::string::npos) return false;
  const std::size_t before = last == 0 ? std::string::npos : path.rfind('/', last - 1);
  const std::size_t begin = before == std::string::npos ? 0 : before + 1;
  const std::string_view parent = std::string_view(path).substr(begin, last - begin);
  const std::string_view name = std::string_view(path).substr(last + 1);
  if (isNumbered(name, parent) || std::ranges::any_of(kMembers, [&](const auto& member) {
        return parent == member.first && isNumbered(name, member.second);
      })) {
    path.resize(begin == 0 ? 0 : begin - 1);
    return true;
  }
  if (std::ranges::none_of(kBare, [&](std::string_view stem) { return isNumbered(name, stem); })) {
    return false;
  }
  path.resize(last);
  return true;
}

// What is plugged in comes after what is built in, whose ordinals must not move.
bool isPluggable(const DeviceCandidate& device) {
  return device.isRemovable || device.busPath.find("/usb") != std::string::npos;
}

// Those that come more than once get what tells them apart.
template <class Mark>
void markRepeated(std::vector<std::string>& names, const Mark& mark) {
  std::map<std::string, unsigned> count, seen;
  for (const std::string& name : names) ++count[name];
  for (std::size_t i = 0; i < names.size(); ++i) {
    if (count[names[i]] > 1) names[i] += mark(i, ++seen[names[i]]);
  }
}

}  // namespace

std::string channelWord(std::string_view text) {
  std::string word(text.substr(0, kLongestName));
  for (char& letter : word) {
    if (letter == ' ' || letter == '\t') letter = '-';
    if (letter <= ' ' || letter > '~') letter = '_';
  }
  return word;
}

std::string busPathOf(const SystemTree& tree, const std::string& directory) {
  constexpr std::string_view kDevices = "/sys/devices/";
  std::string path = tree.resolve(directory).value_or("");
  if (!path.starts_with(kDevices)) return {};  // a recording without links
  path.erase(0, kDevices.size());
  while (dropClass(path)) continue;
  return path != "virtual" ? path : std::string();
}

std::vector<std::string> uniqueNames(const std::vector<std::string>& names,
                                     const std::vector<std::string>& places) {
  std::vector<std::string> words;
  words.reserve(names.size());
  for (const std::string& name : names) words.push_back(channelWord(name));
  markRepeated(words, [&](std::size_t i, unsigned) {
    return places[i].empty() ? std::string() : "@" + channelWord(places[i]);
  });
  markRepeated(words, [](std::size_t, unsigned number) { return "#" + std::to_string(number); });
  return words;
}

std::vector<NamedDevice> named(std::vector<DeviceCandidate> devices) {
  std::ranges::sort(devices, [](const DeviceCandidate& a, const DeviceCandidate& b) {
    return a.busPath != b.busPath ? naturalLess(a.busPath, b.busPath)
                                  : naturalLess(a.directory, b.directory);
  });
  std::vector<std::string> names, places;
  for (const DeviceCandidate& device : devices) {
    names.push_back(device.name);
    places.push_back(device.busPath);
  }
  std::vector<std::string> lasting;
  for (std::size_t i = 0; i < names.size(); ++i) {
    lasting.push_back(channelWord(names[i]) + "@" + channelWord(places[i]));
  }
  markRepeated(lasting, [](std::size_t, unsigned number) { return "#" + std::to_string(number); });
  names = uniqueNames(names, places);
  std::vector<NamedDevice> result;
  for (std::size_t i = 0; i < devices.size(); ++i) {
    result.push_back({std::move(devices[i].directory),
                      {std::move(names[i]), std::move(devices[i].identity), std::nullopt,
                       std::move(lasting[i]), devices[i].kind}});
  }
  unsigned ordinal = 0;
  for (const bool pluggable : {false, true}) {
    for (std::size_t i = 0; i < devices.size(); ++i) {
      if (devices[i].isSwept && isPluggable(devices[i]) == pluggable) {
        result[i].device.ordinal = ordinal++;
      }
    }
  }
  return result;
}

}  // namespace tally
