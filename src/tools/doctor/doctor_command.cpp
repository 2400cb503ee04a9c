#include "tools/doctor/doctor_command.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "base/printable.h"
#include "tools/doctor/health_checks.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

struct HealthName {
  std::string_view name;
  Ink ink;
};
// In the order of Health.
constexpr HealthName kNames[] = {
    {"ok", Ink::Good}, {"missing", Ink::Doubtful}, {"wrong", Ink::Bad}};

int examine(const ToolContext& context) {
  const auto lines = examineDevice(context);
  const auto wrong =
      static_cast<std::size_t>(std::ranges::count(lines, Health::Wrong, &HealthLine::health));
  Json document = Json::array();
  Table table({{""}, {"", Align::Left}, {"", Align::Left, true}});
  for (const HealthLine& line : lines) {
    const HealthName& health = kNames[static_cast<std::size_t>(line.health)];
    table.add({Cell(fmt::format("[{}]", health.name), health.ink), line.subject, line.text});
    document.push_back({{"health", health.name}, {"subject", line.subject}, {"text", line.text}});
    if (!line.repair.empty()) document.back()["repair"] = line.repair;
  }
  if (context.json) {
    printJson(context, document);
  } else {
    print(context.out, table.render(context.output, 0));
    for (const HealthLine& line : lines) {  // whole, so that it can be copied
      if (line.repair.empty()) continue;
      print(context.out, "\n");
      printLine(context,
                fmt::format("If the clock is right now, this repairs the {}:", line.subject));
      print(context.out, "  " + printable(line.repair) + "\n");
    }
    print(context.out, "\n");
    printLine(context, wrong == 0 ? "nothing is wrong" : fmt::format("{} wrong", wrong),
              wrong == 0 ? Ink::Good : Ink::Bad);
  }
  return wrong == 0 ? kSuccess : kWrong;
}

}  // namespace

void addDoctorCommand(CLI::App& app, ToolContext& context) {
  addCommand(&app, context, "doctor",
             "Check which parts of this device respond, and what is missing",
             [&context] { return examine(context); });
}

}  // namespace tally::tools
