// What the memory freezer wrote. Every call measures afresh.
#pragma once

#include <cstdint>
#include <string_view>

#include "kv/value.h"

namespace tally {

// A failure is a pair of entries, as in nand_info.h: the string "1", and what failed.
constexpr std::string_view kNANDInfoVMFreezerNumPhysicalWritesKey =
    "vellum.NANDInfo.VMFreezer.NumPhysicalWrites";  // bytes, signed 64-bit
constexpr std::string_view kNANDInfoVMFreezerErrorKey = "vellum.NANDInfo.VMFreezer.Error";
constexpr std::string_view kNANDInfoVMFreezerErrorMessageKey =
    "vellum.NANDInfo.VMFreezer.ErrorMessage";

// The bytes that the memory freezer wrote, or its failure pair. Never null.
TALLY_API KvRef<KvDictionary> CopyVMFreezerNANDInfo();
// The same figure from a stackshot that is taken now. False leaves *result alone.
TALLY_API bool measureFreezerWrites(std::uint64_t* result);

}  // namespace tally
