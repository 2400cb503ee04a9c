#include "host/flash/mount_table.h"

#include <algorithm>
#include <array>

#include "base/text_lines.h"
#include "host/tree/escaped_text.h"

namespace tally {
namespace {

std::string_view takeWord(std::string_view& text) {
  const std::size_t end = std::min(text.find(' '), text.size());
  const std::string_view word = text.substr(0, end);
  text.remove_prefix(std::min(end + 1, text.size()));
  return word;
}

std::optional<Mount> parseMount(std::string_view line) {
  takeWord(line);  // the mount's number and that of its parent
  takeWord(line);
  Mount mount;
  mount.device = takeWord(line);
  takeWord(line);  // the directory that is mounted
  mount.point = unescaped(takeWord(line));
  const std::size_t separator = line.find(" - ");
  if (mount.point.empty() || separator == std::string_view::npos) return std::nullopt;
  line.remove_prefix(separator + 3);
  mount.type = takeWord(line);
  mount.source = unescaped(takeWord(line));
  mount.options = line;
  return mount;
}

bool liesOn(std::string_view path, std::string_view point) {
  if (point == "/") return true;
  return path.starts_with(point) && (path.size() == point.size() || path[point.size()] == '/');
}

}  // namespace

std::optional<Mount> mountOf(std::string_view table, std::string_view path) {
  std::optional<Mount> best;
  eachLine(table, [&](std::string_view line) {
    auto mount = parseMount(line);
    if (!mount || !liesOn(path, mount->point)) return;
    if (!best || mount->point.size() >= best->point.size()) best = std::move(mount);
  });
  return best;
}

std::string ubiDeviceOf(std::string_view source) {
  constexpr std::string_view kFolder = "/dev/", kName = "ubi";
  if (source.starts_with(kFolder)) source.remove_prefix(kFolder.size());
  if (!source.starts_with(kName)) return {};
  const std::size_t end =
      std::min(source.find_first_not_of("0123456789", kName.size()), source.size());
  const bool named =
      end > kName.size() && (end == source.size() || source[end] == ':' || source[end] == '_');
  return named ? std::string(source.substr(0, end)) : std::string();
}

std::string mountOption(std::string_view options, std::string_view name) {
  while (!options.empty()) {
    const std::size_t end = std::min(options.find(','), options.size());
    const std::string_view option = options.substr(0, end);
    if (option.starts_with(name) && option.substr(name.size()).starts_with('=')) {
      return unescaped(option.substr(name.size() + 1));
    }
    options.remove_prefix(std::min(end + 1, options.size()));
  }
  return {};
}

}  // namespace tally
