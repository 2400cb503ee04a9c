// The functions for C: figures, conversions, and wrong arguments.
#include <gtest/gtest.h>

#include "fakes/fake_storage.h"
#include "storage/c_api/handles.h"

namespace tally {
namespace {

using fakes::statisticsBuffer;

class StorageCFunctions : public testing::Test {
 protected:
  ~StorageCFunctions() override {
    tallystorage_free_values(values_);
    tallystorage_close(device_);
  }
  std::int64_t figure(const char* name) {
    std::size_t index = 0;
    std::int64_t value = -1;
    EXPECT_EQ(tallystorage_find(values_, name, &index), TALLYSTORAGE_OK) << name;
    EXPECT_EQ(tallystorage_value_int64(values_, index, &value), TALLYSTORAGE_OK) << name;
    return value;
  }
  fakes::FakeStorage storage_;
  tallystorage_device* device_ = new tallystorage_device{{}, sharePlatform(storage_.services())};
  tallystorage_values* values_ = nullptr;
};

TEST_F(StorageCFunctions, DisksAndFigures) {
  Wear wear;
  wear.used = {{3, 3}, "a file"};
  storage_.platform.flashDisks->list = {{"mmcblk0", DiskKind::Emmc, "", false, true, wear},
                                        {"sda", DiskKind::Other, "", true, false, {}}};
  storage_.platform.flashDisks->registry = storage_.registry;
  tallystorage_disks* disks = nullptr;
  ASSERT_EQ(tallystorage_list_disks(device_, &disks), TALLYSTORAGE_OK);
  const char* kind = nullptr;
  std::uint32_t flags = 0;
  EXPECT_EQ(tallystorage_disk_count(disks), 2u);
  EXPECT_EQ(tallystorage_disk_kind(disks, 0, &kind), TALLYSTORAGE_OK);
  EXPECT_STREQ(kind, "eMMC");
  EXPECT_EQ(tallystorage_disk_flags(disks, 0, &flags), TALLYSTORAGE_OK);
  EXPECT_EQ(flags, 5u);
  EXPECT_EQ(tallystorage_disk_flags(disks, 1, &flags), TALLYSTORAGE_OK);
  EXPECT_EQ(flags, 2u);
  EXPECT_EQ(tallystorage_disk_name(disks, 2, &kind), TALLYSTORAGE_BAD_ARGUMENT);
  tallystorage_free_disks(disks);

  storage_.registry->serve(statisticsBuffer({{53, {0x20002}}, {532, {97}}}));
  ASSERT_EQ(tallystorage_nand_info(device_, "mmcblk0", &values_), TALLYSTORAGE_OK);
  EXPECT_EQ(figure("vellum.NANDInfo.ExportVersion"), 0x20002);
  tallystorage_free_values(values_);
  storage_.registry->serve(statisticsBuffer({{53, {0x20002}}, {532, {97}}}));
  ASSERT_EQ(tallystorage_nand_health(device_, nullptr, &values_), TALLYSTORAGE_OK);
  EXPECT_EQ(figure("vellum.NANDInfo.spareAvailablePercent"), 97);
  std::size_t index = 0;
  EXPECT_EQ(tallystorage_find(values_, "vellum.NANDInfo.ueccReads", &index),
            TALLYSTORAGE_NOT_FOUND);
}

TEST_F(StorageCFunctions, AFailureIsNotHealth) {
  storage_.registry->serve(statisticsBuffer({{53, {0}}}));
  EXPECT_EQ(tallystorage_nand_health(device_, nullptr, &values_), TALLYSTORAGE_FAILED);
  EXPECT_EQ(values_, nullptr);
  EXPECT_EQ(tallystorage_nand_health(device_, "none", &values_), TALLYSTORAGE_NOT_FOUND);
  storage_.registry->classes.clear();
  EXPECT_EQ(tallystorage_nand_info(device_, nullptr, &values_), TALLYSTORAGE_NOT_FOUND);
}

TEST_F(StorageCFunctions, ConversionsLoseNothing) {
  constexpr std::int64_t kNone = -77;
  const struct {
    KvRef<KvObject> value;
    int kind;
    std::int64_t asInt64;
    std::uint64_t asUInt64;
    double asDouble;
    const char* asText;
  } cases[] = {
      {KvNumber::int32(-5), TALLYSTORAGE_INT64, -5, 0, -5, ""},
      {KvNumber::int64(INT64_MAX), TALLYSTORAGE_INT64, INT64_MAX, INT64_MAX, 0x1p63, ""},
      {KvNumber::uint64(UINT64_MAX), TALLYSTORAGE_UINT64, 0, UINT64_MAX, 0x1p64, ""},
      {KvNumber::uint32(7), TALLYSTORAGE_UINT64, 7, 7, 7, ""},
      {KvNumber::float64(1.5), TALLYSTORAGE_DOUBLE, 0, 0, 1.5, ""},
      {KvString::create("t"), TALLYSTORAGE_TEXT, 0, 0, 0, "t"},
  };
  tallystorage_values values;
  for (const auto& c : cases) values.list.push_back({KvString::create("n"), c.value});
  for (std::size_t i = 0; i < std::size(cases); ++i) {
    SCOPED_TRACE(i);
    int kind = 0;
    std::int64_t integer = kNone;
    std::uint64_t natural = 77;
    double real = 77;
    const char* text = nullptr;
    EXPECT_EQ(tallystorage_value_kind(&values, i, &kind), TALLYSTORAGE_OK);
    EXPECT_EQ(kind, cases[i].kind);
    tallystorage_value_int64(&values, i, &integer);
    EXPECT_EQ(integer, cases[i].asInt64);
    tallystorage_value_uint64(&values, i, &natural);
    EXPECT_EQ(natural, cases[i].asUInt64);
    tallystorage_value_double(&values, i, &real);
    EXPECT_EQ(real, cases[i].asDouble);
    const int result = tallystorage_value_text(&values, i, &text);
    EXPECT_STREQ(text, cases[i].asText);
    EXPECT_EQ(result == TALLYSTORAGE_OK, kind == TALLYSTORAGE_TEXT);
  }
}

TEST_F(StorageCFunctions, WrongArguments) {
  const auto asValues = reinterpret_cast<tallystorage_values*>(device_);
  tallystorage_values set;
  std::size_t index = 0;
  std::int64_t value = 0;
  const char* text = nullptr;
  const int results[] = {
      tallystorage_list_disks(device_, nullptr),
      tallystorage_disk_flags(nullptr, 0, nullptr),
      tallystorage_nand_info(nullptr, nullptr, &values_),
      tallystorage_nand_info(device_, nullptr, nullptr),
      tallystorage_nand_info(device_, "\xFF", &values_),
      tallystorage_nand_health(reinterpret_cast<tallystorage_device*>(&set), nullptr, &values_),
      tallystorage_find(&set, nullptr, &index),
      tallystorage_find(asValues, "n", &index),
      tallystorage_value_name(&set, SIZE_MAX, &text),
      tallystorage_value_int64(&set, 0, &value),
      tallystorage_value_int64(asValues, 0, &value),
      tallystorage_value_text(&set, 0, nullptr),
  };
  for (const int& result : results)
    EXPECT_EQ(result, TALLYSTORAGE_BAD_ARGUMENT) << &result - results;
  EXPECT_EQ(tallystorage_find(&set, "n", &index), TALLYSTORAGE_NOT_FOUND);
  EXPECT_EQ(tallystorage_value_count(asValues), 0u);
  tallystorage_free_values(asValues);
  tallystorage_free_values(nullptr);
}

}  // namespace
}  // namespace tally
