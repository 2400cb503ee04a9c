#include "host/record/pseudonyms.h"

#include <algorithm>
#include <array>
#include <optional>

#include "base/natural_order.h"
#include "base/number_text.h"
#include "base/nvme_health_file.h"
#include "base/text_lines.h"
#include "host/record/plain_names.h"
#include "host/record/shapes.h"
#include "host/tree/escaped_text.h"

namespace tally {
namespace {

constexpr std::string_view kInterface = "if", kDisk = "disk", kHost = "host", kFolder = "dir",
                           kSupply = "supply", kSensor = "sensor";

bool isWordLetter(char letter) {
  return isDigit(letter) || isLower(letter) || (letter >= 'A' && letter <= 'Z') ||
         static_cast<unsigned char>(letter) >= 0x80;
}

std::string_view lastName(std::string_view path) { return path.substr(path.rfind('/') + 1); }

// The files, and the keys of uevent, whose whole value identifies: their name is one of these, or
// ends with one after "_" or "-".
constexpr std::string_view kSecretNames[] = {
    "serial",   "serialnumber", "serialno", "serial_number", "uuid",       "guid",      "nguid",
    "eui",      "eui64",        "wwid",     "wwn",           "address",    "addr",      "mac",
    "cid",      "uniq",         "unique",   "unique_number", "unique_id",  "asset_tag", "hostname",
    "nodename", "domainname",   "boot_id",  "machine_id",    "hostid",     "hostnqn",   "subsysnqn",
    "nqn",      "alias",        "ifalias",  "partname",      "model_name", "phys",      "hid_name",
    "port_id",  "switch_id",
};

bool isSecret(std::string_view name) {
  const std::string low = lower(name);
  return std::ranges::any_of(kSecretNames, [&](std::string_view secret) {
    if (!low.ends_with(secret)) return false;
    const std::size_t before = low.size() - secret.size();
    return before == 0 || low[before - 1] == '_' || low[before - 1] == '-';
  });
}

// "…/hwmon3/name" has the name that a driver, or a driver's user, gave a sensor.
bool isChipName(std::string_view path) {
  const std::string_view folder = path.substr(0, path.rfind('/'));
  return path.ends_with("/name") && lastName(folder).starts_with("hwmon");
}

// Of a mapped disk or an array the name is what its owner called it.
std::string_view secretKind(std::string_view path, std::string_view text) {
  if (isChipName(path)) return isDriverName(trimmed(text)) ? std::string_view() : kSensor;
  if (path.ends_with("/dm/name") || path.ends_with("/md/array_name")) return kDisk;
  return isSecret(lastName(path)) ? lastName(path) : std::string_view();
}

// Texts whose words are all the kernel's or the system's, and the registers of a card, which are
// one long number.
bool isFixedText(std::string_view path) {
  constexpr std::string_view kFixed[] = {
      "/proc/stat",    "/proc/meminfo",   "/proc/vmstat",    "/proc/softirqs", "/proc/uptime",
      "/proc/loadavg", "/proc/schedstat", "/proc/buddyinfo", "/proc/zoneinfo",
  };
  return std::ranges::count(kFixed, path) > 0 || path.starts_with("/proc/pressure/") ||
         path.ends_with("/ext_csd");
}

bool isLogPage(std::string_view path) {
  return path.starts_with(kLogPageFolder) && isHealthPageName(lastName(path));
}

// Names that every system has, on the way to a file.
bool isCommonFolder(std::string_view name) {
  constexpr std::string_view kCommon[] = {
      "bin",    "boot",  "data",   "dev",    "disk",    "efi",     "etc",    "home", "lib",
      "mapper", "media", "mnt",    "mobile", "opt",     "overlay", "proc",   "rom",  "root",
      "run",    "sbin",  "shm",    "srv",    "storage", "sys",     "system", "tmp",  "upper",
      "usr",    "var",   "vendor", "work",   ".",       "..",
  };
  return std::ranges::count(kCommon, name) > 0;
}

// "sda1", "nvme0n1p2", "dm-0": a kind of disk, numbers, and few letters.
bool isKernelDisk(std::string_view name) {
  constexpr std::string_view kKinds[] = {"mmcblk", "mtdblock", "mtd", "ubiblock", "ubi", "nvme",
                                         "loop",   "zram",     "ram", "nbd",      "xvd", "dm-",
                                         "md",     "sd",       "hd",  "vd",       "sr",  "fd"};
  constexpr std::size_t kMostLetters = 4;
  const auto* const kind =
      std::ranges::find_if(kKinds, [&](std::string_view one) { return name.starts_with(one); });
  if (kind == std::end(kKinds)) return false;
  std::size_t letters = 0;
  for (const char letter : name.substr(kind->size())) {
    if (isLower(letter)) {
      if (++letters > kMostLetters) return false;
    } else if (!isDigit(letter) && letter != '_') {
      return false;
    }
  }
  return true;
}

// Other paths are the user's.
bool isOfKernel(std::string_view path) {
  constexpr std::string_view kFolders[] = {"/proc/", "/sys/", "/run/", "/etc/", "/usr/"};
  return std::ranges::any_of(kFolders, [&](auto folder) { return path.starts_with(folder); });
}

// A name that cannot be taken for a word or a number of the kernel's.
bool isDistinctive(std::string_view name) {
  constexpr std::size_t kShortest = 6;
  const auto isMark = [](char letter) { return isDigit(letter) || letter == '-'; };
  return name.size() >= kShortest && std::ranges::any_of(name, isMark) &&
         !std::ranges::all_of(name, isMark);
}

// Too short to be replaced where it is not known to be a name.
bool isShort(std::string_view name) {
  return name.size() < 3 || std::ranges::all_of(name, isDigit);
}

bool isText(std::string_view text) {
  return std::ranges::all_of(text, [](char letter) {
    return static_cast<unsigned char>(letter) >= ' ' || letter == '\n' || letter == '\t' ||
           letter == '\r';
  });
}

}  // namespace

std::string Pseudonyms::number(std::string_view kind, std::string_view original) {
  auto& known = numbers_.try_emplace(std::string(kind)).first->second;
  const auto next = static_cast<std::uint32_t>(known.size() + 1);
  return std::to_string(known.try_emplace(std::string(original), next).first->second);
}

std::string Pseudonyms::named(std::string_view kind, const std::string& name, bool isWord) {
  const auto [known, isNew] = names_.try_emplace(name, Name{"", isWord});
  if (isNew) known->second.pseudonym = std::string(kind) + number(kind, name);
  return known->second.pseudonym;
}

void Pseudonyms::addName(std::string_view kind, const std::string& name) {
  if (!name.empty()) (void)named(kind, name, true);
}

std::string Pseudonyms::secret(std::string_view name, std::string_view text) {
  const std::string_view core = trimmed(text);
  if (core.empty()) return std::string(text);
  const auto shape = shapeAt(core, 0, true);
  std::string hidden = shape && shape->length == core.size()
                           ? shapes(core, true)
                           : named(lower(name), std::string(core), name == kDisk);
  if (text.ends_with('\n')) hidden += '\n';
  return hidden;
}

void Pseudonyms::learn(std::string_view path, std::string_view text) {
  const std::string_view kind = secretKind(path, text);
  if (!kind.empty()) (void)secret(kind, text);
}

bool Pseudonyms::isReplaced(const std::string& name, bool isWord, Where where) {
  switch (where) {
    case Where::Path:
      return isDistinctive(name);
    case Where::Text:
      return isWord ? !isShort(name) : isDistinctive(name);
    case Where::Name:
      return isWord;
  }
  return true;
}

std::string Pseudonyms::words(std::string_view text, Where where) {
  std::string result;
  for (std::size_t i = 0; i < text.size();) {
    const bool begins = i == 0 || !isWordLetter(text[i - 1]) || !isWordLetter(text[i]);
    const std::string* replacement = nullptr;
    std::size_t length = 0;
    if (begins) {
      const auto end = names_.upper_bound(text.substr(i));
      // Those that the rest of the text begins with are before it, the longest last.
      for (auto known = end; known != names_.begin();) {
        --known;
        const std::string& name = known->first;
        if (name.front() != text[i]) break;
        if (text.substr(i, name.size()) != name) continue;
        const std::size_t after = i + name.size();
        if (after < text.size() && isWordLetter(text[after]) && isWordLetter(name.back())) continue;
        if (!isReplaced(name, known->second.isWord, where)) continue;
        replacement = &known->second.pseudonym;
        length = name.size();
        break;
      }
    }
    if (replacement != nullptr) {
      result += *replacement;
      i += length;
    } else {
      result += text[i++];
    }
  }
  return result;
}

std::string Pseudonyms::shapes(std::string_view text, bool isPath) {
  constexpr std::string_view kKinds[] = {"uuid", "octets", "network", "hexadecimal"};
  std::string result;
  for (std::size_t i = 0; i < text.size();) {
    const auto found = shapeAt(text, i, isPath);
    if (!found) {
      result += text[i++];
      continue;
    }
    const std::string original = lower(text.substr(i, found->length));
    // The same address with other separators is the same.
    std::string digits = original;
    std::erase_if(digits, [](char letter) { return !isWordLetter(letter); });
    const auto value =
        parseInt64(number(kKinds[static_cast<std::size_t>(found->shape)],
                          found->shape == Shape::NetworkAddress ? original : digits));
    result += shaped(found->shape, original, static_cast<std::uint32_t>(value.value_or(0)));
    i += found->length;
  }
  return result;
}

// A name in a path of the kernel's, in the directory above.
std::string Pseudonyms::component(std::string_view above, std::string_view name) {
  if (above == "net" || above == "brif") return words(name, Where::Name);
  for (const std::string_view relation : {"lower_", "upper_", "slave_"}) {
    if (name.starts_with(relation)) {
      return std::string(relation) + words(name.substr(relation.size()), Where::Name);
    }
  }
  // "8:0" in /sys/dev/block.
  const bool isNumber = name.find_first_not_of("0123456789:.") == name.npos;
  if (above == "block" && !isNumber && !isKernelDisk(name)) {
    return named(kDisk, std::string(name), true);
  }
  if (above == "power_supply" && !isSupplyName(name)) {
    return named(kSupply, std::string(name), true);
  }
  return shapes(words(name, Where::Path), true);
}

std::string Pseudonyms::path(std::string_view path) {
  return isOfKernel(path) ? kernelPath(path, path.starts_with("/proc/")) : folders(path);
}

std::string Pseudonyms::target(std::string_view path, std::string_view target) {
  return isOfKernel(path) ? kernelPath(target, false) : folders(target);
}

std::string Pseudonyms::kernelPath(std::string_view path, bool isOfProcesses) {
  std::string result;
  std::string_view above;
  while (!path.empty()) {
    const std::size_t end = std::min(path.find('/'), path.size());
    const std::string_view name = path.substr(0, end);
    result += component(isOfProcesses ? std::string_view() : above, name);
    above = name;
    if (end < path.size()) result += '/';
    path.remove_prefix(std::min(end + 1, path.size()));
  }
  return result;
}

// A path to a file of the user's or the system's, name by name.
std::string Pseudonyms::folders(std::string_view path) {
  std::string result;
  bool isDevice = false;
  while (!path.empty()) {
    const std::size_t end = std::min(path.find('/'), path.size());
    const std::string name(path.substr(0, end));
    const bool isKept = name.empty() || isCommonFolder(name) || (isDevice && isKernelDisk(name));
    // Only those that were known before any text, so that a directory keeps its number.
    const auto known = names_.find(name);
    const bool isName = known != names_.end() && known->second.isWord;
    result += isKept   ? name
              : isName ? known->second.pseudonym
                       : std::string(kFolder) + number(kFolder, name);
    if (name == "dev") isDevice = true;
    if (end < path.size()) result += '/';
    path.remove_prefix(std::min(end + 1, path.size()));
  }
  return result;
}

std::string Pseudonyms::freeText(std::string_view text) {
  std::string result;
  std::size_t done = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '/' || (i > 0 && !isSeparator(text[i - 1]))) continue;
    std::size_t end = i;
    while (end < text.size() && !isSeparator(text[end])) ++end;
    result += shapes(words(text.substr(done, i - done), Where::Text), false);
    result += folders(unescaped(text.substr(i, end - i)));
    done = i = end;
  }
  return result + shapes(words(text.substr(done), Where::Text), false);
}

