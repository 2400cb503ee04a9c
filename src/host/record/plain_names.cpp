#include "host/record/plain_names.h"

#include <algorithm>
#include <span>

#include "base/text_lines.h"
#include "host/record/shapes.h"

namespace tally {
namespace {

// Longer ones may be a serial number or a day.
constexpr std::size_t kMostDigits = 5;

constexpr std::string_view kReleaseWords[] = {
    "aarch", "amd",    "android",  "arch",    "arm",      "armhf", "armmp",      "armv", "cloud",
    "deb",   "el",     "fc",       "generic", "hardened", "kvm",   "lowlatency", "lpae", "lts",
    "mips",  "pae",    "ppc",      "raspi",   "rc",       "riscv", "rpi",        "rpt",  "rt",
    "s",     "server", "standard", "v",       "virt",     "x",
};
constexpr std::string_view kSupplyWords[] = {
    "ac",    "acad", "adp",  "axp",   "bat",  "battery",  "bms",    "bq",     "charger",
    "cmb",   "dc",   "fuel", "gauge", "main", "mains",    "max",    "otg",    "pc",
    "pmic",  "pmu",  "port", "psy",   "rk",   "sbs",      "source", "supply", "tcpm",
    "typec", "ucsi", "ups",  "usb",   "usbc", "wireless",
};

// "18", "battery", "v8", "axp20x": a word, a number, and at most two letters.
bool isPlainPart(std::string_view part, std::span<const std::string_view> words) {
  constexpr std::size_t kMostLettersAfter = 2;
  const auto isWord = [&](std::string_view word) { return std::ranges::count(words, word) > 0; };
  if (isWord(part)) return true;
  const auto* const digits = std::ranges::find_if(part, isDigit);
  const auto* const after = std::find_if_not(digits, part.end(), isDigit);
  const std::string_view word(part.begin(), digits);
  const auto count = static_cast<std::size_t>(after - digits);
  const auto rest = static_cast<std::size_t>(part.end() - after);
  if (count == 0 || count > kMostDigits || !std::all_of(after, part.end(), isLower)) return false;
  return word.empty() ? rest == 0 : rest <= kMostLettersAfter && isWord(word);
}

// How much of a text consists of plain parts, separated by one mark each.
std::size_t plainLength(std::string_view text, std::span<const std::string_view> words) {
  std::size_t length = 0;
  for (std::size_t begin = 0; begin < text.size();) {
    const std::size_t end = std::min(text.find_first_of(".-+_:", begin), text.size());
    if (!isPlainPart(text.substr(begin, end - begin), words)) break;
    length = end;
    begin = end + 1;
  }
  return length;
}

}  // namespace

std::string plainRelease(std::string_view text) {
  const std::string_view line = trimmed(text);
  return std::string(line.substr(0, plainLength(line, kReleaseWords))) +
         (text.ends_with('\n') ? "\n" : "");
}

bool isSupplyName(std::string_view name) {
  const std::string low = lower(name);
  return !low.empty() && isLower(low.front()) && plainLength(low, kSupplyWords) == low.size();
}

bool isDriverName(std::string_view name) {
  constexpr std::size_t kLongest = 24;
  if (name.size() > kLongest) return false;
  std::size_t digits = 0;
  const bool isWord = std::ranges::all_of(name, [&](char letter) {
    digits = isDigit(letter) ? digits + 1 : 0;
    return digits <= kMostDigits && (isLower(letter) || isDigit(letter) || letter == '_');
  });
  return isWord || isSupplyName(name);
}

std::string nameAndVersion(std::string_view text) {
  constexpr std::string_view kKept[] = {"ID",      "VERSION_ID",       "NAME",    "PRETTY_NAME",
                                        "VERSION", "VERSION_CODENAME", "BUILD_ID"};
  std::string kept;
  eachLine(text, [&](std::string_view line) {
    const std::string_view key = trimmed(line.substr(0, line.find('=')));
    if (std::ranges::count(kKept, key) > 0) kept.append(line).append("\n");
  });
  return kept;
}

}  // namespace tally
