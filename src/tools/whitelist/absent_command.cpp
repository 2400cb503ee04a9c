#include "tools/whitelist/absent_command.h"

#include <fmt/format.h>
#include <algorithm>
#include <map>
#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "tools/frame/day_argument.h"
#include "tools/frame/table.h"
#include "tools/report/preview.h"
#include "tools/whitelist/day_account.h"

namespace tally::tools {
namespace {

struct AbsentKey {
  const KeyAccount* account;
  const AbsenceReason* reason;  // null: it has left
};

// What the report would measure if the whitelist listed it has not been recorded.
bool isOfDay(const KeyAccount& account) {
  const bool onlyMeasured = account.value.measured && !account.value.stored;
  return !onlyMeasured || account.match.options != nullptr;
}

std::vector<AbsentKey> keysOf(const DayAccount& day) {
  std::vector<AbsentKey> keys;
  for (const KeyAccount& account : day.keys) {
    if (!isOfDay(account)) continue;
    const auto& reason = account.absence ? account.absence : day.unsent;
    keys.push_back({&account, reason ? &*reason : nullptr});
  }
  return keys;
}

void printAbsent(const ToolContext& context, const DayAccount& day) {
  const std::vector<AbsentKey> keys = keysOf(day);
  std::map<Absence, std::uint64_t> counts;
  for (const AbsentKey& key : keys) {
    if (key.reason != nullptr) ++counts[key.reason->absence];
  }
  printLine(context, dayName(day.day), Ink::Strong);
  Table summary({{"", Align::Right}, {"", Align::Left, /*shrinks=*/true}});
  summary.add({integerText(static_cast<std::int64_t>(keys.size())), "keys in all"});
  for (const auto& [absence, count] : counts) {
    summary.add(
        {integerText(static_cast<std::int64_t>(count)), std::string(rowOf(absence).meaning)});
  }
  summary.print(context);
  Table table({{"key"}, {"kind"}, {"why no log has it", Align::Left, /*shrinks=*/true}});
  for (const AbsentKey& key : keys) {
    if (key.reason == nullptr) continue;
    table.add({key.account->key, std::string(kindName(key.account->kind)), key.reason->detail});
  }
  if (table.empty()) return;
  print(context.out, "\n");
  table.print(context);
}

void printAbsentJson(const ToolContext& context, const DayAccount& day) {
  Json list = Json::array();
  for (const AbsentKey& key : keysOf(day)) {
    Json item = {{"key", key.account->key}, {"kind", kindName(key.account->kind)}};
    item["absence"] = key.reason != nullptr ? Json(rowOf(key.reason->absence).name) : Json(nullptr);
    if (key.reason != nullptr) item["detail"] = key.reason->detail;
    list.push_back(std::move(item));
  }
  printJson(context, {{"day", day.day}, {"keys", std::move(list)}});
}

}  // namespace

int listAbsent(const ToolContext& context, const AbsentArguments& arguments) {
  const auto day = dayOf(context, arguments.day);
  if (!day) return kBadUsage;
  const WhitelistJudge judge(*context.platform, loadWhitelistFile(*context.platform));
  const auto next = DailyLog::of(previewLog(*context.platform, *day).document);
  const DayAccount account =
      accountOfDay(context, judge, *day, next ? &*next : nullptr,
                   arguments.wholeStore ? AccountScope::Store : AccountScope::Day);
  (context.json ? printAbsentJson : printAbsent)(context, account);
  return kSuccess;
}

}  // namespace tally::tools
