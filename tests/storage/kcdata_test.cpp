// The search for a thread's I/O statistics, in well-formed kcdata and in kcdata made to hurt.
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>

#include "fakes/kcdata.h"
#include "storage/auxiliary_metrics.h"

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using fakes::Kcdata;
using fakes::kIo;

// The disk-writes-size figure as text; "none" without statistics, "-" without a match.
std::string search(const Bytes& bytes, const char* wanted = "VM_swapout") {
  const std::unique_ptr<std::byte[]> copy(new std::byte[bytes.size()]);
  std::copy(bytes.begin(), bytes.end(), copy.get());
  std::span<const std::byte> stats;
  if (getIOStatsWithThreadnameFromKCData(copy.get(), copy.get() + bytes.size(), wanted, &stats) ==
      0) {
    return "-";
  }
  if (stats.data() == nullptr) return "none";
  if (stats.size() < 32) return "short";
  std::uint64_t figure;
  std::memcpy(&figure, stats.data() + 24, sizeof figure);
  return std::to_string(figure);
}

TEST(Kcdata, FindsTheThread) {
  const std::string longName(70, 'x');
  const struct {
    const char* name;
    Kcdata data;
    const char* found;
    std::string wanted = "VM_swapout";
  } cases[] = {
      {"nothing", Kcdata(), "-"},
      {"one thread", Kcdata().thread(1, "VM_swapout", 7).stop(), "7"},
      {"zero-terminated name", Kcdata().thread(1, std::string("VM_swapout\0\0", 12), 7), "7"},
      {"name goes on", Kcdata().thread(1, "VM_swapout2", 7).stop(), "-"},
      {"name is a prefix", Kcdata().thread(1, "VM_", 7).stop(), "7"},
      {"name ends early", Kcdata().thread(1, std::string("VM_\0swapout", 11), 7).stop(), "-"},
      {"64 bytes of a name count", Kcdata().thread(1, longName, 7), "7", std::string(64, 'x')},
      {"no name", Kcdata().begin(1).io(7).end(1).stop(), "-"},
      {"no statistics", Kcdata().begin(1).name("VM_swapout").end(1).stop(), "none"},
      {"short statistics", Kcdata().begin(1).name("VM_swapout").item(kIo, 0, Bytes(24)).end(1),
       "short"},
      {"statistics outside", Kcdata().io(5).begin(1).name("VM_swapout").end(1).io(6).stop(),
       "none"},
      {"a later sibling", Kcdata().thread(1, "a", 5).thread(2, "VM_swapout", 7).stop(), "7"},
      {"nested", Kcdata().begin(9).name("task").thread(1, "a", 5).thread(2, "VM_swapout", 7).end(9),
       "7"},
      {"the inner of two", Kcdata().begin(9).name("VM_swapout").io(8).thread(1, "VM_swapout", 7),
       "7"},
      {"the outer, its figures after the inner",
       Kcdata().begin(9).thread(1, "a", 5).name("VM_swapout").io(8).end(9), "8"},
      {"an inner container of the same number",
       Kcdata().begin(1).name("VM_swapout").io(8).begin(1).name("a").end(1).end(1), "8"},
      {"another container's end", Kcdata().begin(1).end(5).name("VM_swapout").io(7).end(1), "7"},
      {"begin without a payload opens none",
       Kcdata().begin(1, 3).name("VM_swapout").io(7).end(1).stop(), "-"},
      {"array items are plain",
       Kcdata()
           .begin(1)
           .item(0x20, 1, Bytes(32))
           .name("VM_swapout")
           .io(7)
           .item(0x2F, 1, Bytes(32))
           .end(1),
       "7"},
      {"the end of the data closes all", Kcdata().begin(9).name("VM_swapout").io(7).begin(1).stop(),
       "7"},
      {"nothing counts beyond the end", Kcdata().stop().thread(1, "VM_swapout", 7), "-"},
      {"nor inside", Kcdata().begin(1).stop().name("VM_swapout").end(1), "-"},
      {"never closed", Kcdata().begin(1).name("VM_swapout").io(7), "-"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(search(c.data.bytes, c.wanted.c_str()), c.found);
  }
  EXPECT_EQ(search(cases[1].data.bytes, nullptr), "-");
}

TEST(Kcdata, TheHelperStopsAfterTheFirstContainer) {
  const Bytes bytes = Kcdata().thread(1, "a", 5).thread(2, "VM_swapout", 7).bytes;
  const std::byte* const end = bytes.data() + bytes.size();
  std::span<const std::byte> stats;
  const std::byte* position = nullptr;
  EXPECT_EQ(
      getIOStatsWithThreadnameFromKCDataHelper(bytes.data(), end, "VM_swapout", &stats, &position),
      0);
  EXPECT_EQ(position, bytes.data() + Kcdata().thread(1, "a", 5).bytes.size());
  EXPECT_EQ(getIOStatsWithThreadnameFromKCDataHelper(position, end, "VM_swapout", &stats, nullptr),
            1);
}

// No cut may find what a shorter one did not hold, nor read beyond its end.
TEST(Kcdata, EveryCut) {
  const Bytes whole = Kcdata().begin(9).thread(1, "VM_swapout", 7).end(9).stop().bytes;
  const std::size_t complete = Kcdata().begin(9).thread(1, "VM_swapout", 7).bytes.size();
  for (std::size_t length = 0; length <= whole.size(); ++length) {
    EXPECT_EQ(search(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length))),
              length >= complete ? "7" : "-")
        << length;
  }
}

TEST(Kcdata, EndlessNestingAndSizesThatLie) {
  Kcdata nested;
  for (std::uint64_t i = 0; i < 200'000; ++i) nested.begin(i);
  EXPECT_EQ(search(nested.thread(1, "VM_swapout", 7).bytes), "-");

  Kcdata siblings;
  for (std::uint64_t i = 0; i < 200'000; ++i) siblings.begin(i).end(i);
  EXPECT_EQ(search(siblings.thread(1, "VM_swapout", 7).bytes), "7");

  for (const std::uint32_t size : {0xFFFFFFFFu, 0xFFFFFFF0u, 0x7FFFFFFFu}) {
    Bytes bytes = Kcdata().begin(1).name("VM_swapout").bytes;
    appendValue(bytes, kIo);
    appendValue(bytes, size);
    appendValue(bytes, std::uint64_t{0});
    EXPECT_EQ(search(bytes), "-") << size;
  }
}

}  // namespace
}  // namespace tally
