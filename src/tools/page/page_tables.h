// What many keys of a page have in common, each once: metrics, whitelist entries, ranges and so on.
#pragma once

#include <cstdint>
#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

#include "config/rounding_range.h"
#include "tools/page/page_log.h"

namespace tally::tools {

// Rows that several keys share, numbered in the order of their first use.
template <class Identity>
class SharedRows {
 public:
  // The number of the row of this identity; made by the function at its first use.
  template <class Make>
  int numberOf(const Identity& identity, const Make& make) {
    const auto [found, isNew] = numbers_.try_emplace(identity, static_cast<int>(rows_.size()));
    if (isNew) rows_.push_back(make());
    return found->second;
  }
  Json take() { return std::move(rows_); }

 private:
  std::map<Identity, int> numbers_;
  Json rows_ = Json::array();
};

class PageTables {
 public:
  static constexpr int kNone = -1;

  explicit PageTables(const PageSources& sources) : sources_(sources) {}

  // Numbers of rows; kNone where there is nothing to say.
  int metricOf(std::string_view key);
  // Of the entry that admits the key now.
  int entryOf(const WhitelistMatch& match, KeyKind kind);
  // Of the true values that a value which that entry rounded can stand for.
  int rangeOf(std::int64_t value, int entry);
  int revealOf(std::string_view key, KeyKind kind);
  int reasonOf(const AbsenceReason& reason);
  // Adds the tables to a block; they are empty afterwards.
  void moveInto(Json& block);

 private:
  int groupOf(std::string_view group);
  int exposureOf(std::uint32_t entry);

  const PageSources& sources_;
  SharedRows<const Metric*> metrics_;
  SharedRows<std::string> groups_;
  SharedRows<std::tuple<KeyKind, bool, std::string, std::string, std::string>> entries_;
  std::vector<RoundingInverse> inverses_;  // one for each entry
  SharedRows<std::tuple<std::uint64_t, std::uint64_t, bool>> ranges_;
  SharedRows<std::string> reveals_;
  SharedRows<std::uint32_t> exposures_;
  SharedRows<std::pair<Absence, std::string>> reasons_;
};

}  // namespace tally::tools