// The lines KEY=VALUE of uevent.
std::string Pseudonyms::eventLines(std::string_view text) {
  std::string result;
  eachLine(text, [&](std::string_view line) {
    const std::size_t equal = std::min(line.find('='), line.size());
    const std::string_view key = line.substr(0, equal);
    const std::string_view value = line.substr(std::min(equal + 1, line.size()));
    result.append(key);
    if (equal < line.size()) result += '=';
    result.append(isSecret(key) ? secret(key, value) : freeText(value)).append("\n");
  });
  return result;
}

// Only what tells the device of a path is left of a line of mountinfo.
std::string Pseudonyms::mounts(std::string_view table) {
  std::string result;
  eachLine(table, [&](std::string_view line) {
    std::array<std::string_view, 5> fields;  // id, parent, numbers, root, mount point
    const std::size_t dash = line.find(" - ");
    if (dash == std::string_view::npos) return;
    std::string_view before = line.substr(0, dash), after = line.substr(dash + 3);
    const auto take = [](std::string_view& text) {
      const std::size_t end = std::min(text.find(' '), text.size());
      const std::string_view word = text.substr(0, end);
      text.remove_prefix(std::min(end + 1, text.size()));
      return word;
    };
    for (std::string_view& field : fields) field = take(before);
    const std::string_view type = take(after), source = take(after);
    const bool numeric =
        std::ranges::all_of(std::array{fields[0], fields[1], fields[2]}, [](std::string_view word) {
          return word.find_first_not_of("0123456789:") == std::string_view::npos;
        });
    if (!numeric) return;
    std::string from = "none";
    if (source.starts_with('/')) {
      from = folders(unescaped(source));
    } else if (source.starts_with("ubi") && source.size() > 3 && isDigit(source[3])) {
      const std::size_t colon = std::min(source.find_first_of(":!"), source.size());
      from = isKernelDisk(source.substr(0, colon)) ? source.substr(0, colon) : "none";
      const std::string volume(source.substr(std::min(colon + 1, source.size())));
      if (from != "none" && !volume.empty()) from += ":" + named("volume", volume, false);
    }
    std::string options = "rw";
    while (!after.empty()) {
      const std::size_t end = std::min(after.find(','), after.size());
      constexpr std::string_view kUpper = "upperdir=";
      const std::string_view option = after.substr(0, end);
      after.remove_prefix(std::min(end + 1, after.size()));
      if (!option.starts_with(kUpper)) continue;
      options.append(",").append(kUpper).append(folders(unescaped(option.substr(kUpper.size()))));
    }
    result.append(fields[0]).append(" ").append(fields[1]).append(" ").append(fields[2]);
    result.append(" / ").append(folders(unescaped(fields[4]))).append(" rw - ");
    result.append(type.substr(0, type.find('.'))).append(" ").append(from);
    result.append(" ").append(options).append("\n");
  });
  return result;
}

