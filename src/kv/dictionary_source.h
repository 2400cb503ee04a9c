// Dictionaries whose entries are made when they are first asked for.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "kv/maker.h"
#include "kv/value.h"

namespace tally {

// What very many dictionaries are made from. Each that is still pending keeps it alive.
class KvDictionarySource {
 public:
  KvDictionarySource(const KvDictionarySource&) = delete;
  KvDictionarySource& operator=(const KvDictionarySource&) = delete;
  virtual ~KvDictionarySource() = default;
  void retain() const noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
  void release() const noexcept {
    if (references_.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
  }
  // Adds the entries to the dictionary, which has none.
  virtual void fill(KvDictionary& dictionary, const KvPending& pending) const = 0;

 protected:
  KvDictionarySource() noexcept = default;

 private:
  mutable std::atomic<std::uint32_t> references_{1};
};

// What a source does with its dictionaries.
class KvPendingAccess {
 public:
  static KvRef<KvDictionary> make(const KvDictionarySource& source, std::uint32_t row,
                                  KvArena* arena = nullptr) {
    const KvPending pending = {&source, row, 0};
    auto made = KvMaker::make<KvDictionary>(arena, 0, &pending);
    source.retain();
    return made;
  }
  // Null once the entries have been made.
  static KvPending* of(const KvDictionary* dictionary) noexcept {
    return dictionary != nullptr && dictionary->isPending_ ? &dictionary->pending_ : nullptr;
  }
  static void reserve(KvDictionary& dictionary, std::size_t entries) {
    dictionary.entries_.reserve(entries);
  }
  // REQUIRES: the key is not there yet.
  static void append(KvDictionary& dictionary, KvRef<KvString> key, KvRef<KvObject> value) {
    dictionary.append(std::move(key), std::move(value));
  }
};

}  // namespace tally
