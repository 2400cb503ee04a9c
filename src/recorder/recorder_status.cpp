#include "recorder/recorder_status.h"

#include "kv/plist_codec.h"

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

KvRef<KvObject> secondsBetween(std::int64_t from, std::int64_t to) {
  constexpr double kNanoseconds = 1e9;
  return KvNumber::float64(static_cast<double>(to - from) / kNanoseconds);
}

KvRef<KvArray> usersOf(const RecordingUsers& users) {
  auto rows = KvArray::create();
  for (const RecordingUser& user : users.all()) {
    auto row = KvDictionary::create();
    row->set("user", KvNumber::int64(user.sender.user));
    row->set("metrics", number(user.metrics));
    row->set("keys", number(user.keysToday));
    row->set("bytes", number(user.bytes));
    row->set("refused", countsOf(kRefusals, user.refused));
    rows->append(std::move(row));
  }
  return rows;
}

KvRef<KvArray> refusedKeysOf(const MetricIntake& intake) {
  auto rows = KvArray::create();
  for (const RefusedNames::Row& refused : intake.refusedNames().all()) {
    auto row = KvDictionary::create();
    row->set("key", KvString::create(intake.keyOf(refused)));
    row->set("reason", KvString::create(kRefusals[static_cast<std::size_t>(refused.refusal)].name));
    if (refused.kind != RefusedNames::Kind::Unknown) {
      row->set("kind", KvString::create(
                           refused.kind == RefusedNames::Kind::Scalar ? "scalar" : "distribution"));
    }
    if (refused.day) row->set("day", KvNumber::int32(*refused.day));
    row->set("count", number(refused.count));
    rows->append(std::move(row));
  }
  return rows;
}

}  // namespace

std::string recorderStatusText(const MetricIntake& intake, const CommitFigures& commits,
                               const RecordingMoment& now) {
  auto status = KvDictionary::create();
  status->set("seconds", secondsBetween(commits.startedAt, now.bootNanoseconds));
  if (now.day) status->set("day", KvNumber::int32(*now.day));
  status->set("metrics", number(intake.metrics()));
  status->set("keys", number(intake.keys()->size()));
  status->set("keys_changed", number(intake.keys()->dirty().size()));
  status->set("samples_held", number(intake.samples()));
  status->set("bytes_held", number(intake.bytes()));
  status->set("bytes_limit", number(intake.mostBytes()));
  if (intake.heldSince()) {
    status->set("held_seconds", secondsBetween(*intake.heldSince(), now.bootNanoseconds));
  }
  status->set("commits", number(commits.ended - commits.failed));
  status->set("commits_failed", number(commits.failed));
  if (!commits.failure.empty()) status->set("failure", KvString::create(commits.failure));
  if (commits.lastSuccess) status->set("last_commit", KvNumber::float64(*commits.lastSuccess));
  status->set("refused", countsOf(kRefusals, intake.refused()));
  status->set("counts", countsOf(kRecorderCounts, intake.counts()));
  status->set("refused_keys", refusedKeysOf(intake));
  status->set("users", usersOf(intake.users()));
  const auto text = encodeXmlPlist(*status);
  return text ? *text : "failed: " + text.error().message + "\n";
}

}  // namespace tally
