// What the recorder says about itself.
#include <algorithm>

#include "kv/plist_codec.h"
#include "recorder/recorder.h"

namespace tally {
namespace {

KvRef<KvObject> number(std::uint64_t value) {
  return KvNumber::int64(static_cast<std::int64_t>(value));
}

template <class Rows, class Counts>
KvRef<KvDictionary> countsOf(const Rows& rows, const Counts& counts) {
  auto dictionary = KvDictionary::create();
  for (std::size_t i = 0; i < counts.size(); ++i) {
    if (counts[i] != 0) dictionary->set(rows[i].name, number(counts[i]));
  }
  return dictionary;
}

}  // namespace

std::string Recorder::statusText() const {
  auto users = KvArray::create();
  for (const RecordingUser& user : users_.all()) {
    auto row = KvDictionary::create();
    row->set("user", KvNumber::int64(user.sender.user));
    row->set("metrics", number(user.metrics));
    row->set("keys", number(user.keysToday));
    row->set("bytes", number(user.bytes));
    row->set("refused", countsOf(kRefusals, user.refused));
    users->append(std::move(row));
  }
  auto status = KvDictionary::create();
  constexpr double kNanoseconds = 1e9;
  const auto seconds = [&](std::int64_t since) {
    return KvNumber::float64(static_cast<double>(bootNanoseconds_ - since) / kNanoseconds);
  };
  status->set("seconds", seconds(startedAt_));
  if (now_.day) status->set("day", KvNumber::int32(*now_.day));
  status->set("metrics", number(metrics_));
  status->set("keys", number(keys_ ? keys_->size() : 0));
  status->set("keys_changed", number(keys_ ? keys_->dirty().size() : 0));
  status->set("samples_held", number(samplesHeld_));
  status->set("bytes_held", number(bytes()));
  status->set("bytes_limit", number(memoryForData()));
  if (heldSince_) status->set("held_seconds", seconds(*heldSince_));
  status->set("commits", number(commitsEnded_ - commitsFailed_));
  status->set("commits_failed", number(commitsFailed_));
  if (!lastFailure_.empty()) status->set("failure", KvString::create(lastFailure_));
  if (lastCommitAt_) status->set("last_commit", KvNumber::float64(*lastCommitAt_));
  status->set("refused", countsOf(kRefusals, refused_));
  status->set("counts", countsOf(kRecorderCounts, counts_));
  status->set("users", std::move(users));
  const auto text = encodeXmlPlist(*status);
  return text ? *text : "failed: " + text.error().message + "\n";
}

}  // namespace tally
