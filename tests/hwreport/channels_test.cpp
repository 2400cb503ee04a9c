// Reading legends, building collections, filters, names.
#include "hwreport/channel_world.h"

namespace tally {
namespace {

using namespace tests;

KvRef<KvDictionary> legendGroup(const char* group, const char* subgroup,
                                std::initializer_list<KvRef<KvObject>> channels) {
  auto made = KvDictionary::create({{"HwReportChannels", KvArray::create(channels)}});
  if (group != nullptr) made->set("HwReportGroupName", text(group));
  if (subgroup != nullptr) made->set("HwReportSubGroupName", text(subgroup));
  return made;
}

KvRef<KvObject> line(std::uint64_t id, std::uint64_t type, const char* name) {
  return KvArray::create({number(id), number(type), text(name)});
}

class Channels : public RegistryTest {};

TEST_F(Channels, LegendsOfEveryShape) {
  const auto a = line(1, 0x1, "a"), b = line(2, 0x1, "b");
  const auto good = legendGroup("G", nullptr, {a});
  const auto wrongInfo = legendGroup("G", nullptr, {b});
  wrongInfo->set("HwReportChannelInfo", text("kHz"));
  wrongInfo->set("HwReportGroupName", number(5));
  const struct {
    const char* what;
    KvRef<KvObject> legend;
    const char* names;  // null: failure
    std::string error = {};
  } cases[] = {
      {"no legend", nullptr, nullptr, "E00002F0 no legend"},
      {"no array", text("x"), nullptr, "E00002C9 bad legend"},
      {"subgroup without group ends it", KvArray::create({good, legendGroup(nullptr, "S", {b})}),
       "a"},
      {"no channels end it", KvArray::create({good, KvDictionary::create(), good}), "a"},
      {"wrong types are absent", KvArray::create({good, wrongInfo}), "a b"},
      {"a channel that is no array ends its group",
       KvArray::create({legendGroup("G", "S", {a, text("x"), b}), legendGroup("H", "S", {b})}),
       "a b"},
      {"id is text",
       KvArray::create({legendGroup("G", "S", {KvArray::create({text("1"), number(1)})})}), nullptr,
       "E00002BC " + std::string(kNoReason)},
      {"type word is the invalid marker",
       KvArray::create({legendGroup("G", "S", {line(1, kInvalid, "x")})}), nullptr,
       "E00002BC " + std::string(kNoReason)},
  };
  for (const auto& c : cases) {
    registry().entries.clear();
    addDriver("D", 0x10, c.legend);
    const RegistryHandle driver = registry().handleOf(0);
    KvRef<HwReportError> error;
    const auto collection = HwReportCopyChannelsForDriver(driver, 0, &error);
    EXPECT_EQ(errorText(error), c.error) << c.what;
    ASSERT_EQ(!collection, c.names == nullptr) << c.what;
    EXPECT_EQ(namesOf(collection.get()), c.names != nullptr ? c.names : "") << c.what;
    // Over all drivers a driver that fails is passed over; over matching ones it is not.
    error = nullptr;
    EXPECT_EQ(namesOf(HwReportCopyAllChannels(0, &error).get()), c.names != nullptr ? c.names : "");
    EXPECT_FALSE(error);
    const auto matching = ServiceMatchingByClass("Driver");
    EXPECT_EQ(!HwReportCopyChannelsForDrivers(matching.get(), 0, &error), c.names == nullptr);
    EXPECT_EQ(errorText(error), c.names != nullptr ? "" : "E00002BC " + std::string(kNoReason));
    registry().HandleRelease(driver);
  }
}

TEST_F(Channels, ADriverIsAdmittedByThePresenceOfAProperty) {
  addDriver("D", 0x10, KvArray::create({legendGroup("G", nullptr, {line(1, 1, "a")})}));
  registry().entries[0].properties->set("HwReportLegendPublic", KvBoolean::of(false));
  EXPECT_EQ(namesOf(HwReportCopyAllChannels(0).get()), "a");
  registry().entries[0].properties->remove("HwReportLegendPublic");
  const RegistryHandle driver = registry().handleOf(0);
  EXPECT_EQ(HwReportGetChannelCount(HwReportCopyChannelsForDriver(driver, 0).get()), 0);
  registry().HandleRelease(driver);
}

TEST_F(Channels, OptionBitsInAllCombinationsPlaceAChannel) {
  constexpr std::string_view drivers = "HwReportDrivers", driver = "D <id 0x10>",
                             groups = "HwReportChannelGroups";
  const struct {
    std::int32_t options;
    const char *group, *subgroup;
    std::vector<std::string_view> path;
  } cases[] = {
      {0, "G", "S", {}},
      {2, "G", "S", {groups, "G", groups, "S"}},
      {3, "G", "S", {drivers, driver, groups, "G", groups, "S"}},
      {2, "G", nullptr, {groups, "G"}},
      {3, nullptr, nullptr, {drivers, driver}},
      {INT32_MIN | 3, "G", nullptr, {drivers, driver, groups, "G"}},
  };
  for (const auto& c : cases) {
    const auto collection = HwReportCreateAggregate(c.options);
    EXPECT_EQ(HwReportAddChannelDescription(
                  collection.get(), 0x10, text("D <id 0x10>").get(), 7, 1, text("n").get(),
                  c.group != nullptr ? text(c.group).get() : nullptr,
                  c.subgroup != nullptr ? text(c.subgroup).get() : nullptr, nullptr),
              0u);
    const KvDictionary* level = collection.get();
    EXPECT_EQ(level->size(), 2u) << "options and one level";
    EXPECT_EQ(level->getAs<KvNumber>("QueryOpts")->kind(), KvNumberKind::Int32);
    for (const auto key : c.path) {
      level = level->getAs<KvDictionary>(key);
      ASSERT_NE(level, nullptr) << key;
      EXPECT_EQ(level->size(), 1u) << key;
    }
    ASSERT_NE(level->getAs<KvArray>("HwReportChannels"), nullptr);
    EXPECT_EQ(level->getAs<KvArray>("HwReportChannels")->size(), 1u);
    EXPECT_EQ(HwReportGetChannelCount(collection.get()), 1);
  }
}

TEST_F(Channels, ADescriptionThatCannotBeAddedSaysWhyAndLeavesTheCollection) {
  const auto broken = [](std::int32_t options, Fields fields) {
    auto collection = HwReportCreateAggregate(options);
    collection->merge(*KvDictionary::create(fields));
    return collection;
  };
  const auto name = text("D"), group = text("G");
  const struct {
    KvRef<KvDictionary> collection;
    KvString* driver;
    std::uint64_t id, type;
    std::string error;
  } cases[] = {
      {nullptr, name.get(), 1, 1, "E00002C2 _addChannel() failed"},
      {broken(0, {}), nullptr, 1, 1, "E00002BC couldn't create channel"},
      {broken(0, {}), name.get(), 1, kInvalid, "E00002BC couldn't create channel"},
      {broken(1, {{"HwReportDrivers", KvDictionary::create({{"D", name}})}}), name.get(), 1, 1,
       "E00002BC _addChannel() failed"},
      {broken(2, {{"HwReportChannelGroups", name}}), name.get(), 1, 1,
       "E00002BC _addChannel() failed"},
  };
  for (const auto& c : cases) {
    const std::string before = kvText(c.collection.get());
    KvRef<HwReportError> error;
    const HwResult result =
        HwReportAddChannelDescription(c.collection.get(), 1, c.driver, c.id, c.type, nullptr,
                                      group.get(), nullptr, nullptr, &error);
    EXPECT_EQ(errorText(error), c.error);
    EXPECT_EQ(result, error->code());
    EXPECT_EQ(kvText(c.collection.get()), before);
  }
}

TEST_F(Channels, MergingSharesChannelsAndRegroupsThem) {
  const auto source =
      flat({channel(1, 1, "a", "G"), channel(2, 1, "b", "H"), channel(3, 1, "c", "G")});
  const auto destination = HwReportCreateAggregate(kHwReportByGroup);
  KvRef<HwReportError> error;
  EXPECT_EQ(HwReportMergeChannels(destination.get(), source.get(), &error), 0);
  EXPECT_EQ(namesOf(destination.get()), "a c b");
  EXPECT_FALSE(error);
  EXPECT_EQ(HwReportMergeChannels(destination.get(), destination.get(), &error), HwIterFailed);
  EXPECT_EQ(errorText(error), "E00002C2 bad argument");
  EXPECT_EQ(HwReportMergeChannels(nullptr, source.get(), nullptr), HwIterFailed);
  // A channel that has no driver cannot be put below one, and stops the merge.
  const auto nameless = channel(4, 1, "d");
  nameless->remove("DriverName");
  const auto byDriver = HwReportCreateAggregate(kHwReportByDriver);
  EXPECT_EQ(
      HwReportMergeChannels(byDriver.get(), flat({nameless, channel(5, 1, "e")}).get(), &error), 1);
  EXPECT_EQ(errorText(error), "E00002BC _addChannel() failed");
  EXPECT_EQ(byDriver->size(), 1u) << "no level was made for it";
}

TEST_F(Channels, FiltersKeepWhatTheyAreAskedFor) {
  const auto unit = [](std::uint64_t word) { return HwReportCreateUnitInfo(word); };
  auto timed = legendGroup(
      "G", "S", {line(1, typeWord(1, 1, 0x102), "a"), line(2, typeWord(2, 3, 0x2), "b")});
  timed->set("HwReportChannelInfo", unit(1ull << 56));
  addDriver(
      "D", 0x10,
      KvArray::create({timed, legendGroup("G", nullptr, {line(3, typeWord(3, 4, 0x100), "c")}),
                       legendGroup("H", "S", {line(4, typeWord(1, 1), "d")}),
                       legendGroup(nullptr, nullptr, {line(5, typeWord(0, 0), "e")})}));
  for (std::int32_t options = 0; options < 4; ++options) {
    const auto names = [](const KvRef<KvDictionary>& set) { return namesOf(set.get()); };
    const auto g = text("G"), s = text("S"), none = text("x");
    EXPECT_EQ(names(HwReportCopyAllChannels(options)), options >= 2 ? "e c a b d" : "a b c d e");
    EXPECT_EQ(names(HwReportCopyChannelsInCategories(0x100, options)),
              options >= 2 ? "c a" : "a c");
    EXPECT_EQ(names(HwReportCopyChannelsOfFormat(1, options)), "a d");
    EXPECT_EQ(names(HwReportCopyChannelsOfFormat(0, options)), "e");
    EXPECT_EQ(names(HwReportCopyChannelsWithUnit(1ull << 56, options)), "a b");
    EXPECT_EQ(names(HwReportCopyChannelsWithUnit(kInvalid, options)),
              options >= 2 ? "e c d" : "c d e");
    EXPECT_EQ(names(HwReportCopyChannelsInGroup(g.get(), nullptr, options)),
              options >= 2 ? "c a b" : "a b c");
    EXPECT_EQ(names(HwReportCopyChannelsInGroup(nullptr, s.get(), options)), "a b d");
    EXPECT_EQ(names(HwReportCopyChannelsInGroup(g.get(), s.get(), options)), "a b");
    EXPECT_EQ(HwReportCopyChannelsInGroup(none.get(), s.get(), options)->size(), 1u)
        << "only the options are left";
  }
  KvRef<HwReportError> error;
  EXPECT_FALSE(HwReportCopyChannelsInGroup(nullptr, nullptr, 0, &error));
  EXPECT_EQ(errorText(error), "E00002C2 no group or subgroup!");
  const auto malformed = flat({text("x")});
  EXPECT_EQ(HwReportSelectChannelsInGroup(malformed.get(), text("G").get(), nullptr, &error), 1);
  EXPECT_EQ(errorText(error), "E00002BC channel pruning failed");
  // A channel whose type cannot be read is in every category.
  EXPECT_EQ(HwReportChannelGetCategories(KvDictionary::create().get()), 0xFFFF);
}

TEST_F(Channels, RegistryFailuresBecomeErrors) {
  addDriver("D", 0x10, KvArray::create({legendGroup("G", nullptr, {line(1, 1, "a")})}));
  const auto matching = ServiceMatchingByClass("Driver");
  const auto all = [&](int which, KvRef<HwReportError>* error) {
    return which == 0   ? HwReportCopyAllChannels(0, error)
           : which == 1 ? HwReportCopyChannelsForDrivers(matching.get(), 0, error)
           : which == 2 ? HwReportCopyChannelsWithID(matching.get(), 7, error)
                        : HwReportCopyChannelsInCategories(1, 0, error);
  };
  for (int which = 0; which < 4; ++which) {
    KvRef<HwReportError> error;
    registry().changesDuringWalk = true;
    EXPECT_FALSE(all(which, &error));
    EXPECT_EQ(errorText(error), "E00002EB " + std::string(kNoReason));
    registry().changesDuringWalk = false;
    registry().matchResult = 0xE0000042;
    EXPECT_FALSE(all(which, &error));
    EXPECT_EQ(errorText(error), "E0000042 " + std::string(kNoReason));
    registry().matchResult = 0;
  }
  KvRef<HwReportError> error;
  EXPECT_FALSE(HwReportCopyChannelsForDrivers(nullptr, 0, &error));
  EXPECT_EQ(errorText(error), "E00002C2 no matching dict");
  EXPECT_FALSE(HwReportCopyChannelsForDriver(0, 0, &error));
  EXPECT_EQ(errorText(error), "E00002C2 invalid driver");
  EXPECT_FALSE(HwReportCopyChannelsWithID(matching.get(), kInvalid, &error));
  EXPECT_EQ(errorText(error), "E00002BC couldn't create channel");
  registry().entries[0].idResult = 0xE0000043;
  EXPECT_FALSE(HwReportCopyChannelsWithID(matching.get(), 7, &error));
  EXPECT_EQ(errorText(error), "E0000043 error extracting driver info");
}

TEST_F(Channels, ADriverThatFailsIsPrintedWhenAskedFor) {
  addDriver("D", 0x10, nullptr);
  addDriver("N", 0, text("x"));
  registry().entries[1].nameResult = 1;
  for (const bool print : {false, true}) {
    testing::internal::CaptureStderr();
    HwReportCopyAllChannels(print ? kHwReportPrintErrors : 0);
    EXPECT_EQ(testing::internal::GetCapturedStderr(),
              print ? "D <id 0x10>: no legend\n<unknown> function: bad legend\n" : "");
  }
}

TEST(ChannelNames, ComeFromTheLegendOrTheID) {
  const struct {
    std::uint64_t id;
    const char* legend;
    const char* name;
  } cases[] = {
      {0x435055, nullptr, "CPU"},   {0x4300500055000000, nullptr, "CPU"},
      {0x41420043, nullptr, "ABC"}, {0x4101, nullptr, nullptr},
      {0x417F, nullptr, nullptr},   {0x4180, nullptr, nullptr},
      {0, nullptr, nullptr},        {0x207E, nullptr, " ~"},
      {0x435055, "named", "named"},
  };
  for (const auto& c : cases) {
    const auto one = channel(c.id, 1, c.legend);
    const KvString* const name = HwReportChannelGetChannelName(one.get());
    ASSERT_EQ(name == nullptr, c.name == nullptr) << c.id;
    EXPECT_EQ(one->contains("ChannelName"), name != nullptr);
    if (name == nullptr) continue;
    EXPECT_EQ(name->view(), c.name);
    EXPECT_EQ(HwReportChannelGetChannelName(one.get()), name) << "cached";
  }
}

}  // namespace
}  // namespace tally
