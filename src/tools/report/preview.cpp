#include "tools/report/preview.h"

#include <utility>

#include "kv/plist_codec.h"
#include "report/daily_report.h"
#include "report/document.h"
#include "tools/frame/dry_run.h"

namespace tally::tools {

Preview previewLog(const Platform& platform, std::int32_t day, KeyTrace* trace) {
  DryRun run;
  Platform variant = run.variantOf(platform);
  writeDailyLog(variant, day, nullptr, trace);
  Preview preview;
  if (run.logs.empty()) return preview;
  preview.options = std::move(run.logs.front().options);
  preview.body = std::move(run.logs.front().body);
  if (const auto root = decodePlist(preview.body, kDailyLogMaximumBytes)) {
    preview.document = KvRef<KvDictionary>::share(kvCast<KvDictionary>(root->get()));
  }
  return preview;
}

}  // namespace tally::tools
