// Notices that an array was changed in place.
#pragma once

#include <cstddef>

#include "kv/export.h"

namespace tally {

// How often an item of any array was replaced or removed: what was read from arrays before still
// holds while the number is the same.
TALLY_API std::size_t kvArrayChanges() noexcept;
void kvNoteArrayChange() noexcept;

}  // namespace tally
