// The scalars of one daily log.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Keys and values in the order of a dictionary: a new key comes last, a known one keeps its place
// and gets the new value. Made for keys that come in rising order, as the store's do: such a row
// takes about ten bytes, since of its key only what differs from the one before is kept.
class LoggedScalars {
 public:
  // The key is valid UTF-8.
  void set(std::string_view key, std::int64_t value);
  bool empty() const { return rows_.empty() && others_->empty(); }
  // An upper bound of the size of these scalars in a document.
  std::size_t mostBytes() const { return mostBytes_; }

  // Calls handler(key, value) for each, in order, as long as it returns true. False when it did
  // not.
  bool each(const std::function<bool(std::string_view key, std::int64_t value)>& handler) const;

 private:
  class Cursor;

  // Each row: how many bytes its key shares with the one before, how many follow, these, and the
  // value.
  std::string rows_;
  std::string last_;  // the last key of the rows
  // Keys that did not rise, or were set after the rows: they come after these unless they are among
  // them.
  KvRef<KvDictionary> others_ = KvDictionary::create();
  std::size_t mostBytes_ = 0;
};

}  // namespace tally
