#include "tools/doctor/doctor_command.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "base/printable.h"
#include "tools/doctor/health_drivers.h"
#include "tools/doctor/health_files.h"
#include "tools/doctor/health_kernel.h"
#include "tools/doctor/health_recorder.h"
#include "tools/doctor/health_services.h"
#include "tools/frame/command.h"
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
const HealthName& nameOf(Health health) { return kNames[static_cast<std::size_t>(health)]; }

void printChecks(const ToolContext& context, const HealthChecks& checks, std::size_t wrong) {
  Table table({{""}, {"", Align::Left}, {"", Align::Left, true}});
  for (const HealthCheck& check : checks) {
    const HealthName& health = nameOf(check.health);
    table.add({Cell(fmt::format("[{}]", health.name), health.ink), check.subject, check.text});
  }
  print(context.out, table.render(context.output, 0));
  for (const HealthCheck& check : checks) {  // whole, so that it can be copied
    if (check.repair.empty()) continue;
    print(context.out, "\n");
    printLine(context,
              fmt::format("If the clock is right now, this repairs the {}:", check.subject));
    print(context.out, "  " + printable(check.repair) + "\n");
  }
  print(context.out, "\n");
  printLine(context, wrong == 0 ? "nothing is wrong" : fmt::format("{} wrong", wrong),
            wrong == 0 ? Ink::Good : Ink::Bad);
}

Json jsonOf(const HealthChecks& checks) {
  Json document = Json::array();
  for (const HealthCheck& check : checks) {
    document.push_back(
        {{"health", nameOf(check.health).name}, {"subject", check.subject}, {"text", check.text}});
    if (!check.repair.empty()) document.back()["repair"] = check.repair;
  }
  return document;
}

int examine(const ToolContext& context) {
  HealthChecks checks;
  examineFiles(context, checks);
  examineRecorder(context, checks);
  examineServices(context, checks);
  examineDrivers(context, checks);
  examineKernelSources(context, checks);
  const auto wrong =
      static_cast<std::size_t>(std::ranges::count(checks, Health::Wrong, &HealthCheck::health));
  if (context.json) {
    printJson(context, jsonOf(checks));
  } else {
    printChecks(context, checks, wrong);
  }
  return wrong == 0 ? kSuccess : kWrong;
}

}  // namespace

void addDoctorCommand(CLI::App& app, ToolContext& context) {
  addCommand(app, context, "doctor",
             "Check which parts of this device respond, and what is missing",
             [&context] { return examine(context); });
}

}  // namespace tally::tools
