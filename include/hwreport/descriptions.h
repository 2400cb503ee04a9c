// Channels, samples and units as text for people.
#pragma once

#include <cstdint>

#include "hwreport/error.h"
#include "kv/value.h"

namespace tally {

// "ms", "KiB", "events"; null when the channel has no unit. Borrowed; kept in the channel.
TALLY_API KvString* HwReportChannelGetUnitLabel(KvDictionary* channel);
// One line, ending in a line break, after the prefix (null: none). The reserved word is not used.
// Null when the channel's type cannot be read.
TALLY_API KvRef<KvString> HwReportChannelCopyDescription(KvDictionary* channel,
                                                         std::uint32_t reserved,
                                                         const char* prefix);
// One line for each element of a sampled channel. Null when it cannot be read.
TALLY_API KvRef<KvString> HwReportSampleCopyDescription(KvDictionary* channel,
                                                        std::uint32_t reserved, const char* prefix);
// Writes the text, up to a NUL in it, with one call: HwErrBadArgument for null, HwErrIO when it
// failed, HwErrShortWrite when not all was taken.
TALLY_API HwResult HwReportWriteStringUTF8(int descriptor, const KvString* string);

}  // namespace tally
