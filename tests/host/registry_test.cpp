// The registry of a described device: matching, handles, iterators, drivers.
#include <gtest/gtest.h>

#include <vector>

#include "host/described_device.h"

namespace tally {
namespace {

using tests::DescribedDevice;

constexpr const char* kThreeEntries = R"(<dict><key>Entries</key><array>
  <dict><key>Class</key><string>Root</string><key>ID</key><integer>1</integer>
    <key>Properties</key><dict><key>Kind</key><string>top</string></dict></dict>
  <dict><key>Class</key><string>Bus</string><key>Name</key><string>bus0</string>
    <key>ID</key><integer>2</integer><key>Parents</key><array><integer>1</integer><integer>3</integer></array>
    <key>Properties</key><dict><key>Speed</key><integer>5</integer></dict></dict>
  <dict><key>Class</key><string>Bus</string><key>Name</key><string>bus1</string>
    <key>ID</key><integer>3</integer><key>Parents</key><array><integer>2</integer></array>
    <key>Properties</key><dict><key>Speed</key><integer>7</integer><key>Public</key><false/></dict></dict>
</array></dict>)";

std::string names(DeviceRegistry& registry, KvRef<KvDictionary> matching) {
  RegistryHandle iterator = 0;
  if (registry.RegistryCopyMatchingServices(std::move(matching), &iterator) != 0) return "failed";
  std::string text;
  while (const RegistryHandle entry = registry.RegistryIteratorNext(iterator)) {
    std::string name;
    registry.RegistryGetName(entry, &name);
    text += name + " ";
    registry.HandleRelease(entry);
  }
  registry.HandleRelease(iterator);
  return text;
}

TEST(Registry, MatchesByEveryKeyAndTheirCombinations) {
  DescribedDevice device(kThreeEntries);
  const auto text = [](const char* t) { return KvString::create(t); };
  const auto number = [](std::int64_t n) { return KvNumber::int64(n); };
  const auto property = [](const char* name, KvRef<KvObject> value) {
    return KvDictionary::create({{kMatchProperty, KvDictionary::create({{name, value}})}});
  };
  const struct {
    const char* name;
    KvRef<KvDictionary> matching;
    const char* expected;
  } cases[] = {
      {"class", ServiceMatchingByClass("Bus"), "bus0 bus1 "},
      {"id", KvDictionary::create({{kMatchEntryID, number(2)}}), "bus0 "},
      {"a real id", KvDictionary::create({{kMatchEntryID, KvNumber::float64(2)}}), ""},
      {"class and name",
       KvDictionary::create({{kMatchClass, text("Root")}, {kMatchName, text("bus1")}}), ""},
      {"property value", property("Speed", number(7)), "bus1 "},
      {"property presence, whatever its value", property("Public", KvBoolean::of(true)), "bus1 "},
      {"an unknown key", KvDictionary::create({{"Colour", text("red")}}), ""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(names(device.registry(), c.matching->copy()), c.expected);
  }
  EXPECT_EQ(device.openHandles(), 0u);
}

TEST(Registry, HandlesOutOfUseFailAndNeverCrash) {
  DescribedDevice device(kThreeEntries);
  DeviceRegistry& registry = device.registry();
  const RegistryHandle used = registry.RegistryFindService(ServiceMatchingByClass("Bus"));
  ASSERT_NE(used, 0u);
  registry.HandleRetain(used);
  EXPECT_EQ(registry.RegistryHandleIsValid(used), 2u);
  registry.HandleRelease(used);
  registry.HandleRelease(used);
  RegistryHandle iterator = 0;
  registry.RegistryCopyMatchingServices(KvDictionary::create(), &iterator);
  for (const RegistryHandle wrong : {RegistryHandle{0}, used, iterator, RegistryHandle{~0u}}) {
    std::uint64_t id = 0;
    std::string name;
    ConnectionHandle connection = 7;
    MethodCall call;
    const std::byte* address = nullptr;
    std::size_t length = 0;
    EXPECT_NE(registry.RegistryGetEntryID(wrong, &id), 0u);
    EXPECT_NE(registry.RegistryGetName(wrong, &name), 0u);
    EXPECT_FALSE(registry.RegistryCopyProperty(wrong, "Speed"));
    EXPECT_FALSE(registry.RegistrySearchProperty(wrong, "Speed"));
    EXPECT_NE(registry.ServiceOpenConnection(wrong, 0, &connection), 0u);
    EXPECT_EQ(connection, 0u);
    EXPECT_NE(registry.ConnectionCallMethod(wrong, 0, call), 0u);
    EXPECT_NE(registry.ConnectionMapMemory(wrong, 0, kMapAnywhere, &address, &length), 0u);
    EXPECT_NE(registry.ConnectionUnmapMemory(wrong, 0, nullptr), 0u);
    EXPECT_NE(registry.ServiceCloseConnection(wrong), 0u);
  }
  registry.HandleRelease(iterator);
  EXPECT_EQ(device.openHandles(), 0u);
}

TEST(Registry, SearchesThroughTheParentsEvenInACircle) {
  DescribedDevice device(kThreeEntries);
  DeviceRegistry& registry = device.registry();
  const RegistryHandle entry =
      registry.RegistryFindService(KvDictionary::create({{kMatchName, KvString::create("bus1")}}));
  EXPECT_EQ(kvText(registry.RegistrySearchProperty(entry, "Speed").get()), "7");
  EXPECT_EQ(kvText(registry.RegistrySearchProperty(entry, "Kind").get()), "top");
  EXPECT_FALSE(registry.RegistrySearchProperty(entry, "Nowhere"));
  EXPECT_FALSE(registry.RegistryCopyProperty(entry, "Kind"));
  registry.HandleRelease(entry);
}

TEST(Registry, AnIteratorNoticesThatTheRegistryChanged) {
  DescribedDevice device(kThreeEntries);
  DeviceRegistry& registry = device.registry();
  RegistryHandle iterator = 0;
  registry.RegistryCopyMatchingServices(ServiceMatchingByClass("Bus"), &iterator);
  EXPECT_TRUE(registry.RegistryIteratorIsValid(iterator));
  std::filesystem::remove(device.at("registry.plist"));  // replaced, as an editor does
  device.putPlist("registry.plist", "<dict><key>Entries</key><array/></dict>");
  EXPECT_FALSE(registry.RegistryIteratorIsValid(iterator));
  // What it had found stays usable.
  const RegistryHandle entry = registry.RegistryIteratorNext(iterator);
  EXPECT_NE(registry.RegistryHandleIsValid(entry), 0u);
  registry.HandleRelease(entry);
  registry.HandleRelease(iterator);
  EXPECT_EQ(names(registry, ServiceMatchingByClass("Bus")), "");
}

TEST(Registry, MalformedDescriptionsCostTheirEntryOnly) {
  const struct {
    const char* name;
    const char* content;
    const char* expected;
    std::size_t errors;
  } cases[] = {
      {"no property list", "\x01\x02", "", 1},
      {"a root of a wrong type", "<array/>", "", 1},
      {"faults beside a good entry", R"(<dict><key>Entries</key><array>
          <string>x</string> <dict/> <dict><key>Class</key><integer>1</integer></dict>
          <dict><key>Class</key><string>A</string><key>ID</key><string>1</string></dict>
          <dict><key>Class</key><string>A</string><key>Parents</key><string>1</string></dict>
          <dict><key>Class</key><string>A</string><key>Properties</key><array/></dict>
          <dict><key>Class</key><string>A</string><key>UserClient</key><array/></dict>
          <dict><key>Class</key><string>Good</string><key>ID</key><integer>9</integer></dict>
          <dict><key>Class</key><string>Twin</string><key>ID</key><integer>9</integer></dict>
        </array></dict>)",
       "Good ", 8},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    DescribedDevice device(c.content);
    EXPECT_EQ(names(device.registry(), KvDictionary::create()), c.expected);
    EXPECT_EQ(device.errors(), c.errors);
  }
}

constexpr const char* kDriver = R"(<dict><key>Entries</key><array>
  <dict><key>Class</key><string>Disk</string><key>UserClient</key><dict>
    <key>CloseStatus</key><integer>77</integer><key>Methods</key><array>
    <dict><key>Method</key><integer>8</integer><key>Selector</key><integer>13</integer>
      <key>Data</key><data>AQIDBAU=</data></dict>
    <dict><key>Method</key><integer>8</integer><key>Selector</key><integer>11</integer>
      <key>Flags</key><integer>6</integer><key>Data</key><data>CQ==</data>
      <key>AnnouncedSize</key><integer>100</integer></dict>
    <dict><key>Method</key><integer>8</integer><key>Selector</key><integer>15</integer>
      <key>Data</key><string>../../secret</string></dict>
    <dict><key>Method</key><integer>8</integer><key>Selector</key><integer>16</integer>
      <key>SizeStatus</key><integer>3758097084</integer><key>DataStatus</key><integer>5</integer></dict>
    <dict><key>Method</key><integer>8</integer><key>Selector</key><integer>17</integer>
      <key>Data</key><string>list.bin</string></dict>
    <dict><key>Method</key><integer>5</integer><key>Data</key><data>AQAAAA==</data></dict>
    </array></dict></dict>
  <dict><key>Class</key><string>Shut</string><key>UserClient</key><dict>
    <key>OpenStatus</key><integer>3758097090</integer></dict></dict>
  <dict><key>Class</key><string>Mute</string></dict>
</array></dict>)";

