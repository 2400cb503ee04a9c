#include "host/flash/emmc.h"

#include "base/number_text.h"
#include "base/text_lines.h"
#include "host/flash/life_time.h"

namespace tally {
namespace {

constexpr std::string_view kType = "MMC";  // and not "SD"
constexpr unsigned kFirstRevisionWithLife = 7;
constexpr std::size_t kRegisters = 512;
constexpr std::size_t kRevisionAt = 192, kPreEndOfLifeAt = 267, kFastLifeAt = 268, kLifeAt = 269;

std::optional<Wear> wearOf(unsigned fastLife, unsigned life, unsigned preEndOfLife) {
  Wear wear;
  wear.fastUsed = reported(usedOfLifeTime(fastLife), "`life_time`, first byte");
  wear.used = reported(usedOfLifeTime(life), "`life_time`, second byte");
  wear.spare = reported(spareOfPreEndOfLife(preEndOfLife), "`pre_eol_info`");
  return wear.isKnown() ? std::optional(wear) : std::nullopt;
}

std::string folderOf(const std::string& name) { return "/sys/block/" + name + "/device/"; }

std::optional<std::int64_t> uptimeSeconds(const SystemTree& tree) {
  const auto text = tree.text("/proc/uptime");
  const auto uptime = text ? parseDouble(text->substr(0, text->find(' '))) : std::nullopt;
  constexpr double kMostSeconds = 1e11;
  if (!uptime || !(*uptime >= 0 && *uptime <= kMostSeconds)) return std::nullopt;
  return static_cast<std::int64_t>(*uptime);
}

// "/…/mmc0/mmc0:0001" for the debug folder of the card.
std::optional<Wear> readLive(const SystemTree& tree, const std::string& name) {
  const auto place = tree.resolve("/sys/block/" + name + "/device");
  if (!place) return std::nullopt;
  const std::string card = place->substr(place->rfind('/') + 1);
  const std::string host = card.substr(0, card.find(':'));
  if (host == card) return std::nullopt;
  const auto registers =
      tree.text("/sys/kernel/debug/" + host + "/" + card + "/ext_csd", 2 * kRegisters + 1);
  return registers ? parseExtendedRegisters(*registers) : std::nullopt;
}

}  // namespace

std::optional<Wear> parseEmmc(const EmmcAttributes& attributes) {
  if (attributes.type != kType) return std::nullopt;
  // Older kernels do not have the revision, but show a life of 0 where the card has none.
  if (!attributes.revision.empty()) {
    const auto revision = parseHexByte(attributes.revision);
    if (!revision || *revision < kFirstRevisionWithLife) return std::nullopt;
  }
  const std::size_t blank = std::min(attributes.lifeTime.find(' '), attributes.lifeTime.size());
  const auto first = parseHexByte(attributes.lifeTime.substr(0, blank));
  const auto second = parseHexByte(trimmed(attributes.lifeTime.substr(blank)));
  return wearOf(first.value_or(0), second.value_or(0),
                parseHexByte(attributes.preEndOfLife).value_or(0));
}

std::optional<Wear> parseExtendedRegisters(std::string_view hexadecimal) {
  if (hexadecimal.size() != 2 * kRegisters) return std::nullopt;
  const auto at = [&](std::size_t index) {
    return parseHexByte(hexadecimal.substr(2 * index, 2)).value_or(0);
  };
  if (at(kRevisionAt) < kFirstRevisionWithLife) return std::nullopt;
  return wearOf(at(kFastLifeAt), at(kLifeAt), at(kPreEndOfLifeAt));
}

std::optional<Wear> readEmmc(const SystemTree& tree, const std::string& name) {
  const auto attribute = [&](const char* file) {
    return tree.text(folderOf(name) + file).value_or("");
  };
  const std::string type = attribute("type"), revision = attribute("rev"),
                    lifeTime = attribute("life_time"), preEndOfLife = attribute("pre_eol_info");
  if (type != kType) return std::nullopt;
  // Older kernels have the registers, but no attributes for the life.
  if (auto live = readLive(tree, name)) return live;
  auto wear = parseEmmc({type, revision, lifeTime, preEndOfLife});
  if (wear) wear->ageSeconds = uptimeSeconds(tree);
  return wear;
}

std::string emmcIdentity(const SystemTree& tree, const std::string& name) {
  // The whole card identification: a serial number is unique to its maker only.
  const auto whole = tree.text(folderOf(name) + "cid");
  return whole ? *whole : tree.text(folderOf(name) + "serial").value_or("");
}

}  // namespace tally
