#include "kv/array_changes.h"

#include <atomic>

namespace tally {
namespace {

std::atomic<std::size_t> changes{0};

}  // namespace

std::size_t kvArrayChanges() noexcept { return changes.load(std::memory_order_acquire); }

void kvNoteArrayChange() noexcept { changes.fetch_add(1, std::memory_order_release); }

}  // namespace tally