std::string Pseudonyms::content(std::string_view path, std::string_view text) {
  if (isFixedText(path)) return std::string(text);
  if (isLogPage(path)) return std::string(text.size() == kHealthPageSize ? text : "");
  while (text.ends_with('\0')) text.remove_suffix(1);
  if (!isText(text)) return {};
  const std::string_view kind = secretKind(path, text);
  if (!kind.empty()) return secret(kind, text);
  const std::string_view name = lastName(path);
  if (name == "os-release") return nameAndVersion(text);
  if (path == "/proc/sys/kernel/osrelease") return plainRelease(text);
  if (name == "mountinfo") return mounts(text);
  if (name == "uevent") return eventLines(text);
  // A file that is one path may have blanks in it.
  if (text.starts_with('/') && trimmed(text).find('\n') == text.npos) {
    return folders(trimmed(text)) + (text.ends_with('\n') ? "\n" : "");
  }
  if (path != "/proc/net/dev" && path != "/proc/self/net/dev") return freeText(text);
  std::string result;
  eachLine(text, [&](std::string_view line) {
    const std::size_t colon = std::min(line.find(':'), line.size());
    result.append(words(line.substr(0, colon), Where::Name))
        .append(line.substr(colon))
        .append("\n");
  });
  return result;
}

RecordedTree anonymous(const RecordedTree& recorded) {
  Pseudonyms pseudonyms;
  std::vector<std::string> interfaces;
  for (const auto& [path, entry] : recorded.entries) {
    constexpr std::string_view kClass = "/sys/class/net/";
    if (path.starts_with(kClass)) {
      const std::string_view name = std::string_view(path).substr(kClass.size());
      if (name.find('/') == name.npos) interfaces.emplace_back(name);
    }
    if (path == "/proc/net/dev" || path == "/proc/self/net/dev") {
      eachLine(entry.text, [&](std::string_view line) {
        const std::size_t colon = line.find(':');
        if (colon != line.npos) interfaces.emplace_back(trimmed(line.substr(0, colon)));
      });
    }
    if (path == "/proc/sys/kernel/hostname") {
      pseudonyms.addName(kHost, std::string(trimmed(entry.text)));
    }
  }
  std::ranges::sort(interfaces, naturalLess);
  for (const std::string& name : interfaces) {
    if (name != "lo") pseudonyms.addName(kInterface, name);
  }
  for (const auto& [path, entry] : recorded.entries) {
    (void)pseudonyms.path(path);
    if (entry.type == TreeEntry::Type::File) pseudonyms.learn(path, entry.text);
  }

  RecordedTree result;
  result.faults = recorded.faults;
  for (const auto& [path, entry] : recorded.entries) {
    using enum TreeEntry::Type;
    std::string text = entry.type == File   ? pseudonyms.content(path, entry.text)
                       : entry.type == Link ? pseudonyms.target(path, entry.text)
                                            : std::string();
    if (entry.type == File && text.empty() && !entry.text.empty()) {
      result.faults.push_back(path + ": not a text; left out without --raw");
    }
    result.entries.emplace(pseudonyms.path(path), RecordedEntry{entry.type, std::move(text)});
  }
  for (const auto& [time, files] : recorded.samples) {
    for (const auto& [path, content] : files) {
      result.samples[time].emplace(pseudonyms.path(path), pseudonyms.content(path, content));
    }
  }
  return result;
}

}  // namespace tally
