#include "config/whitelist_content.h"

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
    const bool isLarge = all.size() - first > kFew;
    HashIndex index;
    if (isLarge) index.reserve(all.size() - first);
    std::size_t kept = first;
    for (std::size_t i = first; i < all.size(); ++i) {
      const std::string_view name = nameOf(all[i]);
      const auto isSame = [&](std::size_t other) { return nameOf(all[other]) == name; };
      std::size_t same = first;
      if (isLarge) {
        const auto found = index.findOrAdd(hashBytes(name), static_cast<std::uint32_t>(kept),
                                           [&](std::uint32_t other) { return isSame(other); });
        same = found != HashIndex::kNone ? found : kept;
      } else {
        while (same < kept && !isSame(same)) ++same;
      }
      if (same == kept) {
        all[kept++] = all[i];
      } else {
        all[same].value = all[i].value;
      }
    }
    all.resize(kept);
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
