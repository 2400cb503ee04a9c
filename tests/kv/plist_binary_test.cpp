// Binary property lists: what is read from them, and what the guard refuses.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <utility>

#include "kv/plist_documents.h"

namespace tally {
namespace {

using testing::HasSubstr;

TEST(PlistBinary, ReadsBinary) {
  const std::pair<Binary, std::string> cases[] = {
      {{{"\x08"}}, "<false/>"},
      {{{"\x10\xFF"}}, "<integer>255</integer>"},
      {{{"\x11\xFF\xFF"}}, "<integer>65535</integer>"},
      {{{"\x12\xFF\xFF\xFF\xFF"}}, "<integer>4294967295</integer>"},
      {{{"\x13" + bigEndian(UINT64_MAX, 8)}}, "<integer>-1</integer>"},
      {{{"\x13" + bigEndian(std::uint64_t{1} << 63, 8)}},
       "<integer>-9223372036854775808</integer>"},
      {{{"\x14" + bigEndian(UINT64_MAX, 16)}}, "<integer>18446744073709551615</integer>"},
      {{{"\x14" + bigEndian(7, 16)}}, "<integer>7</integer>"},
      {{{"\x22" + bigEndian(std::bit_cast<std::uint32_t>(-1.5f), 4)}}, "<real>-1.5</real>"},
      {{{"\x23" + bits(0.1)}}, "<real>0.10000000000000001</real>"},
      {{{"\x33" + bits(0)}}, "<date>2001-01-01T00:00:00Z</date>"},
      {{{"\x33" + bits(-1e9)}}, "<date>1969-04-24T22:13:20Z</date>"},
      {{{"\x33" + bits(9435484800)}}, "<date>2300-01-01T00:00:00Z</date>"},
      {{{"\x33" + bits(-63114076800)}}, "<date>0001-01-01T00:00:00Z</date>"},
      {{{"\x33" + bits(252423993599)}}, "<date>9999-12-31T23:59:59Z</date>"},
      {{{"\x43" + zeros(3)}}, "<data>\nAAAA\n</data>"},
      {{{"\x53"
         "a<b"}},
       "<string>a&lt;b</string>"},
      {{{"\x5F\x10\x10"
         "0123456789abcdef"}},
       "<string>0123456789abcdef</string>"},
      {{{"\x51\xE9"}}, "<string>\xEF\xBF\xBD</string>"},
      {{{"\x63" + bigEndian(0x20AC, 2) + bigEndian(0xD83D, 2) + bigEndian(0xDE00, 2)}},
       "<string>\xE2\x82\xAC\xF0\x9F\x98\x80</string>"},
      {{{arrayOf({})}}, "<array/>"},
      {{{"\x09", arrayOf({0, 0})}, 1}, "<array>\n\t<true/>\n\t<true/>\n</array>"},
      {{{dictOf({1, 1, 2, 3}),
         "\x51"
         "a",
         "\x08", "\x09"}},
       "<dict>\n\t<key>a</key>\n\t<true/>\n</dict>"},
  };
  for (const auto& [list, body] : cases) EXPECT_EQ(canonical(list.build()), plistOf(body));
}

TEST(PlistBinary, RefusesDamagedBinary) {
  Binary doubling;  // 2^60 booleans through 60 arrays of the same item twice
  for (std::uint64_t i = 0; i < 60; ++i) doubling.objects.push_back(arrayOf({i + 1, i + 1}));
  doubling.objects.push_back("\x09");
  Binary copies;  // 1 MiB of data, a hundred times
  copies.objects = {arrayOf(std::vector<std::uint64_t>(100, 1)),
                    "\x4F\x12" + bigEndian(1 << 20, 4) + zeros(1 << 20)};
  Binary deep = nestedBinary(500);
  deep.objects[499] = arrayOf(std::vector<std::uint64_t>(1'000'000, 500));
  const std::uint64_t huge = UINT64_MAX / 2;
  const std::pair<Binary, const char*> cases[] = {
      {doubling, "4000000"},
      {copies, "64 MiB"},
      {nestedBinary(100'000), "512"},
      {deep, "nested deeply"},
      {{{arrayOf({0})}}, "contains itself"},
      {{{arrayOf({1}), dictOf({2, 0}),
         "\x51"
         "a"}},
       "contains itself"},
      {{{arrayOf({1})}}, "out of range"},
      {{{"\x09"}, 1}, "out of range"},
      {{{"\x09"}, huge}, "out of range"},
      {{{}}, "out of range"},
      {{{"\x09"}, 0, 0}, "impossible width"},
      {{{"\x09"}, 0, 9}, "impossible width"},
      {{{"\x09"}, 0, 4, 0}, "impossible width"},
      {{{"\x09"}, 0, 4, 200}, "impossible width"},
      {{{"\x09"}, 0, 4, 4, 1}, "offset table"},
      {{{"\x09"}, 0, 4, 4, huge}, "offset table"},
      {{{"\x09"}, 0, 4, 4, 0, 1}, "offset table"},
      {{{"\x09"}, 0, 4, 4, 0, UINT64_MAX - 8}, "offset table"},
      {{{"\x09"}, 0, 4, 4, 0, 0, {9}}, "not lie inside"},
      {{{"\x09"}, 0, 8, 4, 0, 0, {UINT64_MAX}}, "not lie inside"},
      {{{"\x09"}, 0, 4, 4, 0, 0, {7}}, "not lie inside"},
      {{{zeros(1)}}, "no known type"},
      {{{"\x0F"}}, "no known type"},
      {{{"\x71"
         "a"}},
       "no known type"},
      {{{"\xC1" + bigEndian(0, 4)}}, "no known type"},
      {{{"\x80\x01"}}, "archives"},
      {{{"\x13" + zeros(7)}}, "exceeds"},
      {{{"\x15" + zeros(32)}}, "impossible width"},
      {{{"\x14" + bigEndian(1, 8) + zeros(8)}}, "64 bits"},
      {{{"\x21" + zeros(2)}}, "impossible width"},
      {{{"\x23" + zeros(7)}}, "exceeds"},
      {{{"\x32" + zeros(4)}}, "impossible width"},
      {{{"\x33" + bits(std::nan(""))}}, "out of range"},
      {{{"\x33" + bits(1e12)}}, "out of range"},
      {{{"\x44" + zeros(3)}}, "exceeds"},
      {{{"\x4F"}}, "length is not readable"},
      {{{"\x4F\x09"}}, "length is not readable"},
      {{{"\x4F\x14" + zeros(16)}}, "length is not readable"},
      {{{"\x4F\x13" + bigEndian(UINT64_MAX, 8)}}, "exceeds"},
      {{{"\x6F\x13" + bigEndian(std::uint64_t{1} << 63, 8)}}, "exceeds"},
      {{{"\xAF\x13" + bigEndian(std::uint64_t{1} << 62, 8)}}, "exceeds"},
      {{{"\xDF\x13" + bigEndian(std::uint64_t{1} << 61, 8)}}, "exceeds"},
      {{{"\x53"
         "ab"}},
       "exceeds"},
      {{{"\x53"
         "a" +
         zeros(1) + "b"}},
       "zero character"},
      {{{"\x61" + zeros(2)}}, "zero character"},
      {{{"\x61" + bigEndian(0xD800, 2)}}, "not well formed"},
      {{{"\x62" + bigEndian(0xDC00, 2) + bigEndian(0xD800, 2)}}, "not well formed"},
      {{{dictOf({1, 1}), "\x09"}}, "not a string"},
      {{{dictOf({1, 1}), arrayOf({})}}, "not a string"},
  };
  for (const auto& [list, problem] : cases) {
    const std::string told = canonical(list.build());
    EXPECT_THAT(told, HasSubstr(problem));
    EXPECT_EQ(told.substr(0, 6), "error:");
  }
  EXPECT_THAT(canonical("bplist00"), HasSubstr("cut short"));
}

}  // namespace
}  // namespace tally
