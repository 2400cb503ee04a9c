// The functions for C: every format, what fails, and wrong arguments.
#include <algorithm>

#include "hwreport/c_api/handles.h"
#include "hwreport/channel_world.h"
#include "hwreport/hwreport_c.h"

namespace tally {
namespace {

using namespace tests;

class CFunctions : public RegistryTest {
 protected:
  CFunctions() {
    registry().entries.push_back({"HwReportHub", "hub", 1});
    const auto entry = [](std::uint64_t id, std::uint64_t type, const char* name) {
      return KvArray::create({number(id), number(type), text(name)});
    };
    const auto channels =
        KvArray::create({entry(1, typeWord(1, 1), "simple"), entry(2, typeWord(2, 2, 4), "state"),
                         entry(3, typeWord(3, 1), "histogram"), entry(4, typeWord(4, 1), "a\0z")});
    addDriver("driver", 0x10,
              KvArray::create({KvDictionary::create(
                  {{"HwReportGroupName", text("G")}, {"HwReportChannels", channels}})}));
    count(1);
    EXPECT_EQ(hwreport_list(device_, &listed_), HWREPORT_OK);
  }
  ~CFunctions() override {
    hwreport_free(sample_);
    hwreport_free(listed_);
    hwreport_unsubscribe(subscription_);
    hwreport_close(device_);
  }
  // Every counter is times what it was at first.
  void count(std::uint64_t times) {
    const auto elements =
        run(1, typeWord(1, 1), {{{5 * times}}}) +
        run(2, typeWord(2, 2, 4), {{{0x4F4E, times, 30 * times}, 1}, {{0x4F, 2, 10 * times}, 2}}) +
        run(3, typeWord(3, 1), {{{4 * times, 1, 9, 20 * times}}}) +
        run(4, typeWord(4, 1), {{{7, 8, kInvalid, kInvalid}}});
    registry().region.resize(elements.size());
    std::ranges::copy(elements, registry().region.begin());  // it is mapped where it is
  }
  void subscribe() {
    ASSERT_EQ(hwreport_subscribe(device_, listed_, &subscription_), HWREPORT_OK);
    ASSERT_EQ(hwreport_sample(subscription_, &sample_), HWREPORT_OK);
  }
  static std::vector<std::int64_t> column(hwreport_channels* set, std::size_t index, int what) {
    std::vector<std::int64_t> values(9, -1);
    std::size_t length = 0;
    if (hwreport_elements(set, index, what, values.data(), 9, &length) != HWREPORT_OK) return {};
    values.resize(length);
    return values;
  }
  hwreport_device* device_ = new hwreport_device{{}, sharePlatform(platform())};
  hwreport_channels* listed_ = nullptr;
  hwreport_subscription* subscription_ = nullptr;
  hwreport_channels* sample_ = nullptr;
};

TEST_F(CFunctions, ValuesOfEveryFormatAndTheirDifference) {
  subscribe();
  count(3);
  hwreport_channels *later = nullptr, *delta = nullptr;
  ASSERT_EQ(hwreport_sample(subscription_, &later), HWREPORT_OK);
  ASSERT_EQ(hwreport_delta(sample_, later, &delta), HWREPORT_OK);
  hwreport_close(std::exchange(device_, nullptr));  // the rest does not need it
  using Values = std::vector<std::int64_t>;
  const Values bounds = {HWREPORT_MISSING};
  const struct {
    std::size_t index;
    int column;
    Values first, difference;
  } cases[] = {
      {0, HWREPORT_ARRAY_VALUES, {}, {}},
      {1, HWREPORT_STATE_IDS, {0x4F4E, 0x4F}, {0x4F4E, 0x4F}},
      {1, HWREPORT_STATE_TRANSITIONS, {1, 2}, {2, 0}},
      {1, HWREPORT_STATE_RESIDENCIES, {30, 10}, {60, 20}},
      {2, HWREPORT_BUCKET_HITS, {4}, {8}},
      {2, HWREPORT_BUCKET_MINIMA, {1}, {1}},
      {2, HWREPORT_BUCKET_MAXIMA, {9}, {9}},
      {2, HWREPORT_BUCKET_SUMS, {20}, {40}},
      {2, HWREPORT_BUCKET_LOWER_BOUNDS, bounds, bounds},
      {2, HWREPORT_BUCKET_UPPER_BOUNDS, bounds, bounds},
      {3, HWREPORT_ARRAY_VALUES, {7, 8, INT64_MIN, INT64_MIN}, {0, 0, INT64_MIN, INT64_MIN}},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(column(sample_, c.index, c.column), c.first) << c.column;
    EXPECT_EQ(column(delta, c.index, c.column), c.difference) << c.column;
    EXPECT_EQ(column(listed_, c.index, c.column), Values()) << "not sampled";
  }
  std::int64_t value = 0, most = 0;
  EXPECT_EQ(hwreport_simple_value(delta, 0, &value), HWREPORT_OK);
  EXPECT_EQ(value, 10);
  EXPECT_EQ(hwreport_simple_value(delta, 1, &value), HWREPORT_NO_VALUE);
  EXPECT_EQ(value, 0);
  EXPECT_EQ(hwreport_histogram_range(delta, 2, nullptr, &most), HWREPORT_OK);
  EXPECT_EQ(most, 9);
  double share = 0;
  EXPECT_EQ(hwreport_state_share(sample_, 1, 0, &share), HWREPORT_OK);
  EXPECT_EQ(share, 0.75);
  std::size_t state = 0, length = 0;
  EXPECT_EQ(hwreport_state_current(sample_, 1, &state), HWREPORT_OK);
  EXPECT_EQ(state, 1u);
  const char* name = nullptr;
  EXPECT_EQ(hwreport_state_name(sample_, 1, 0, &name), HWREPORT_OK);
  EXPECT_STREQ(name, "ON");
  value = -1;
  EXPECT_EQ(hwreport_elements(sample_, 1, HWREPORT_STATE_IDS, &value, 1, &length), HWREPORT_OK);
  EXPECT_EQ(length, 2u) << "and no more was written than there is room for";
  hwreport_free(delta);
  hwreport_free(later);
}

TEST_F(CFunctions, FiltersAndSums) {
  hwreport_channels* more = nullptr;
  ASSERT_EQ(hwreport_list(device_, &more), HWREPORT_OK);
  EXPECT_EQ(hwreport_keep_group(more, "G", nullptr), HWREPORT_OK);
  EXPECT_EQ(hwreport_count(more), 4u);
  EXPECT_EQ(hwreport_keep_categories(more, 4), HWREPORT_OK);
  EXPECT_EQ(hwreport_keep_name(listed_, "simple"), HWREPORT_OK);
  EXPECT_EQ(hwreport_add(listed_, more), HWREPORT_OK);
  const char* name = nullptr;
  EXPECT_EQ(hwreport_text(listed_, 1, HWREPORT_NAME, &name), HWREPORT_OK);
  EXPECT_STREQ(name, "state");
  EXPECT_EQ(hwreport_text(listed_, 1, HWREPORT_SUBGROUP, &name), HWREPORT_NO_VALUE);
  EXPECT_STREQ(name, "");
  EXPECT_EQ(hwreport_keep_number(listed_, HWREPORT_FORMAT, 7), HWREPORT_OK);
  EXPECT_EQ(hwreport_count(listed_), 0u);
  hwreport_free(more);
}

TEST_F(CFunctions, FailuresHaveTheirCodes) {
  registry().changesDuringWalk = true;
  hwreport_channels* set = listed_;
  EXPECT_EQ(hwreport_list(device_, &set), HWREPORT_CHANGED);
  EXPECT_EQ(set, nullptr);
  registry().openResult = 0xE1;
  EXPECT_EQ(hwreport_subscribe(device_, listed_, &subscription_), HWREPORT_FAILED);
  EXPECT_STREQ(hwreport_error_text(),
               "the channels cannot be subscribed: 0xe1 Could not open HwReportHub");
  registry().entries.clear();
  EXPECT_EQ(hwreport_subscribe(device_, listed_, &subscription_), HWREPORT_NOT_FOUND);
  EXPECT_EQ(cCall([]() -> int { throw std::bad_alloc(); }), HWREPORT_NO_MEMORY);
  EXPECT_EQ(cCall([]() -> int { throw 1; }), HWREPORT_FAILED);
  // A text that is too long is cut where a character ends.
  cFailure(1, std::string(254, 'x') + "\u00e9");
  EXPECT_EQ(hwreport_error_text(), std::string(254, 'x'));
}

TEST_F(CFunctions, WrongArguments) {
  subscribe();
  auto* const setAsDevice = reinterpret_cast<hwreport_device*>(sample_);
  auto* const deviceAsSet = reinterpret_cast<hwreport_channels*>(device_);
  hwreport_channels* set = nullptr;
  hwreport_subscription* subscription = nullptr;
  std::int64_t value = 0;
  std::uint64_t word = 0;
  std::size_t length = 0;
  double real = 0;
  const char* name = nullptr;
  const std::size_t past = hwreport_count(sample_);
  constexpr const char* kNotUtf8 = "\xFF";
  const int results[] = {
      hwreport_list(nullptr, &set),
      hwreport_list(device_, nullptr),
      hwreport_list(setAsDevice, &set),
      hwreport_keep_group(nullptr, "G", nullptr),
      hwreport_keep_group(sample_, nullptr, nullptr),
      hwreport_keep_group(sample_, "G", kNotUtf8),
      hwreport_keep_name(sample_, nullptr),
      hwreport_keep_name(sample_, kNotUtf8),
      hwreport_keep_name(deviceAsSet, "simple"),
      hwreport_keep_categories(nullptr, 1),
      hwreport_keep_number(sample_, 99, 1),
      hwreport_add(sample_, nullptr),
      hwreport_add(sample_, sample_),
      hwreport_text(sample_, past, HWREPORT_NAME, &name),
      hwreport_text(sample_, SIZE_MAX, HWREPORT_NAME, &name),
      hwreport_text(sample_, 0, 0, &name),
      hwreport_text(sample_, 0, HWREPORT_NAME, nullptr),
      hwreport_number(nullptr, 0, HWREPORT_FORMAT, &word),
      hwreport_number(sample_, 0, -1, &word),
      hwreport_subscribe(device_, nullptr, &subscription),
      hwreport_subscribe(nullptr, sample_, &subscription),
      hwreport_sample(nullptr, &set),
      hwreport_delta(sample_, nullptr, &set),
      hwreport_delta(sample_, sample_, nullptr),
      hwreport_simple_value(sample_, past, &value),
      hwreport_simple_value(sample_, 0, nullptr),
      hwreport_elements(sample_, 1, 99, &value, 1, &length),
      hwreport_elements(sample_, 1, HWREPORT_STATE_IDS, nullptr, 1, &length),
      hwreport_elements(sample_, 1, HWREPORT_STATE_IDS, &value, 1, nullptr),
      hwreport_state_name(sample_, past, 0, &name),
      hwreport_state_share(sample_, 1, 0, nullptr),
      hwreport_state_current(nullptr, 1, &length),
      hwreport_histogram_range(sample_, past, nullptr, nullptr),
      hwreport_scale(1, 1, 1, nullptr),
  };
  for (const int& result : results) EXPECT_EQ(result, HWREPORT_BAD_ARGUMENT) << &result - results;
  EXPECT_EQ(hwreport_state_name(sample_, 1, SIZE_MAX, &name), HWREPORT_NO_VALUE);
  EXPECT_EQ(hwreport_state_share(sample_, 1, SIZE_MAX, &real), HWREPORT_NO_VALUE);
  EXPECT_EQ(hwreport_count(nullptr) + hwreport_count(deviceAsSet), 0u);
  EXPECT_EQ(hwreport_count(sample_), past) << "nothing was removed";
  hwreport_close(setAsDevice);
  hwreport_free(deviceAsSet);
  hwreport_close(nullptr);
  hwreport_unsubscribe(nullptr);
}

}  // namespace
}  // namespace tally
