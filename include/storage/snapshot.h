// The storage processor's snapshots as text: one line for each interval, below a key that explains
// the columns. Neither function allocates, reads outside the buffers it is given, or reports an
// error in another way than by its result.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

#include "kv/export.h"

namespace tally {

// Bytes of a record of the fixed layout.
constexpr std::uint32_t kSPXSnapshotRecordBytes = 252;

// Writes the key and a line for every whole record of the fixed layout. *textSize is the capacity
// of the text at the call. 1: the text is whole, and *textSize its length without the zero byte at
// its end. 0: the text is truncated to the capacity (nothing when that is 0), and *textSize is
// unchanged.
TALLY_API int SPXParseSnapshotBuffer(const void* records, std::uint32_t recordsLength, char* text,
                                     std::uint32_t* textSize);

// Writes lines for records whose fields a description block names, from record *recordCursor on; a
// header precedes record 0. Records that are not whole inside recordsLength are ignored.
//
// 1: all records were written. 0: the text is full. It then ends with the last line that fitted,
// and the cursor is after the record that did not: that record is in no text, so a caller who
// wants every record offers more space and starts again. A header without a line after it is left
// out. *textSize is the capacity at the call, and the bytes used afterwards, zero byte included.
//
// A description that is null leaves everything alone and gives 0, as does a capacity of 0. One that
// cannot be honoured in full (it ends early, a field is outside the record, a label format has
// anything but one integer conversion) gives an empty text, a size of 1, 0 and the same cursor.
TALLY_API int SPXParseSnapshotBufferWithInplaceParser(const void* records,
                                                      std::uint32_t recordsLength, char* text,
                                                      std::uint32_t* textSize,
                                                      std::span<const std::byte> description,
                                                      std::uint32_t* recordCursor);

}  // namespace tally
