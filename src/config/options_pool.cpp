#include "config/options_pool.h"

#include <algorithm>
#include <string>

namespace tally {
namespace {

// Shows what options hold, in their order. Values of several types may have the same text.
std::string contentText(const KvDictionary& options) {
  std::string text;
  for (const auto& option : options) {
    text.append(option.key->view()) += '\0';
    text.append(kvText(option.value.get())) += '\0';
  }
  return text;
}

bool isWellFormed(const KvDictionary::Entry& option) {
  return isWellFormedOption(option.key->view(), *option.value);
}

KvRef<KvDictionary> wellFormedOf(const KvRef<KvDictionary>& options) {
  if (std::all_of(options->begin(), options->end(), isWellFormed)) return options;
  auto kept = options->copy();
  kept->removeIf([](const KvDictionary::Entry& option) { return !isWellFormed(option); });
  return kept;
}

}  // namespace

std::uint32_t OptionsPool::add(const KvRef<KvDictionary>& options) {
  constexpr std::uintptr_t kAlignment = alignof(KvDictionary);
  const auto address = reinterpret_cast<std::uintptr_t>(options.get()) / kAlignment;
  Recent& recent = recent_[(address ^ address >> 6) % recent_.size()];
  if (recent.options.get() != options.get()) recent = {options, addUnlessKnown(options)};
  return recent.number;
}

std::uint32_t OptionsPool::addUnlessKnown(const KvRef<KvDictionary>& options) {
  const std::string text = contentText(*options);
  const auto number = static_cast<std::uint32_t>(pool_.size());
  const auto known = byContent_.findOrAdd(hashBytes(text), number, [&](std::uint32_t i) {
    const KvDictionary& other = *pool_[i].read;
    return contentText(other) == text && kvIdentical(&other, options.get());
  });
  if (known != HashIndex::kNone) return known;
  pool_.push_back({options, wellFormedOf(options)});
  return number;
}

}  // namespace tally
