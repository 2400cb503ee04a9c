#include "host/flash/ufs.h"

#include "host/flash/life_time.h"

namespace tally {

std::optional<Wear> parseUfs(const UfsHealth& health) {
  const auto code = [](std::string_view text) { return parseHexByte(text).value_or(0); };
  Wear wear;
  wear.fastUsed = reported(usedOfLifeTime(code(health.lifeTimeA)), "`life_time_estimation_a`");
  wear.used = reported(usedOfLifeTime(code(health.lifeTimeB)), "`life_time_estimation_b`");
  wear.spare = reported(spareOfPreEndOfLife(code(health.endOfLife)), "`eol_info`");
  return wear.isKnown() ? std::optional(wear) : std::nullopt;
}

std::string ufsController(const SystemTree& tree, const std::string& name) {
  // Drivers have different names, and some controllers are on PCI: the descriptor tells.
  auto place = tree.resolve("/sys/block/" + name + "/device");
  for (int level = 0; place && place->size() > 1 && level < 16; ++level) {
    if (tree.exists(*place + "/health_descriptor")) return *place;
    place->resize(std::min(place->rfind('/'), place->size()));
  }
  return {};
}

std::optional<Wear> readUfs(const SystemTree& tree, const std::string& controller) {
  const auto attribute = [&](const char* file) {
    return tree.text(controller + "/health_descriptor/" + file).value_or("");
  };
  const std::string endOfLife = attribute("eol_info"), a = attribute("life_time_estimation_a"),
                    b = attribute("life_time_estimation_b");
  return parseUfs({endOfLife, a, b});
}

std::string ufsIdentity(const SystemTree& tree, const std::string& controller) {
  return tree.text(controller + "/string_descriptors/serial_number").value_or("");
}

}  // namespace tally
