#include "tools/storage/nand_event_commands.h"

#include <memory>
#include <nlohmann/json.hpp>
#include <utility>
#include <vector>

#include "storage/analytics_events.h"
#include "storage/nand_info.h"
#include "storage/nand_info/analytics_day.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"
#include "tools/storage/nand_command.h"

namespace tally::tools {
namespace {

struct ShownEvent {
  std::string name;
  bool wanted = false;
  KvRef<KvDictionary> payload;
};

// Replaces the device's service: keeps every event and sends none.
class EventPreview final : public AnalyticsEvents {
 public:
  explicit EventPreview(std::shared_ptr<AnalyticsEvents> service) : service_(std::move(service)) {}
  bool isAvailable() override { return true; }
  bool isEventWanted(std::string_view eventName) override {
    return service_->isAvailable() && service_->isEventWanted(eventName);
  }
  bool PulseSendEventLazy(std::string_view eventName, const PayloadBuilder& builder) override {
    events_.push_back({std::string(eventName), isEventWanted(eventName), builder()});
    return true;
  }
  const std::vector<ShownEvent>& events() const { return events_; }

 private:
  std::shared_ptr<AnalyticsEvents> service_;
  std::vector<ShownEvent> events_;
};

std::vector<ShownEvent> previewEvents(const Platform& platform) {
  Platform services = platform;
  const auto preview = std::make_shared<EventPreview>(services.analyticsEvents);
  services.analyticsEvents = preview;
  const PlatformScope scope(std::move(services));
  LogtoEPNANDInfoWithOptions(kNANDInfoAnalyticsOption);
  return preview->events();
}

std::string valueText(const KvObject* value) {
  const auto* number = kvCast<KvNumber>(value);
  if (number == nullptr || number->isReal()) return kvText(value);
  const bool fits = !number->isUnsigned() || number->asInt64() >= 0;
  return fits ? integerText(number->asInt64()) : kvText(value);
}

void printEvent(const ToolContext& context, const ShownEvent& event) {
  printHeading(context, event.name + (event.wanted ? "" : "  (not wanted)"));
  Table table({{""}, {"", Align::Right}});
  std::size_t zeros = 0;
  for (const auto& [field, value] : *event.payload) {
    const auto* number = kvCast<KvNumber>(value.get());
    if (number != nullptr && number->asUInt64() == 0) {
      ++zeros;
    } else {
      table.add({std::string(field->view()), valueText(value.get())});
    }
  }
  table.print(context);
  if (zeros > 0) {
    printLine(context, "  " + counted(zeros, "field") + " of value 0 not shown", Ink::Faint);
  }
}

Json eventJson(const ShownEvent& event) {
  return {
      {"event", event.name}, {"wanted", event.wanted}, {"payload", jsonOf(event.payload.get())}};
}

int runEvents(const ToolContext& context, const std::string& text) {
  const bool available = context.platform->analyticsEvents->isAvailable();
  auto events = previewEvents(*context.platform);
  const std::size_t all = events.size();
  const auto wanted = std::ranges::count_if(events, &ShownEvent::wanted);
  std::erase_if(
      events, [&](const ShownEvent& event) { return event.name.find(text) == std::string::npos; });
  if (context.json) {
    Json listed = Json::array();
    for (const ShownEvent& event : events) listed.push_back(eventJson(event));
    printJson(context, {{"serviceAvailable", available},
                        {"analyticsDay", isAnalyticsDay()},
                        {"events", std::move(listed)}});
  } else if (!events.empty()) {
    for (const ShownEvent& event : events) printEvent(context, event);
    printLine(context, "");
    printLine(context, counted(all, "event") + ", " + std::to_string(wanted) +
                           " of them wanted; nothing was sent.");
    printLine(context, isAnalyticsDay() ? "Today the figures go to the analytics service."
                                        : "Today the figures go to the metrics store.");
  }
  if (events.empty()) return complain(context, "no event of that name: " + text, kWrong);
  return available ? kSuccess
                   : complain(context, "this device has no analytics-event service", kWrong);
}

}  // namespace

void addNandEventCommands(CLI::App& nand, ToolContext& context) {
  const auto text = std::make_shared<std::string>();
  addNandCommand(nand, context, "events",
                 "Show the analytics events that would be sent now; sends nothing",
                 [&context, text] { return runEvents(context, *text); })
      .optionalArgument(kTextValue, text.get(), "Only events whose name contains it");
}

}  // namespace tally::tools