TEST(DescribedDriver, AnswersByMethodSelectorAndFlags) {
  DescribedDevice device(kDriver);
  device.put("list.bin", std::string(3, 'x'));
  DeviceRegistry& registry = device.registry();
  const ConnectionHandle disk = device.connect("Disk");
  ASSERT_NE(disk, 0u);
  const struct {
    const char* name;
    std::uint32_t method, selector, flags, status;
    std::size_t room, written;
    std::uint8_t first;
  } cases[] = {
      {"announced size of the data", 8, 13, 1, 0, 4, 4, 5},
      {"a short buffer", 8, 13, 0, 0, 3, 3, 1},
      {"a size that lies", 8, 11, 7, 0, 4, 4, 100},
      {"its data", 8, 11, 6, 0, 100, 1, 9},
      {"other flags", 8, 11, 2, kRegistryUnsupported, 4, 0, 0},
      {"a path out of the folder", 8, 15, 0, kRegistryNotFound, 4, 0, 0},
      {"an injected size failure", 8, 16, 1, 0xE00002BC, 4, 0, 0},
      {"an injected data failure", 8, 16, 0, 5, 4, 0, 0},
      {"a file", 8, 17, 0, 0, 4, 3, 'x'},
      {"an unknown selector", 8, 99, 1, kRegistryUnsupported, 4, 0, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const std::uint32_t request[6] = {c.selector, c.flags, 0, 0, 0, 0};
    std::vector<std::byte> room(c.room);
    MethodCall call{.structInput = std::as_bytes(std::span(request)), .structOutput = room};
    EXPECT_EQ(registry.ConnectionCallMethod(disk, c.method, call), c.status);
    EXPECT_EQ(call.structOutputSize, c.written);
    EXPECT_EQ(std::to_integer<std::uint8_t>(room[0]), c.first);
  }
  std::byte reply[4] = {};
  MethodCall query{.structOutput = reply};
  EXPECT_EQ(registry.ConnectionCallMethod(disk, 5, query), 0u);
  EXPECT_EQ(query.structOutputSize, 4u);
  std::byte odd[23] = {};
  MethodCall malformed{.structInput = odd, .structOutput = reply};
  EXPECT_EQ(registry.ConnectionCallMethod(disk, 8, malformed), kRegistryBadArgument);
  EXPECT_EQ(registry.ServiceCloseConnection(disk), 77u);
  EXPECT_EQ(device.openHandles(), 0u);
}

TEST(DescribedDriver, RefusesToOpenAsDescribed) {
  DescribedDevice device(kDriver);
  for (const auto& [name, expected] :
       {std::pair{"Shut", 0xE00002C2u}, std::pair{"Mute", kRegistryUnsupported}}) {
    const RegistryHandle service =
        device.registry().RegistryFindService(ServiceMatchingByClass(name));
    ConnectionHandle connection = 0;
    EXPECT_EQ(device.registry().ServiceOpenConnection(service, 0, &connection), expected) << name;
    device.registry().HandleRelease(service);
  }
  EXPECT_EQ(device.openHandles(), 0u);
}

}  // namespace
}  // namespace tally
