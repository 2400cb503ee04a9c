// WhitelistContent: what a whitelist file says, in little memory.
#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string_view>
#include <vector>

#include "base/large_memory.h"
#include "base/result.h"
#include "config/options_pool.h"
#include "kv/plist_codec.h"

namespace tally {

// What the entries of a whitelist point into.
struct WhitelistTexts {
  std::vector<char, LargeAllocator<char>> characters;
  OptionsPool options;
};

// Groups of sections of entries, each level in the order of the file: like nested dictionaries, the
// last value of a repeated key counts, at the place of the first.
class WhitelistContent {
 public:
  static constexpr std::uint32_t kNotDictionary = UINT32_MAX;
  struct Item {
    std::uint32_t text, length;  // of texts
    std::uint32_t value;         // for the functions below, or kNotDictionary
  };

  // An error if the document is damaged or its root is not a dictionary. Everything in the document
  // but the text that it is now at is read and dropped.
  static Result<std::shared_ptr<const WhitelistContent>> read(DocumentWindow& window);
  // Of a value that was read already.
  static std::shared_ptr<const WhitelistContent> of(const KvRef<KvDictionary>& root);

  std::string_view nameOf(const Item& item) const {
    return {texts_->characters.data() + item.text, item.length};
  }
  std::span<const Item> groups() const { return itemsOf(kGroups, root_); }
  // REQUIRES: the value of what they are in is a dictionary.
  std::span<const Item> sectionsOf(const Item& group) const {
    return itemsOf(kSections, group.value);
  }
  // Of a section of a known name only.
  std::span<const Item> entriesOf(const Item& section) const {
    return itemsOf(kEntries, section.value);
  }
  const PooledOptions& optionsOf(const Item& entry) const { return texts_->options[entry.value]; }

  // May outlive the content.
  const std::shared_ptr<const WhitelistTexts>& texts() const { return texts_; }

 private:
  class Builder;
  enum Level { kGroups, kSections, kEntries, kLevels };
  struct Range {
    std::uint32_t first, count;
  };
  std::span<const Item> itemsOf(Level level, std::uint32_t range) const {
    return std::span(items_[level]).subspan(ranges_[range].first, ranges_[range].count);
  }

  std::shared_ptr<const WhitelistTexts> texts_;
  std::vector<Item, LargeAllocator<Item>> items_[kLevels];
  std::vector<Range> ranges_;  // a dictionary each
  std::uint32_t root_ = 0;     // of ranges_
};

}  // namespace tally
