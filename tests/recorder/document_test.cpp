// The tables of docs/recording.md, as the recorder's own tables make them.
#include <fmt/format.h>

#include "document_table.h"
#include "platform/tables/recorder_settings.h"
#include "recorder/refusal.h"

namespace tally {
namespace {

TEST(RecordingDocument, CountsAndSettings) {
  std::string counts = "| scalar | counts |\n|---|---|\n";
  for (const RefusalRow& row : kRefusals)
    counts += fmt::format("| `{}` | {} |\n", row.key, row.meaning);
  for (const RefusalRow& row : kRecorderCounts) {
    counts += fmt::format("| `{}` | {} |\n", row.key, row.meaning);
  }
  expectInDocument("recording.md", counts);
  std::string settings = "| setting | value | without it |\n|---|---|---|\n";
  for (const RecorderNumberRow& row : kRecorderNumbers) {
    settings += fmt::format("| `{}` | {} | {} |\n", row.name, row.meaning, row.fallback);
  }
  for (const RecorderTextRow& row : kRecorderTexts) {
    settings += fmt::format("| `{}` | {}: {} | |\n", row.name, row.form, row.meaning);
  }
  expectInDocument("recording.md", settings);
}

}  // namespace
}  // namespace tally
