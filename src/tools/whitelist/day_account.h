// What becomes of every key of a day: the entry that admits it, or why it does not leave.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/report/daily_log.h"
#include "tools/whitelist/absence.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {

struct KeyAccount {
  std::string key;
  KeyKind kind = KeyKind::Scalar;
  ValueState value;
  // The deciding entry and its options; their pointers are valid as long as the judge.
  WhitelistMatch match;
  std::optional<AbsenceReason> absence;  // from a log of the day that is made now; empty: it has it

  // Of the entry that decides. REQUIRES: match.entry is not null.
  WhitelistSection section() const;
};

struct DayAccount {
  std::int32_t day = 0;
  std::vector<KeyAccount> keys;  // by key, scalars first
  // Why the keys that a log made now would have have not left; empty if a log of the day was
  // submitted, as far as can be told.
  std::optional<AbsenceReason> unsent;

  // Null when there is none.
  const KeyAccount* find(std::string_view key, KeyKind kind) const;
};

enum class AccountScope {
  Day,    // keys that have a value on the day, damaged or refused ones too, and those measured
  Store,  // those that have values on other days as well
};

// `next` is the log of the day that would be made now, which tells what can be measured; null when
// none would be, or it does not matter. Takes well under a second for 100,000 keys and as many
// entries; with AccountScope::Store the whole store is read.
DayAccount accountOfDay(const ToolContext& context, const WhitelistJudge& judge, std::int32_t day,
                        const DailyLog* next = nullptr, AccountScope scope = AccountScope::Day);

// Why nothing of the day has been submitted: submission is forbidden, or the day was not processed.
// Empty if a log of it is in the spool, or was there as far as can be told.
std::optional<AbsenceReason> whyUnsent(const ToolContext& context, std::int32_t day,
                                       bool isInSpool);

// Why a log that was submitted does not have a key. `now` is the key's absence from a log made now,
// `digest` the whitelist's as it is now. REQUIRES: the log does not have the key.
AbsenceReason whyAbsentFrom(const DailyLog& submitted, const std::optional<AbsenceReason>& now,
                            std::string_view digest);

}  // namespace tally::tools
