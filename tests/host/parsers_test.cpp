// The texts that Linux answers in: os-release, desktop entries, locale names, meminfo, machine id.
#include <gtest/gtest.h>

#include <array>

#include "host/system/applications.h"
#include "host/system/device_information.h"
#include "host/system/kernel_values.h"
#include "host/system/locale.h"
#include "host/system/os_release.h"

namespace tally {
namespace {

using Tags = std::vector<std::string>;

TEST(OsRelease, ReadsAssignmentsAsAShellWould) {
  const struct {
    const char* text;
    const char* expected;
  } cases[] = {
      {"NAME=\"With blanks\"", "With blanks"},
      {"NAME='single \\ \" quotes'", "single \\ \" quotes"},
      {"NAME=\"esc \\\" \\\\ \\$ \\` \\n\"", "esc \" \\ $ ` \\n"},
      {"NAME=\"a\"'b'c", "abc"},
      {"NAME=first\nNAME=last", "last"},
      {"NAME=\"never closed", "never closed"},
  };
  for (const auto& c : cases) EXPECT_EQ(parseOsRelease(c.text)["NAME"], c.expected) << c.text;
  for (const char* text : {"", "NAME", "=x", "NA ME=x", "\0NAME=x"}) {
    EXPECT_TRUE(parseOsRelease(text).empty()) << text;
  }
}

TEST(OsRelease, GivesVersionAndItsText) {
  const struct {
    const char *text, *fields, *all;
  } cases[] = {
      {"NAME=\"Debian GNU/Linux\"\nVERSION_ID=\"12\"\nVERSION=\"12 (bookworm)\"",
       "Debian GNU/Linux|12|12 (bookworm)|", "Debian GNU/Linux 12 (bookworm)"},
      {"NAME=Watch\nVERSION_ID=5.1\nBUILD_ID=16S46\nVERSION=x", "Watch|5.1|16S46|",
       "Watch 5.1 (16S46)"},
      {"NAME=Rolling\nBUILD_ID=rolling", "Rolling||rolling|", "Rolling rolling"},
      {"NAME=\"\"\nID=x", "|||", "unknown"},
  };
  for (const auto& c : cases) {
    const auto version = systemVersionFromOsRelease(c.text);
    std::string fields;
    for (const char* key : {"ProductName", "ProductVersion", "ProductBuildVersion"})
      fields += std::string(version->getString(key).value_or("")) + "|";
    EXPECT_EQ(fields, c.fields);
    EXPECT_EQ(osVersionText(*version), c.all) << c.text;
  }
}

TEST(DesktopEntry, OnlyVisibleApplicationsCount) {
  const struct {
    const char* text;
    bool visible;
  } cases[] = {
      {"# comment\n\n[Desktop Entry]\r\nType = Application \r\n", true},
      {"[Desktop Entry]\nType=Application\nNoDisplay=false\nHidden=false\n", true},
      {"[Desktop Entry]\nType=Application\nNoDisplay=true\n", false},
      {"[Desktop Entry]\nHidden=true\nType=Application\n", false},
      {"[Desktop Entry]\nType=Link\n", false},
      {"[Desktop Entry]\nType=Application\n[Desktop Action x]\nHidden=true\n", true},
      {"[Desktop Entry]\nType[de]=Application\n", false},
  };
  for (const auto& c : cases) EXPECT_EQ(isVisibleApplication(c.text), c.visible) << c.text;
}

TEST(LocaleNames, BecomeTags) {
  const struct {
    const char *name, *tag;
  } cases[] = {
      {"de_CH.UTF-8", "de-CH"},
      {"DE_ch", "de-CH"},
      {"de_DE@euro", "de-DE"},
      {"sr_RS.UTF-8@latin", "sr-Latn-RS"},
      {"es_419", "es-419"},
      {"es_4190", "es"},
      {"de_Germany", "de"},
      {"C", ""},
      {"", ""},
      {"../../etc", ""},
      {"d\xc3\xa4_DE", ""},
  };
  for (const auto& c : cases) EXPECT_EQ(languageTag(c.name), c.tag) << c.name;
}

TEST(LocaleEnvironment, OrdersPreferencesAndNamesTheRegion) {
  const struct {
    const char* name;
    LocaleEnvironment environment;
    Tags languages;
    const char* region;
  } cases[] = {
      {"LC_ALL wins", {"", "fr_FR", "it_IT", "de_CH"}, {"fr-FR"}, "FR"},
      {"LC_MESSAGES is the language's", {"", "", "it_IT", "de_CH"}, {"it-IT"}, "CH"},
      {"LANGUAGE first", {"gsw:de_CH:de", "", "", "de_CH"}, {"gsw", "de-CH", "de"}, "CH"},
      {"none in C", {"de", "C.UTF-8", "", "de_CH"}, {}, ""},
      {"hostile list", {"::x:/:de_DE:", "", "", "de_DE"}, {"de-DE"}, "DE"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(preferredLanguages(c.environment), c.languages) << c.name;
    EXPECT_EQ(regionCode(c.environment).value_or(""), c.region) << c.name;
  }
}

TEST(SwapUsage, ReadsTheTwoFigures) {
  const auto usage = parseSwapUsage(
      "MemTotal:       8000000 kB\nSwapCached:       12 kB\nSwapTotal:       2048 kB\n"
      "SwapFree:         48 kB\n",
      4096);
  ASSERT_TRUE(usage);
  const std::array figures{usage->totalBytes, usage->availableBytes, usage->usedBytes};
  EXPECT_EQ(figures, (std::array<std::uint64_t, 3>{2048 << 10, 48 << 10, 2000 << 10}));
  EXPECT_EQ(usage->pageSize, 4096u);
  for (const char* text :
       {"", "SwapTotal: 1 kB\n", "SwapTotal: 1 kB\nSwapFree: 2 kB\n",
        "SwapTotal: 5 MB\nSwapFree: 1 kB\n", "SwapTotal: -1 kB\nSwapFree: -1 kB\n",
        "SwapTotal: 99999999999999999999 kB\nSwapFree: 1 kB\n"}) {
    EXPECT_FALSE(parseSwapUsage(text, 4096)) << text;
  }
}

TEST(InverseDeviceID, HidesTheMachineId) {
  const std::string machine = "0123456789abcdef0123456789abcdef";
  const std::string identifier = inverseDeviceID(machine + "\n");
  EXPECT_EQ(identifier.size(), 32u);
  EXPECT_EQ(identifier, inverseDeviceID(machine));
  EXPECT_EQ(identifier.find(machine.substr(0, 8)), std::string::npos);
  EXPECT_NE(identifier, inverseDeviceID("1123456789abcdef0123456789abcdef"));
  for (const char* text : {"", "uninitialized", "0123456789abcdef0123456789abcdeg", "\n"}) {
    EXPECT_EQ(inverseDeviceID(text), "") << text;
  }
}

}  // namespace
}  // namespace tally
