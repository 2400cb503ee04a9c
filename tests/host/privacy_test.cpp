// docs/privacy.md says everything that is held, as the code's own tables do.
#include <fmt/format.h>
#include <gmock/gmock.h>

#include "document_table.h"
#include "host/held_data.h"
#include "host/spool/submission_identity.h"
#include "host/spool/submitted_hooks.h"
#include "host/spool/waiting_logs.h"
#include "host/store/store_schema.h"
#include "platform/metrics_store.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

TEST(PrivacyDocument, SaysWhatTheCodeHolds) {
  std::string held =
      "| what | where | why | how long | who reads it | how to erase it "
      "|\n|---|---|---|---|---|---|\n";
  std::string places;
  for (const HeldDatum& datum : kHeldData) {
    held += fmt::format("| {} | {} | {} | {} | {} | {} |\n", datum.what, datum.where, datum.purpose,
                        datum.retention, datum.readers, datum.erasure);
    places += datum.where;
  }
  expectInDocument("privacy.md", held);

  std::string preferences =
      "| preference | meaning | erased by `tallyctl forget` |\n|---|---|---|\n";
  for (const KnownPreference& known : kKnownPreferences) {
    preferences += fmt::format("| `{}` `{}` | {} | {} |\n", known.domain,
                               known.key.empty() ? "GROUP" : known.key, known.meaning,
                               known.isHistory ? "yes" : "no");
  }
  expectInDocument("privacy.md", preferences);

  std::vector<std::string> wanted = {fmt::format("`{}/{}`", kIdentityFolder, kIdentityFile),
                                     fmt::format("`{}`", kHooksFolder)};
  for (const LogFolder& folder : kLogFolders) wanted.push_back(fmt::format("`{}`", folder.path));
  for (const std::string_view table : storeTables()) wanted.push_back(fmt::format("`{}`", table));
  for (const std::string& place : wanted) EXPECT_THAT(places, testing::HasSubstr(place));
  EXPECT_TRUE(kStorePath.starts_with(kIdentityFolder)) << "whose companions a row names";
}

}  // namespace
}  // namespace tally
