#include "config/whitelist_content.h"

#include <algorithm>
#include <array>
#include <utility>

#include "base/hash.h"
#include "base/utf8.h"
#include "config/whitelist_file.h"

namespace tally {

class WhitelistContent::Builder final : public PlistReceiver {
 public:
  // Null if the root was not a dictionary.
  std::shared_ptr<const WhitelistContent> take() {
    content_->texts_ = std::move(texts_);
    return hasRoot_ ? std::move(content_) : nullptr;
  }

  // Options are.
  bool wantsObject() override { return depth_ == kLevels && ignored_ == 0; }

  void beginContainer(KvType type) override {
    const bool isKnown = type == KvType::Dictionary && depth_ < kLevels &&
                         (depth_ != kEntries || sectionOfName(pendingName()).has_value());
    if (ignored_ > 0 || !isKnown) {
      ++ignored_;
    } else {
      first_[depth_] = items(depth_).size();
      ++depth_;
    }
  }

  void endContainer() override {
    if (ignored_ > 0) {
      --ignored_;
      return;
    }
    const auto range = endDictionary(--depth_);
    if (depth_ > 0) {
      items(depth_ - 1).back().value = range;
    } else {
      content_->root_ = range;
      hasRoot_ = true;
    }
  }

  void key(std::string_view text) override {
    if (ignored_ > 0) return;
    std::string repaired;
    if (!isValidUtf8(text)) text = repaired = repairUtf8(text);
    auto& characters = texts_->characters;
    items(depth_ - 1)
        .push_back({static_cast<std::uint32_t>(characters.size()),
                    static_cast<std::uint32_t>(text.size()), kNotDictionary});
    characters.insert(characters.end(), text.begin(), text.end());
  }

  void value(KvRef<KvObject> value) override {
    if (ignored_ > 0 || depth_ != kLevels) return;
    if (auto* const options = kvCast<KvDictionary>(value.get())) {
      items(kEntries).back().value = texts_->options.add(KvRef<KvDictionary>::share(options));
    }
  }

 private:
  using Items = std::vector<Item, LargeAllocator<Item>>;
  Items& items(int level) { return content_->items_[level]; }
  std::string_view nameOf(const Item& item) const {
    return {texts_->characters.data() + item.text, item.length};
  }
  std::string_view pendingName() { return nameOf(items(depth_ - 1).back()); }

  std::uint32_t endDictionary(int level) {
    const std::size_t first = first_[level];
    joinRepeated(items(level), first);
    content_->ranges_.push_back({static_cast<std::uint32_t>(first),
                                 static_cast<std::uint32_t>(items(level).size() - first)});
    return static_cast<std::uint32_t>(content_->ranges_.size() - 1);
  }

  // Leaves one item of each name from the first one on.
  void joinRepeated(Items& all, std::size_t first) const {
    constexpr std::size_t kFew = 12;  // up to here a scan beats an index
    std::size_t kept = first;
    if (all.size() - first > kFew) {
      kept = joinByIndex(all, first);
    } else {
      for (std::size_t i = first; i < all.size(); ++i) {
        std::size_t same = first;
        while (same < kept && nameOf(all[same]) != nameOf(all[i])) ++same;
        kept += join(all, i, same, kept);
      }
    }
    all.resize(kept);
  }

  // Keeps item i at the end of what is kept, or its value in a kept one of the same name.
  static std::size_t join(Items& all, std::size_t i, std::size_t same, std::size_t kept) {
    if (same == kept) {
      all[kept] = all[i];
      return 1;
    }
    all[same].value = all[i].value;
    return 0;
  }

  // Some hashes ahead, since each slot of a large index is one that the cache does not have.
  std::size_t joinByIndex(Items& all, std::size_t first) const {
    HashIndex index;
    index.reserve(all.size() - first);
    std::size_t kept = first;
    std::array<std::uint32_t, 32> hashes;
    for (std::size_t i = first; i < all.size();) {
      const std::size_t block = std::min(all.size() - i, hashes.size());
      for (std::size_t j = 0; j < block; ++j) {
        hashes[j] = hashBytes(nameOf(all[i + j]));
        index.prefetch(hashes[j]);
      }
      for (std::size_t j = 0; j < block; ++j, ++i) {
        const std::string_view name = nameOf(all[i]);
        const auto found =
            index.findOrAdd(hashes[j], static_cast<std::uint32_t>(kept),
                            [&](std::uint32_t other) { return nameOf(all[other]) == name; });
        kept += join(all, i, found != HashIndex::kNone ? found : kept, kept);
      }
    }
    return kept;
  }

  std::shared_ptr<WhitelistTexts> texts_ = std::make_shared<WhitelistTexts>();
  std::shared_ptr<WhitelistContent> content_ = std::make_shared<WhitelistContent>();
  bool hasRoot_ = false;
  int depth_ = 0;            // dictionaries that are open; the innermost has level depth_ - 1
  std::size_t ignored_ = 0;  // containers that are open in a value that says nothing
  std::size_t first_[kLevels] = {};  // items of the open dictionaries
};

Result<std::shared_ptr<const WhitelistContent>> WhitelistContent::read(DocumentWindow& window) {
  Builder builder;
  if (const Status isRead = readPlist(window, builder); !isRead) return isRead.error();
  auto content = builder.take();
  if (!content) return Error{"the root is not a dictionary"};
  return content;
}

std::shared_ptr<const WhitelistContent> WhitelistContent::of(const KvRef<KvDictionary>& root) {
  Builder builder;
  replayPlist(root, builder);
  return builder.take();
}

}  // namespace tally
