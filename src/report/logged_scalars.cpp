#include "report/logged_scalars.h"

#include <algorithm>
#include <vector>

#include "base/varint.h"

namespace tally {
namespace {

// Tags, indentation and the longest number; and the longest reference in place of a character.
constexpr std::size_t kMostAroundScalar = 80, kMostOfKeyByte = 5;

void appendNumber(std::string& out, std::uint64_t number) {
  std::byte bytes[kLongestVarint];
  out.append(reinterpret_cast<const char*>(bytes),
             static_cast<std::size_t>(putVarint(bytes, number) - bytes));
}

std::uint64_t takeNumber(std::string_view& rows) {
  return takeVarint([&rows] {
    const auto byte = static_cast<std::byte>(rows.front());
    rows.remove_prefix(1);
    return byte;
  });
}

}  // namespace

class LoggedScalars::Cursor {
 public:
  explicit Cursor(const LoggedScalars& scalars);
  bool next();
  std::string_view key() const { return key_; }
  std::int64_t value() const { return value_; }

 private:
  struct Other {
    std::string_view key;
    std::int64_t value;
    bool isRow;
  };
  void takeRow();
  // The value that the key was given after its row.
  void replaceValue();

  std::string_view rows_;
  std::string key_;
  std::int64_t value_ = 0;
  std::vector<Other> others_;  // in their order
  std::vector<Other*> byKey_;  // in the order of keys
  std::size_t nextByKey_ = 0, nextOther_ = 0;
};

void LoggedScalars::set(std::string_view key, std::int64_t value) {
  mostBytes_ += kMostAroundScalar + kMostOfKeyByte * key.size();
  if (!others_->empty() || (!rows_.empty() && key <= last_)) {
    others_->set(key, KvNumber::int64(value));
    return;
  }
  const auto shared = static_cast<std::size_t>(std::ranges::mismatch(key, last_).in1 - key.begin());
  appendNumber(rows_, shared);
  appendNumber(rows_, key.size() - shared);
  rows_.append(key.substr(shared));
  appendNumber(rows_, zigzag(value));
  last_.replace(shared, std::string::npos, key.substr(shared));
}

bool LoggedScalars::each(
    const std::function<bool(std::string_view key, std::int64_t value)>& handler) const {
  Cursor cursor(*this);
  while (cursor.next()) {
    if (!handler(cursor.key(), cursor.value())) return false;
  }
  return true;
}

LoggedScalars::Cursor::Cursor(const LoggedScalars& scalars) : rows_(scalars.rows_) {
  others_.reserve(scalars.others_->size());
  for (const auto& [key, value] : *scalars.others_) {
    others_.push_back({key->view(), static_cast<const KvNumber&>(*value).asInt64(), false});
  }
  byKey_.reserve(others_.size());
  for (Other& other : others_) byKey_.push_back(&other);
  std::ranges::sort(byKey_, {}, [](const Other* other) { return other->key; });
}

bool LoggedScalars::Cursor::next() {
  if (!rows_.empty()) {
    takeRow();
    replaceValue();
    return true;
  }
  while (nextOther_ < others_.size() && others_[nextOther_].isRow) ++nextOther_;
  if (nextOther_ == others_.size()) return false;
  key_ = others_[nextOther_].key;
  value_ = others_[nextOther_].value;
  ++nextOther_;
  return true;
}

void LoggedScalars::Cursor::takeRow() {
  const auto shared = static_cast<std::size_t>(takeNumber(rows_));
  const auto rest = static_cast<std::size_t>(takeNumber(rows_));
  key_.replace(shared, std::string::npos, rows_.substr(0, rest));
  rows_.remove_prefix(rest);
  value_ = unzigzag(takeNumber(rows_));
}

void LoggedScalars::Cursor::replaceValue() {
  while (nextByKey_ < byKey_.size() && byKey_[nextByKey_]->key < key_) ++nextByKey_;
  if (nextByKey_ == byKey_.size() || byKey_[nextByKey_]->key != key_) return;
  byKey_[nextByKey_]->isRow = true;
  value_ = byKey_[nextByKey_]->value;
}

}  // namespace tally
