// Text, number, time and file helpers at their borders.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cmath>
#include <limits>

#include "base/byte_reader.h"
#include "base/files/device_root.h"
#include "base/files/file.h"
#include "base/files/file_lock.h"
#include "base/files/temporary_file.h"
#include "base/number_text.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "base/utf8.h"
#include "fakes/temporary_folder.h"

namespace tally {
namespace {

TEST(Utf8, RepairAndXmlTable) {
  const struct {
    std::string_view text;
    const char* repaired;
    const char* forXml;
  } cases[] = {
      {"caf\xC3\xA9 \xE2\x82\xAC \xF0\x9F\x98\x80", "café € 😀", "café € 😀"},
      {"\xC0\xAF", "\uFFFD\uFFFD", "\uFFFD\uFFFD"},                  // overlong
      {"\xED\xA0\x80", "\uFFFD\uFFFD\uFFFD", "\uFFFD\uFFFD\uFFFD"},  // surrogate
      {"\xF4\x90\x80\x80", "\uFFFD\uFFFD\uFFFD\uFFFD", "\uFFFD\uFFFD\uFFFD\uFFFD"},
      {"\x01\t\n\r\x1F\x7F", "\x01\t\n\r\x1F\x7F", "\uFFFD\t\n\r\uFFFD\x7F"},
      {"\xEF\xBF\xBE\xEF\xBF\xBF", "\xEF\xBF\xBE\xEF\xBF\xBF", "\uFFFD\uFFFD"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(repairUtf8(c.text), c.repaired);
    EXPECT_EQ(isValidUtf8(c.text), repairUtf8(c.text) == c.text) << c.repaired;
    EXPECT_EQ(replaceNonXmlCharacters(repairUtf8(c.text)), c.forXml);
  }
}

TEST(Printable, ShowsWithoutObeyingAndKnowsItsWidth) {
  const struct {
    std::string_view text;
    const char* shown;
    std::size_t width;
  } cases[] = {
      {"\x1b[31m\n\t\r\x7f", "\\x1b[31m\\n\\t\\x0d\\x7f", 20},
      {"\xC2\x9B\xC2\xA0", "\\x9b\u00A0", 5},
      {"a\xE2\x80\xAE"
       "b\xEF\xBB\xBF",
       "a\\u202eb\\ufeff", 14},
      {"\xFF\xC3", "\uFFFD\uFFFD", 2},
      {"日本 café", "日本 café", 9},
      {"e\u0301", "e\u0301", 1},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(printable(c.text), c.shown);
    EXPECT_EQ(displayWidth(c.shown), c.width) << c.shown;
  }
  EXPECT_EQ(fitted("日本日本", 5, "~"), "日本~");
  EXPECT_EQ(fitted("日本日本", 8, "~"), "日本日本");
  EXPECT_EQ(fitted("abc", 0, "~"), "");
}

TEST(NumberText, RealsReadBackEqual) {
  const struct {
    double value;
    const char* text;
  } cases[] = {{0, "0"},
               {-0.0, "-0"},
               {0.1, "0.1"},
               {0.0001, "0.0001"},
               {1e-5, "1e-05"},
               {1e16, "1e+16"},
               {1e22, "1e+22"},
               {1.0 / 3, "0.3333333333333333"},
               {-std::numeric_limits<double>::infinity(), "-inf"},
               {-std::nan(""), "nan"}};
  for (const auto& c : cases) {
    std::string text;
    appendDouble(text, c.value);
    EXPECT_EQ(text, c.text);
    EXPECT_TRUE(std::isnan(c.value) || parseDouble(text) == c.value) << text;
  }
  std::string single;
  appendFloat(single, 0.1f);
  appendFloat(single, -100000.0f);
  appendFloat(single, 1e7f);
  EXPECT_EQ(single, "0.1-1000001e+07");
}

TEST(NumberText, OnlyWholeNumbersOfTheRangeAreRead) {
  for (const char* text : {"", " 1", "1 ", "+1", "1.0", "9223372036854775808", "0x1", "--1"}) {
    EXPECT_FALSE(parseInt64(text)) << text;
  }
  EXPECT_EQ(parseInt64("-9223372036854775808"), std::numeric_limits<std::int64_t>::min());
  for (const char* text : {"", "1e999", "1,5", "1.5x", " 2"})
    EXPECT_FALSE(parseDouble(text)) << text;
}

TEST(TimeText, DaysAndInstants) {
  const struct {
    double seconds;
    std::int32_t day;
    const char* text;
  } cases[] = {{0, 0, "1970-01-01T00:00:00Z"},
               {-0.5, -1, "1969-12-31T23:59:59Z"},
               {1709208000, 19782, "2024-02-29T12:00:00Z"},
               {1e300, std::numeric_limits<std::int32_t>::max(), "9999-12-31T23:59:59Z"},
               {-1e300, std::numeric_limits<std::int32_t>::min(), "0001-01-01T00:00:00Z"},
               {std::nan(""), 0, "1970-01-01T00:00:00Z"}};
  for (const auto& c : cases) {
    std::string text;
    appendTimestamp(text, c.seconds);
    EXPECT_EQ(text, c.text);
    EXPECT_EQ(dayOfSeconds(c.seconds), c.day) << c.seconds;
  }
  EXPECT_EQ(dayText(19782), "2024-02-29");
}

TEST(ByteReader, NothingOutsideIsRead) {
  const std::byte bytes[5] = {std::byte{1}, std::byte{2}, std::byte{3}, std::byte{4}, std::byte{5}};
  const ByteReader reader(bytes);
  EXPECT_EQ(reader.read<std::uint32_t>(1), 0x05040302u);
  EXPECT_EQ(reader.readBigEndian(2, 3), 0x030405u);
  EXPECT_FALSE(reader.read<std::uint32_t>(2));
  EXPECT_FALSE(reader.readBigEndian(0, 9));
  EXPECT_FALSE(reader.slice(SIZE_MAX, 2));
  EXPECT_FALSE(reader.slice(2, SIZE_MAX));
  EXPECT_TRUE(reader.slice(5, 0));
}

class FileTest : public testing::Test, protected TemporaryFolder {
 protected:
  Directory here() const { return *Directory::open(root); }
  static constexpr uid_t kUser = 12345;
};

TEST_F(FileTest, ReadingRefusesWhatIsNoFileOrTooLarge) {
  put("ok", "12345");
  EXPECT_EQ(*readFile(at("ok"), 5), "12345");
  EXPECT_NE(readFile(at("ok"), 4).error().message.find("larger than 4 bytes"), std::string::npos);
  EXPECT_EQ(readFile(at("none"), 9).error().systemError, ENOENT);
  EXPECT_FALSE(readFile(root, 9));
  EXPECT_FALSE(readFile("/dev/zero", 9));
  ASSERT_EQ(::mkfifo(at("pipe").c_str(), 0600), 0);
  EXPECT_FALSE(readFile(at("pipe"), 9)) << "a pipe without a writer must not be waited for";
  EXPECT_FALSE(readFile("/proc/self/comm", 100)->empty()) << "its size says 0";
  EXPECT_FALSE(here().openForReading("ok", 4));
  auto pieces = here().openForReading("ok", 5);
  char piece[4];
  ASSERT_TRUE(pieces);
  EXPECT_EQ(*pieces->read(piece), 4u);
  put("ok", "123456");
  EXPECT_EQ(pieces->read(piece).error().message, readFile(at("ok"), 5).error().message)
      << "it has grown past the limit";
}

TEST_F(FileTest, AReplacementIsWholeOrNotThere) {
  const auto deep = DeviceRoot(root).make("/deep/er");
  ASSERT_TRUE(deep);
  ASSERT_TRUE(writeFileAtomically(*deep, "file", "one"));
  const auto first = deep->identity("file");
  ASSERT_TRUE(writeFileAtomically(*deep, "file", "two"));
  EXPECT_EQ(*deep->readFile("file", 9), "two");
  EXPECT_NE(deep->identity("file"), first);
  {
    auto abandoned = TemporaryFile::create(*deep, "file");
    ASSERT_TRUE(abandoned);
    ASSERT_TRUE(abandoned->write("half"));
    EXPECT_TRUE(isTemporaryName(deep->list()->back()));
  }
  EXPECT_EQ(deep->list()->size(), 1u) << "an abandoned file is removed";
  EXPECT_FALSE(DeviceRoot(root).make("/deep/er/file/below-a-file"));
  ASSERT_TRUE(DeviceRoot(root).make("/taken"));
  EXPECT_FALSE(writeFileAtomically(here(), "taken", "x"));
  EXPECT_EQ(here().list()->size(), 2u) << "nothing is left over on failure";
}

TEST_F(FileTest, LinksAreFollowedOnlyWhereNobodyElseCanMakeThem) {
  if (::geteuid() != 0) GTEST_SKIP() << "only root can give files to others";
  put("outside", "secret");
  ASSERT_TRUE(DeviceRoot(root).make("/device/mnt/var/home/user"));
  const auto link = [this](const std::string& target, const std::string& name) {
    ASSERT_EQ(::symlink(target.c_str(), (at("device") + name).c_str()), 0) << name;
  };
  const auto own = [this](const std::string& name) {
    ASSERT_EQ(::lchown((at("device") + name).c_str(), kUser, kUser), 0) << name;
  };
  link("/mnt/var", "/var");           // taken below the device root
  link("mnt/../mnt/var", "/climbs");  // as far as the device root
  link("../../outside", "/escapes");
  link("loop", "/loop");
  link("/mnt/var", "/foreign");
  own("/foreign");
  put("device/mnt/var/home/user/file", "mine");
  link("/mnt/var", "/mnt/var/home/user/var");
  link("file", "/mnt/var/home/user/link");
  ASSERT_EQ(::link(at("outside").c_str(), at("device/mnt/var/home/user/second").c_str()), 0);
  put("device/mnt/var/home/user/planted", "other");
  ASSERT_EQ(::chown(at("device/mnt/var/home/user/planted").c_str(), kUser + 1, kUser), 0);
  own("/mnt/var/home/user");
  own("/mnt/var/home/user/file");
  const DeviceRoot device(at("device"));
  const struct {
    const char* path;
    const char* content;  // null: refused
  } cases[] = {
      {"/var/home/user/file", "mine"},
      {"/climbs/home/user/file", "mine"},
      {"/escapes", nullptr},
      {"/loop", nullptr},
      {"/foreign/home/user/file", nullptr},
      {"/mnt/var/home/user/var/home/user/file", nullptr},
      {"/mnt/var/home/user/link", nullptr},
      {"/mnt/var/home/user/second", nullptr},
      {"/mnt/var/home/user/planted", nullptr},
      {"/mnt/../mnt/var/home/user/file", nullptr},
  };
  for (const auto& c : cases) {
    const auto text = device.readFile(c.path, 100);
    EXPECT_EQ(text ? *text : "", c.content != nullptr ? c.content : "") << c.path;
    EXPECT_EQ(static_cast<bool>(device.openForReading(c.path, 100)), c.content != nullptr);
  }
  const auto home = device.open("/var/home/user");
  ASSERT_TRUE(home);
  EXPECT_FALSE(home->openForWriting("second"));
  EXPECT_FALSE(FileLock::acquire(*home, "second"));
}

TEST(LockHolder, ReadsTheKernelsTable) {
  constexpr std::string_view kTable =
      "1: POSIX  ADVISORY  WRITE 11 fe:0a:77 0 EOF\n"
      "2: FLOCK  ADVISORY  WRITE 22 fe:0a:77 0 EOF\n"
      "2: -> FLOCK  ADVISORY  WRITE 33 fe:0a:77 0 EOF\n"
      "3: FLOCK  ADVISORY  WRITE 0 fe:0a:78 0 EOF\n4: FLOCK\n\n5: FLOCK a b c d";
  EXPECT_EQ(lockHolder(kTable, makedev(0xfe, 0x0a), 77), 22);
  EXPECT_FALSE(lockHolder(kTable, makedev(0xfe, 0x0a), 78)) << "of another namespace";
  EXPECT_FALSE(lockHolder(kTable, makedev(0xfe, 0x0b), 77));
}

}  // namespace
}  // namespace tally
