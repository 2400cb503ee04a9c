// The property-list codec: round trips, what it writes beside what the library writes, and the
// documents, XML and binary, that it must refuse.
#include "kv/plist_codec.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <plist/plist.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include "kv/plist_documents.h"

namespace tally {
namespace {

using testing::HasSubstr;

constexpr double kInfinity = std::numeric_limits<double>::infinity();

KvRef<KvData> dataOf(std::string_view bytes) {
  return KvData::create(std::as_bytes(std::span(bytes)));
}

// The library's own way from text to tree and back.
std::string byLibrary(const std::string& document) {
  plist_t root = nullptr;
  plist_from_xml(document.data(), static_cast<std::uint32_t>(document.size()), &root);
  char* text = nullptr;
  std::uint32_t length = 0;
  plist_to_xml(root, &text, &length);
  std::string out(text != nullptr ? text : "", length);
  free(text);
  plist_free(root);
  return out;
}

// Arrays around a boolean.
std::string nestedXml(std::size_t depth) {
  return "<plist>" + repeated("<array>", depth) + "<true/>" + repeated("</array>", depth) +
         "</plist>";
}

TEST(PlistCodec, WritesEachValueAndReadsItBack) {
  struct Case {
    KvRef<KvObject> value;
    const char* body;
  };
  const Case cases[] = {
      {KvNumber::int32(INT32_MIN), "<integer>-2147483648</integer>"},
      {KvNumber::int64(INT64_MIN), "<integer>-9223372036854775808</integer>"},
      {KvNumber::uint32(UINT32_MAX), "<integer>4294967295</integer>"},
      {KvNumber::uint64(UINT64_MAX), "<integer>18446744073709551615</integer>"},
      {KvNumber::float32(1.5f), "<real>1.5</real>"},
      {KvNumber::float64(0.1), "<real>0.10000000000000001</real>"},
      {KvNumber::float64(-0.0), "<real>-0.0</real>"},
      {KvNumber::float64(5e-324), "<real>4.9406564584124654e-324</real>"},
      {KvNumber::float64(kInfinity), "<real>inf</real>"},
      {KvBoolean::of(true), "<true/>"},
      {KvDate::create(0), "<date>1970-01-01T00:00:00Z</date>"},
      {KvDate::create(951868799), "<date>2000-02-29T23:59:59Z</date>"},
      {KvDate::create(-62135596800), "<date>0001-01-01T00:00:00Z</date>"},
      {KvDate::create(253402300799), "<date>9999-12-31T23:59:59Z</date>"},
      {dataOf(""), "<data>\n</data>"},
      {dataOf({"\0", 1}), "<data>\nAA==\n</data>"},
      {KvString::create("a&b<c>\"'\t\n"), "<string>a&amp;b&lt;c&gt;\"'\t\n</string>"},
      {KvString::create("\r\n"), "<string>&#13;\n</string>"},
      {KvString::create("\xC3\xA9\xEF\xBD\xB1\xF0\x9F\x98\x80"),
       "<string>\xC3\xA9\xEF\xBD\xB1\xF0\x9F\x98\x80</string>"},
      {KvArray::create(), "<array/>"},
      {KvDictionary::create(), "<dict/>"},
      {KvDictionary::create({{"b&", KvArray::create({KvNumber::int64(1)})}, {"", dataOf("abc")}}),
       "<dict>\n\t<key>b&amp;</key>\n\t<array>\n\t\t<integer>1</integer>\n\t</array>\n"
       "\t<key></key>\n\t<data>\n\tYWJj\n\t</data>\n</dict>"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.body);
    const auto written = encodeXmlPlist(*c.value);
    ASSERT_TRUE(written);
    EXPECT_EQ(*written, plistOf(c.body));
    const auto read = decodePlist(*written);
    ASSERT_TRUE(read) << read.error().message;
    EXPECT_TRUE(kvEqual(read->get(), c.value.get()));
    if (const auto* number = kvCast<KvNumber>(c.value.get()); number != nullptr) {
      const bool large = number->isUnsigned() && number->asUInt64() > INT64_MAX;
      EXPECT_EQ(kvCast<KvNumber>(read->get())->kind(), number->isReal() ? KvNumberKind::Double
                                                       : large          ? KvNumberKind::UInt64
                                                                        : KvNumberKind::Int64);
    }
  }
}

TEST(PlistCodec, WritesWhatXmlCannotCarryAsReplacement) {
  EXPECT_EQ(*encodeXmlPlist(*KvDictionary::create({{"k\x01", KvString::create({"\0<\x1F", 3})}})),
            plistOf("<dict>\n\t<key>k\xEF\xBF\xBD</key>\n"
                    "\t<string>\xEF\xBF\xBD&lt;\xEF\xBF\xBD</string>\n</dict>"));
  EXPECT_EQ(*encodeXmlPlist(*KvString::create("\xEF\xBF\xBE\xEF\xBF\xBF\xFF")),
            plistOf("<string>\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD</string>"));
  EXPECT_EQ(*encodeXmlPlist(*KvNumber::float64(-std::nan(""))), plistOf("<real>nan</real>"));
  EXPECT_EQ(*encodeXmlPlist(*KvDate::create(1e300)), plistOf("<date>9999-12-31T23:59:59Z</date>"));
}

TEST(PlistCodec, WritesTheSameBytesAsTheLibrary) {
  auto root = KvDictionary::create();
  root->set("text", KvString::create("a & <b> \"q\" 'p'\n\tend \xE2\x82\xAC"));
  root->set("integers", KvArray::create({KvNumber::int64(INT64_MIN), KvNumber::int64(INT64_MAX),
                                         KvNumber::uint64(UINT64_MAX), KvNumber::int8(-1)}));
  auto reals = KvArray::create();
  for (double value = 1e-320; value < 1e300; value *= 977.3)
    reals->append(KvNumber::float64(value));
  for (const double value : {0.0, 1.0, 100.0, 1e15, 1e16, 1e17, 1e22, 123456789.125, -2.5}) {
    reals->append(KvNumber::float64(value));
  }
  root->set("reals", reals);
  root->set("dates", KvArray::create({KvDate::create(0), KvDate::create(1709251199)}));
  // Data of every length around a line's, at every depth around the last one that shortens it.
  KvRef<KvArray> level = KvArray::create();
  root->set("deep", level);
  for (int depth = 2; depth < 12; ++depth) {
    for (std::size_t size = 0; size < 130; ++size) level->append(dataOf(std::string(size, 'x')));
    auto next = KvArray::create({KvBoolean::of(false), KvDictionary::create(), KvArray::create()});
    level->append(next);
    level = next;
  }
  const auto written = encodeXmlPlist(*root);
  ASSERT_TRUE(written);
  EXPECT_EQ(*written, byLibrary(*written));
  EXPECT_TRUE(kvEqual(decodePlist(*written)->get(), root.get()));
}

TEST(PlistCodec, ReadsXmlThatOthersWrite) {
  struct Case {
    std::string document, body;
  };
  const Case cases[] = {
      {"<true></true>", "<true/>"},
      {"\xEF\xBB\xBF<?xml version='1.0' encoding='utf-8'?><!-- > --><plist><false/></plist><!-- "
       "-->",
       "<false/>"},
      {"<!DOCTYPE plist SYSTEM \"a>b[\"><plist a='>'><array x='</array>'  /></plist>", "<array/>"},
      {"<string>a<!-- </string> -->b<![CDATA[<&amp;]]>]&#x41;&#10;</string >",
       "<string>ab&lt;&amp;amp;]A\n</string>"},
      {"<string>&amp;&lt;&gt;&quot;&apos;&#x1F600;&#233;&#x20AC;</string>",
       "<string>&amp;&lt;&gt;\"'\xF0\x9F\x98\x80\xC3\xA9\xE2\x82\xAC</string>"},
      {"<string>a\r\nb\rc&#13;</string>", "<string>a\nb\nc&#13;</string>"},
      {"<string>\xFF\xC3</string>", "<string>\xEF\xBF\xBD\xEF\xBF\xBD</string>"},
      {"<string/>", "<string></string>"},
      {"<array><integer> 010 </integer><integer>+7</integer><integer>0xFF</integer></array>",
       "<array>\n\t<integer>10</integer>\n\t<integer>7</integer>\n\t<integer>255</integer>\n"
       "</array>"},
      {"<real> -1.50e2 </real>", "<real>-150</real>"},
      {"<data>\n Y W\tJj\r\n</data>", "<data>\nYWJj\n</data>"},
      {"<dict><key>a</key><true/><key>b</key><array/><key>a</key><false/></dict>",
       "<dict>\n\t<key>a</key>\n\t<false/>\n\t<key>b</key>\n\t<array/>\n</dict>"},
      {"<dict><!-- a --><key/><dict></dict><?p x?></dict>",
       "<dict>\n\t<key></key>\n\t<dict/>\n</dict>"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(canonical(c.document), plistOf(c.body)) << c.document;
  }
}

TEST(PlistCodec, RefusesDamagedXml) {
  const std::string deepComment = "<plist><array>" + repeated("<!--", 1'000'000);
  const std::pair<std::string, const char*> cases[] = {
      {"", "empty"},
      {"junk", "neither"},
      {std::string(kPlistMaximumBytes + 1, '\0'), "64 MiB"},
      {repeated("<array>", 1'000'000), "512"},
      {repeated("<dict><key>a</key>", 1'000'000), "512"},
      {deepComment, "comment"},
      {"<plist><string>" + repeated("<![CDATA[", 1'000'000), "character-data"},
      {"<plist><string>" + repeated("&", 1'000'000) + "</string></plist>", "reference"},
      {"<plist></plist>", "does not match"},
      {"<plistx><true/></plistx>", "unknown element"},
      {"<plist><true/>", "too early"},
      {"<plist><true/></plist>junk", "after the end"},
      {"<plist><true/><true/></plist>", "more than one"},
      {"<plist>text<true/></plist>", "outside of a value"},
      {"<plist><array><plist><true/></plist></array></plist>", "element"},
      {"<array><true/></dict>", "does not match"},
      {"<array></array x>", "not well formed"},
      {"<true>1</true>", "boolean"},
      {"<string>a<b/></string>", "inside a plain value"},
      {"<string a='x></string>", "tag has no end"},
      {"<dict><true/></dict>", "no key"},
      {"<dict><key>a</key></dict>", "no value"},
      {"<array><key>a</key></array>", "outside of a dictionary"},
      {"<integer>12ab</integer>", "not an integer"},
      {"<integer>18446744073709551616</integer>", "not an integer"},
      {"<integer>-9223372036854775809</integer>", "not an integer"},
      {"<real>1.5x</real>", "not a real"},
      {"<date>2023-02-29T00:00:00Z</date>", "not a date"},
      {"<date>2024-01-01T24:00:00Z</date>", "not a date"},
      {"<data>Y</data>", "base64"},
      {"<data>YWJj=</data>", "base64"},
      {"<data>YW=J</data>", "base64"},
      {"<data>Y*Jj</data>", "base64"},
      {"<string>&foo;</string>", "reference"},
      {"<string>&#xD800;</string>", "reference"},
      {"<string>&#x110000;</string>", "reference"},
      {std::string("<string>a\0b</string>", 20), "zero bytes"},
      {"<?xml version='1.0' encoding='UTF-16'?><true/>", "not UTF-8"},
      {"<!DOCTYPE plist [<!ENTITY a 'b'>]><string>&a;</string>", "definitions"},
      {"<!DOCTYPE plist <true/>", "definitions"},
      {"<true/><!DOCTYPE plist>", "after the end"},
      {"<array>" + repeated("<true/>", kPlistMaximumObjects) + "</array>", "4000000"},
  };
  for (const auto& [document, problem] : cases) {
    EXPECT_THAT(canonical(document), HasSubstr(problem)) << document.substr(0, 80);
    EXPECT_EQ(canonical(document).substr(0, 6), "error:") << document.substr(0, 80);
  }
  EXPECT_THAT(canonical("<array>\n<true/>\n<foo/>"), HasSubstr("line 3"));
}

TEST(PlistCodec, ReadsUtf16InBothByteOrders) {
  struct Case {
    std::string before, units, after;  // the units, big-endian, are put into a string
    std::string result;
  };
  const Case cases[] = {
      {"<?xml version='1.0' encoding='utf-16'?>\n<string>a",
       {"\xD8\x3D\xDE\x00\x20\xAC", 6},
       "&lt;</string>",
       plistOf("<string>a\xF0\x9F\x98\x80\xE2\x82\xAC&lt;</string>")},
      {"<string>", "", "</string>", plistOf("<string></string>")},
      {"<plist>\n<string>",
       {"\xD8\x00", 2},
       "</string></plist>",
       "error: line 2: half of a UTF-16 character is missing"},
      {"<string>",
       {"\xDC\x00\xD8\x00", 4},
       "</string>",
       "error: line 1: half of a UTF-16 character is missing"},
      {"<string>", "\xD8\x3D", "", "error: line 1: half of a UTF-16 character is missing"},
      {"<string>", {"\0\0", 2}, "</string>", "error: line 1: there are zero bytes in the document"},
      {"<?xml version='1.0' encoding='utf-8'?><true/>", "", "",
       "error: line 1: the encoding is not the declared one"},
      {"", "", "", "error: line 1: the document ends too early"},
  };
  for (const Case& c : cases) {
    for (const std::endian order : {std::endian::big, std::endian::little}) {
      std::string units = "\xFE\xFF" + c.units;
      for (std::size_t i = 0; order == std::endian::little && i < units.size(); i += 2)
        std::swap(units[i], units[i + 1]);
      const std::string document =
          units.substr(0, 2) + utf16(c.before, order) + units.substr(2) + utf16(c.after, order);
      EXPECT_EQ(canonical(document), c.result) << c.before;
    }
  }
  EXPECT_THAT(canonical("\xFE\xFF" + utf16("<true/>", std::endian::big).substr(1)),
              HasSubstr("half of a UTF-16"));
  EXPECT_THAT(canonical(utf16("<true/>", std::endian::little)), HasSubstr("zero bytes"));
}

TEST(PlistCodec, NestsAsDeepAsTheLimitAndNoDeeper) {
  struct Case {
    std::size_t depth;
    bool accepted;
  };
  for (const Case& c : {Case{512, true}, Case{513, false}}) {
    EXPECT_EQ(static_cast<bool>(decodePlist(nestedXml(c.depth))), c.accepted);
    EXPECT_EQ(static_cast<bool>(decodePlist(nestedBinary(c.depth).build())), c.accepted);
    KvRef<KvObject> value = KvBoolean::of(true);
    for (std::size_t i = 0; i < c.depth; ++i) value = KvArray::create({value});
    EXPECT_EQ(static_cast<bool>(encodeXmlPlist(*value)), c.accepted);
  }
  auto cycle = KvDictionary::create();
  cycle->set("self", KvArray::create({cycle}));
  EXPECT_THAT(encodeXmlPlist(*cycle).error().message, HasSubstr("contains itself"));
  cycle->remove("self");
  KvRef<KvObject> doubling = KvBoolean::of(true);  // small in memory, 2^40 elements as a document
  for (int i = 0; i < 40; ++i) doubling = KvArray::create({doubling, doubling});
  EXPECT_THAT(encodeXmlPlist(*doubling).error().message, HasSubstr("64 MiB"));
  EXPECT_THAT(encodeXmlPlist(*doubling, 96u << 20).error().message, HasSubstr("96 MiB"));
}

TEST(PlistBinary, ReadsBinary) {
  const std::pair<Binary, std::string> cases[] = {
      {{{"\x10\xFF"}}, "<integer>255</integer>"},
      {{{"\x12\xFF\xFF\xFF\xFF"}}, "<integer>4294967295</integer>"},
      {{{"\x13" + bigEndian(UINT64_MAX, 8)}}, "<integer>-1</integer>"},
      {{{"\x14" + bigEndian(UINT64_MAX, 16)}}, "<integer>18446744073709551615</integer>"},
      {{{"\x22" + bigEndian(std::bit_cast<std::uint32_t>(-1.5f), 4)}}, "<real>-1.5</real>"},
      {{{"\x23" + bits(0.1)}}, "<real>0.10000000000000001</real>"},
      {{{"\x33" + bits(0)}}, "<date>2001-01-01T00:00:00Z</date>"},
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
  const std::pair<Binary, const char*> cases[] = {
      {doubling, "4000000"},
      {copies, "64 MiB"},
      {nestedBinary(100'000), "512"},
      {deep, "64 MiB"},  // it can be read, but not written with the blanks of its lines
      {{{arrayOf({0})}}, "contains itself"},
      {{{arrayOf({1}), dictOf({2, 0}),
         "\x51"
         "a"}},
       "contains itself"},
      {{{arrayOf({1})}}, "out of range"},
      {{{"\x09"}, 1}, "out of range"},
      {{{"\x09"}, 0, 9}, "impossible width"},
      {{{"\x09"}, 0, 4, 200}, "impossible width"},
      {{{"\x09"}, 0, 4, 4, 1}, "offset table"},
      {{{"\x09"}, 0, 4, 4, 0, UINT64_MAX - 8}, "offset table"},
      {{{"\x09"}, 0, 4, 4, 0, 0, {9}}, "not lie inside"},
      {{{zeros(1)}}, "no known type"},
      {{{"\x71"
         "a"}},
       "no known type"},
      {{{"\x80\x01"}}, "archives"},
      {{{"\x13" + zeros(7)}}, "exceeds"},
      {{{"\x14" + bigEndian(1, 8) + zeros(8)}}, "64 bits"},
      {{{"\x32" + zeros(4)}}, "impossible width"},
      {{{"\x33" + bits(std::nan(""))}}, "out of range"},
      {{{"\x33" + bits(1e12)}}, "out of range"},
      {{{"\x44" + zeros(3)}}, "exceeds"},
      {{{"\x4F"}}, "length is not readable"},
      {{{"\x4F\x13" + bigEndian(UINT64_MAX, 8)}}, "exceeds"},
      {{{"\xAF\x13" + bigEndian(std::uint64_t{1} << 62, 8)}}, "exceeds"},
      {{{"\x53"
         "ab"}},
       "exceeds"},
      {{{"\x53"
         "a" +
         zeros(1) + "b"}},
       "zero character"},
      {{{"\x61" + bigEndian(0xD800, 2)}}, "not well formed"},
      {{{"\x62" + bigEndian(0xDC00, 2) + bigEndian(0xD800, 2)}}, "not well formed"},
      {{{dictOf({1, 1}), "\x09"}}, "not a string"},
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
