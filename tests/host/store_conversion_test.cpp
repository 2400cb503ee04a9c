// When a store of the former format is converted: not before 30 days have really passed.
#include <gtest/gtest.h>

#include <functional>

#include "fakes/fake_platform.h"
#include "host/store/store_conversion_day.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

class ConversionDay : public testing::Test {
 protected:
  ConversionDay() { preferences.calls = std::make_shared<fakes::CallLog>(); }
  void put(std::string_view key, KvRef<KvObject> value) {
    preferences.put(key, std::move(value), kProgramDomain);
  }
  // A daily run of this program.
  bool runOn(std::int32_t day) {
    const bool isDue = conversionIsDue(preferences, day);
    process(day - 1);
    return isDue;
  }
  // All that a run of an older version leaves.
  void process(std::int32_t day) { put(kLastProcessedDay.key, KvNumber::int32(day)); }
  // How many days from this one on, each with a run, until it is due.
  int daysFrom(std::int32_t day) {
    for (int days = 0; days < 100; ++days) {
      if (runOn(day + days)) return days;
    }
    return -1;
  }
  fakes::FakePreferences preferences;
};

TEST_F(ConversionDay, ComesAfterThirtyDaysOfRunsHoweverTheClockGoes) {
  constexpr std::int32_t kDay = 20800;
  const struct {
    const char* name;
    std::function<void()> before;
    int days;
  } cases[] = {
      {"new", [] {}, 30},
      {"1970, then the clock is set", [&] { runOn(0), runOn(1); }, 28},
      {"29 days with long pauses",
       [&] {
         for (int i = 29; i > 0; --i) runOn(kDay - 40 * i);
       },
       1},
      {"twice on a day", [&] { runOn(kDay - 1), runOn(kDay - 1); }, 29},
      {"in the future, then set back", [&] { runOn(kDay + 5000), process(kDay - 2); }, 30},
      {"an older version in between",
       [&] {
         for (int i = 40; i > 10; --i) runOn(kDay - i);
         process(kDay - 2);
       },
       30},
      {"a damaged count", [&] { put("StoreConversionDays", KvString::create("29")); }, 30},
      {"at once", [&] { put("StoreConversion", KvString::create("at once")); }, 0},
      {"never", [&] { put("StoreConversion", KvString::create("never")); }, -1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    preferences.values.clear();
    c.before();
    EXPECT_EQ(daysFrom(kDay), c.days);
  }
  preferences.values.clear();
  runOn(kDay);
  endConversion(preferences);
  EXPECT_EQ(preferences.values.size(), 1u) << "but for the day that was processed";
}

}  // namespace
}  // namespace tally
