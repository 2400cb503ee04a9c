// The places of the counters in each layout.
#include "storage/vendor_counters.h"

#include "base/byte_reader.h"

namespace tally {
namespace {

// Words of the record, first to last, and the words of the bus block that they come from.
struct Copy {
  std::uint16_t firstTarget, lastTarget, firstSource, lastSource;
};

constexpr Copy k1y[] = {
    {0, 7, 256, 263},   {8, 8, 265, 265},     {9, 18, 267, 276},    {19, 19, 303, 303},
    {20, 21, 390, 391}, {22, 22, 372, 372},   {33, 40, 278, 285},   {41, 41, 277, 277},
    {42, 42, 290, 290}, {43, 43, 371, 371},   {44, 44, 393, 393},   {45, 45, 392, 392},
    {56, 63, 292, 299}, {65, 65, 21, 21},     {66, 66, 305, 305},   {67, 67, 306, 306},
    {68, 72, 313, 317}, {73, 73, 370, 370},   {74, 74, 15, 15},     {75, 75, 531, 531},
    {76, 76, 532, 532}, {103, 122, 318, 337}, {125, 144, 338, 357}, {145, 156, 373, 384},
};

constexpr Copy k1xSandisk[] = {
    {0, 4, 256, 260},   {5, 5, 261, 261},   {8, 8, 265, 265},   {9, 15, 267, 273},
    {17, 18, 275, 276}, {19, 19, 301, 301}, {33, 37, 278, 282}, {38, 38, 283, 283},
    {41, 41, 277, 277}, {42, 42, 288, 288}, {56, 63, 290, 297}, {65, 65, 16, 16},
    {66, 66, 303, 303}, {67, 67, 304, 304}, {68, 72, 311, 315}, {74, 74, 10, 10},
};

constexpr Copy k1xHynix[] = {
    {0, 3, 256, 259},   {8, 8, 263, 263},   {9, 15, 265, 271},  {17, 18, 273, 274},
    {19, 19, 297, 297}, {33, 35, 276, 278}, {36, 36, 279, 279}, {41, 41, 275, 275},
    {42, 42, 284, 284}, {56, 63, 286, 293}, {65, 65, 16, 16},   {66, 66, 299, 299},
    {67, 67, 300, 300}, {68, 72, 307, 311}, {74, 74, 10, 10},
};

constexpr Copy kAlgoGeneric[] = {
    {0, 18, 0, 18},       {19, 19, 37, 37},   {20, 21, 117, 118},  {22, 22, 91, 91},
    {33, 40, 20, 27},     {41, 41, 19, 19},   {42, 42, 116, 116},  {43, 43, 90, 90},
    {44, 44, 120, 120},   {45, 45, 119, 119}, {56, 63, 28, 35},    {65, 65, 104, 104},
    {66, 72, 38, 44},     {73, 73, 89, 89},   {74, 74, 105, 105},  {75, 76, 114, 115},
    {103, 122, 45, 64},   {125, 144, 67, 86}, {145, 156, 92, 103}, {157, 163, 106, 112},
    {164, 164, 113, 113},
};

constexpr Copy kAlgoGenericQ9[] = {
    {0, 7, 0, 7},       {9, 18, 9, 18},     {19, 19, 27, 27},   {20, 21, 105, 106},
    {22, 22, 79, 79},   {25, 28, 115, 118}, {29, 29, 8, 8},     {30, 31, 120, 121},
    {32, 32, 110, 110}, {41, 41, 19, 19},   {42, 42, 104, 104}, {43, 43, 78, 78},
    {44, 44, 108, 108}, {45, 45, 107, 107}, {46, 46, 122, 122}, {56, 58, 20, 22},
    {60, 62, 23, 25},   {65, 65, 92, 92},   {66, 67, 28, 29},   {74, 74, 93, 93},
    {75, 76, 102, 103}, {78, 80, 30, 32},   {81, 81, 77, 77},   {82, 84, 112, 114},
    {85, 85, 126, 126}, {86, 86, 123, 123}, {87, 91, 94, 98},   {93, 95, 99, 101},
    {96, 96, 109, 109}, {97, 97, 111, 111}, {98, 101, 45, 48},  {102, 102, 26, 26},
    {103, 113, 33, 43}, {114, 114, 44, 44}, {125, 144, 55, 74}, {145, 155, 80, 90},
    {156, 156, 91, 91}, {167, 167, 75, 75}, {168, 168, 76, 76},
};

// Every range is as long as the one that it is copied from, and none is written twice.
constexpr bool isSound(std::span<const Copy> layout) {
  std::array<bool, std::tuple_size_v<NandAlgoCounters>> written{};
  for (const Copy& copy : layout) {
    if (copy.lastTarget >= written.size() || copy.firstTarget > copy.lastTarget) return false;
    if (copy.lastTarget - copy.firstTarget != copy.lastSource - copy.firstSource) return false;
    for (std::size_t target = copy.firstTarget; target <= copy.lastTarget; ++target) {
      if (written[target]) return false;
      written[target] = true;
    }
  }
  return true;
}
static_assert(isSound(k1y) && isSound(k1xSandisk) && isSound(k1xHynix) && isSound(kAlgoGeneric) &&
              isSound(kAlgoGenericQ9));

std::uint32_t copyWords(std::span<const Copy> layout, BusBlock busBlock, NandAlgoCounters& record) {
  const ByteReader words(busBlock);
  std::uint32_t last = 0;
  for (const Copy& copy : layout) {
    for (std::size_t i = 0; copy.firstTarget + i <= copy.lastTarget; ++i) {
      const auto word = words.read<std::uint32_t>((copy.firstSource + i) * sizeof(std::uint32_t));
      if (word) record[copy.firstTarget + i] = last = *word;
    }
  }
  return last;
}

}  // namespace

void parseCounters1y(BusBlock busBlock, NandAlgoCounters& record) {
  copyWords(k1y, busBlock, record);
}
void parseCounters1xSandisk(BusBlock busBlock, NandAlgoCounters& record) {
  copyWords(k1xSandisk, busBlock, record);
}
void parseCounters1xHynix(BusBlock busBlock, NandAlgoCounters& record) {
  copyWords(k1xHynix, busBlock, record);
}
std::uint32_t parseOnlyAlgoGenericCounters(BusBlock busBlock, NandAlgoCounters& record) {
  return copyWords(kAlgoGeneric, busBlock, record);
}
std::uint32_t parseOnlyAlgoGenericCountersQ9(BusBlock busBlock, NandAlgoCounters& record) {
  return copyWords(kAlgoGenericQ9, busBlock, record);
}
void parseCountersAlgoGeneric(BusBlock busBlock, NandAlgoCounters& record) {
  parseOnlyAlgoGenericCounters(busBlock, record);
}
void parseCountersAlgoGenericQ9(BusBlock busBlock, NandAlgoCounters& record) {
  parseOnlyAlgoGenericCountersQ9(busBlock, record);
}

}  // namespace tally
