// Reading legends, building collections, filters, names.
#include "hwreport/channel_world.h"

namespace tally {
namespace {

using namespace tests;

KvRef<KvDictionary> legendGroup(const char* group, const char* subgroup,
                                std::initializer_list<KvRef<KvObject>> channels) {
  auto made = flat(channels);
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
  const std::string general = "E00002BC " + std::string(kNoReason);
  const struct {
    const char* what;
    KvRef<KvObject> legend;
    std::string names, error = {};
  } cases[] = {
      {"no legend", nullptr, "", "E00002F0 no legend"},
      {"no array", text("x"), "", "E00002C9 bad legend"},
      {"subgroup without group ends it", KvArray::create({good, legendGroup(nullptr, "S", {b})}),
       "a"},
      {"no channels end it", KvArray::create({good, KvDictionary::create(), good}), "a"},
      {"wrong types are absent", KvArray::create({good, wrongInfo}), "a b"},
      {"a channel that is no array ends its group",
       KvArray::create({legendGroup("G", "S", {a, text("x"), b}), legendGroup("H", "S", {b})}),
       "a b"},
      {"id is text",
       KvArray::create({legendGroup("G", "S", {KvArray::create({text("1"), number(1)})})}), "",
       general},
      {"type word is the invalid marker",
       KvArray::create({legendGroup("G", "S", {line(1, kInvalid, "x")})}), "", general},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    registry().entries.clear();
    addDriver("D", 0x10, c.legend);
    const RegistryHandle driver = registry().handleOf(0);
    KvRef<HwReportError> error;
    const auto collection = HwReportCopyChannelsForDriver(driver, 0, &error);
    EXPECT_EQ(errorText(error), c.error);
    EXPECT_EQ(!collection, !c.error.empty());
    EXPECT_EQ(namesOf(collection.get()), c.names);
    // Over all drivers a driver that fails is passed over; over matching ones it is not.
    error = nullptr;
    EXPECT_EQ(namesOf(HwReportCopyAllChannels(0, &error).get()), c.names);
    EXPECT_FALSE(error);
    const auto matching = ServiceMatchingByClass("Driver");
    EXPECT_EQ(!HwReportCopyChannelsForDrivers(matching.get(), 0, &error), !c.error.empty());
    EXPECT_EQ(errorText(error), c.error.empty() ? "" : general);
    registry().HandleRelease(driver);
  }
}

TEST_F(Channels, ADriverIsAdmittedByThePresenceOfAProperty) {
  addDriver("D", 0x10, KvArray::create({legendGroup("G", nullptr, {line(1, 1, "a")})}));
  registry().entries[0].properties->set("HwReportLegendPublic", KvBoolean::of(false));
  EXPECT_EQ(namesOf(HwReportCopyAllChannels(0).get()), "a");
  registry().entries[0].properties->remove("HwReportLegendPublic");
  EXPECT_EQ(namesOf(HwReportCopyAllChannels(0).get()), "");
}

TEST_F(Channels, OptionBitsInAllCombinationsPlaceAChannel) {
  const auto name = text("D"), g = text("G"), s = text("S");
  const struct {
    std::int32_t options;
    KvString *group, *subgroup;
    std::string path;  // the keys of the levels, without the HwReport before the fixed ones
  } cases[] = {
      {0, g.get(), s.get(), ""},
      {2, g.get(), s.get(), "ChannelGroups G ChannelGroups S "},
      {3, g.get(), s.get(), "Drivers D ChannelGroups G ChannelGroups S "},
      {2, g.get(), nullptr, "ChannelGroups G "},
      {3, nullptr, nullptr, "Drivers D "},
      {INT32_MIN | 3, g.get(), nullptr, "Drivers D ChannelGroups G "},
  };
  for (const auto& c : cases) {
    const auto collection = HwReportCreateAggregate(c.options);
    EXPECT_EQ(HwReportAddChannelDescription(collection.get(), 0x10, name.get(), 7, 1, nullptr,
                                            c.group, c.subgroup, nullptr),
              0u);
    EXPECT_EQ(collection->getAs<KvNumber>("QueryOpts")->kind(), KvNumberKind::Int32);
    EXPECT_EQ(HwReportGetChannelCount(collection.get()), 1);
    collection->remove("QueryOpts");
    std::string path;
    for (const KvDictionary* level = collection.get(); level != nullptr;) {
      ASSERT_EQ(level->size(), 1u) << path;
      const auto& [key, value] = *level->begin();
      path.append(key->view().substr(key->view().starts_with("HwReport") ? 8 : 0)).append(" ");
      level = kvCast<KvDictionary>(value.get());
    }
    EXPECT_EQ(path, c.path + "Channels ");
  }
}

TEST_F(Channels, ADescriptionThatCannotBeAddedSaysWhyAndLeavesTheCollection) {
  const auto with = [](std::int32_t options, const char* key, KvRef<KvObject> value) {
    auto collection = HwReportCreateAggregate(options);
    collection->set(key, value);
    return collection;
  };
  const auto name = text("D"), group = text("G");
  const std::string notCreated = "E00002BC couldn't create channel";
  const struct {
    KvRef<KvDictionary> collection;
    std::string error;
    KvString* driver;
    std::uint64_t type = 1;
  } cases[] = {
      {nullptr, "E00002C2 _addChannel() failed", name.get()},
      {HwReportCreateAggregate(0), notCreated, nullptr},
      {HwReportCreateAggregate(0), notCreated, name.get(), kInvalid},
      {with(1, "HwReportDrivers", KvDictionary::create({{"D", name}})), kNotAdded, name.get()},
      {with(2, "HwReportChannelGroups", name), kNotAdded, name.get()},
  };
  for (const auto& c : cases) {
    const std::string before = kvText(c.collection.get());
    KvRef<HwReportError> error;
    const HwResult result = HwReportAddChannelDescription(
        c.collection.get(), 1, c.driver, 1, c.type, nullptr, group.get(), nullptr, nullptr, &error);
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
  const auto nameless = flat({channel(4, 1, "d"), channel(5, 1, "e")});
  channelAt(nameless, 0)->remove("DriverName");
  const auto byDriver = HwReportCreateAggregate(kHwReportByDriver);
  EXPECT_EQ(HwReportMergeChannels(byDriver.get(), nameless.get(), &error), 1);
  EXPECT_EQ(errorText(error), kNotAdded);
  EXPECT_EQ(byDriver->size(), 1u) << "no level was made for it";
}

TEST_F(Channels, FiltersKeepWhatTheyAreAskedFor) {
  auto timed = legendGroup(
      "G", "S", {line(1, typeWord(1, 1, 0x102), "a"), line(2, typeWord(2, 3, 0x2), "b")});
  timed->set("HwReportChannelInfo", HwReportCreateUnitInfo(1ull << 56));
  addDriver(
      "D", 0x10,
      KvArray::create({timed, legendGroup("G", nullptr, {line(3, typeWord(3, 4, 0x100), "c")}),
                       legendGroup("H", "S", {line(4, typeWord(1, 1), "d")}),
                       legendGroup(nullptr, nullptr, {line(5, typeWord(0, 0), "e")})}));
  const auto g = text("G"), s = text("S"), none = text("x");
  for (std::int32_t options = 0; options < 4; ++options) {
    // In the order of the legend, and by group.
    const auto expect = [&](const KvRef<KvDictionary>& set, const char* names,
                            const char* byGroup = nullptr) {
      EXPECT_EQ(namesOf(set.get()), options >= 2 && byGroup != nullptr ? byGroup : names);
    };
    expect(HwReportCopyAllChannels(options), "a b c d e", "e c a b d");
    expect(HwReportCopyChannelsInCategories(0x100, options), "a c", "c a");
    expect(HwReportCopyChannelsOfFormat(1, options), "a d");
    expect(HwReportCopyChannelsOfFormat(0, options), "e");
    expect(HwReportCopyChannelsWithUnit(1ull << 56, options), "a b");
    expect(HwReportCopyChannelsWithUnit(kInvalid, options), "c d e", "e c d");
    expect(HwReportCopyChannelsInGroup(g.get(), nullptr, options), "a b c", "c a b");
    expect(HwReportCopyChannelsInGroup(nullptr, s.get(), options), "a b d");
    expect(HwReportCopyChannelsInGroup(g.get(), s.get(), options), "a b");
    EXPECT_EQ(HwReportCopyChannelsInGroup(none.get(), s.get(), options)->size(), 1u)
        << "only the options are left";
  }
  KvRef<HwReportError> error;
  EXPECT_FALSE(HwReportCopyChannelsInGroup(nullptr, nullptr, 0, &error));
  EXPECT_EQ(errorText(error), "E00002C2 no group or subgroup!");
  const auto malformed = flat({text("x")});
  EXPECT_EQ(HwReportSelectChannelsInGroup(malformed.get(), g.get(), nullptr, &error), 1);
  EXPECT_EQ(errorText(error), "E00002BC channel pruning failed");
  // A channel whose type cannot be read is in every category.
  EXPECT_EQ(HwReportChannelGetCategories(KvDictionary::create().get()), 0xFFFF);
}

TEST_F(Channels, RegistryFailuresBecomeErrors) {
  addDriver("D", 0x10, KvArray::create({legendGroup("G", nullptr, {line(1, 1, "a")})}));
  const auto matching = ServiceMatchingByClass("Driver");
  KvRef<HwReportError> error;
  for (const std::string code : {"E00002EB ", "E0000042 "}) {
    registry().changesDuringWalk = code == "E00002EB ";
    registry().matchResult = registry().changesDuringWalk ? 0 : 0xE0000042;
    EXPECT_FALSE(HwReportCopyAllChannels(0, &error));
    EXPECT_EQ(errorText(error), code + kNoReason);
    EXPECT_FALSE(HwReportCopyChannelsForDrivers(matching.get(), 0, &error));
    EXPECT_EQ(errorText(error), code + kNoReason);
    EXPECT_FALSE(HwReportCopyChannelsWithID(matching.get(), 7, &error));
    EXPECT_EQ(errorText(error), code + kNoReason);
    EXPECT_FALSE(HwReportCopyChannelsInCategories(1, 0, &error));
    EXPECT_EQ(errorText(error), code + kNoReason);
  }
  registry().matchResult = 0;
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
  testing::internal::CaptureStderr();
  HwReportCopyAllChannels(0);
  HwReportCopyAllChannels(kHwReportPrintErrors);
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "D <id 0x10>: no legend\n<unknown> function: bad legend\n")
      << "once";
}

TEST(ChannelNames, ComeFromTheLegendOrTheID) {
  const std::pair<std::uint64_t, std::string> cases[] = {
      {0x435055, "CPU"},  {0x4300500055000000, "CPU"}, {0x41420043, "ABC"}, {0x4101, "(null)"},
      {0x417F, "(null)"}, {0x4180, "(null)"},          {0, "(null)"},       {0x207E, " ~"}};
  for (const auto& [id, expected] : cases) {
    const auto one = channel(id, 1);
    const KvString* const name = HwReportChannelGetChannelName(one.get());
    EXPECT_EQ(kvText(name), expected) << id;
    EXPECT_EQ(one->contains("ChannelName"), name != nullptr);
    EXPECT_EQ(HwReportChannelGetChannelName(one.get()), name) << "cached";
  }
  const auto named = channel(0x435055, 1, "named");
  EXPECT_EQ(kvText(HwReportChannelGetChannelName(named.get())), "named");
}

}  // namespace
}  // namespace tally
