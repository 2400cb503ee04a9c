// What a whitelist can reveal: bits, identifiers in keys, lone samples, and coarser options.
#include "tools/privacy/exposure_bits.h"
#include "tools/privacy/key_identifiers.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

TEST(KeyIdentifiers, AreFoundAndOrdinaryNamesAreNot) {
  const DeviceNames names{{"ada"}, "kitchen-7"};
  const struct {
    std::string_view key, found;
  } cases[] = {
      {"net.wlp3s0.bytes", "wlp3s0"},
      {"net.wlan0", "wlan0"},
      {"net/enx001122aabbcc/rx", "enx001122aabbcc"},
      {"veth12ab34c.up", "veth12ab34c"},
      {"peer.192.168.0.12.rtt", "192.168.0.12"},
      {"peer.fe80::1ff:fe23:4567:890a.rtt", "fe80::1ff:fe23:4567:890a"},
      {"bt.00:1A:7d:da:71:13", "00:1A:7d:da:71:13"},
      {"disk.8f14e45f-ceea-467f-ab2e-b1f2c3d4e5f6.age", "8f14e45f-ceea-467f-ab2e-b1f2c3d4e5f6"},
      {"disk.S3Z8NX0K.wear", "S3Z8NX0K"},
      {"imei.490154203237518", "490154203237518"},
      {"hash.d41d8cd98f00b204", "d41d8cd98f00b204"},
      {"login.Ada.count", "Ada"},
      {"host.kitchen-7", "kitchen-7"},
      {"canada.visits", ""},
      {"vellum.power.wakeups", ""},
      {"version.1.2.3", ""},
      {"cpu0.c6.residency", ""},
      {"enabled.decade2020", ""},
      {"sha256.errors", ""},
      {"ethics.wlan", ""},
      {"std::vector", ""},
      {"1.2.3.4000", ""},
      {"2024-10-04", ""},
  };
  for (const auto& c : cases) {
    const auto found = identifierIn(c.key, names);
    EXPECT_EQ(found ? found->part : "", c.found) << c.key;
  }
}

TEST(ExposureBits, GrowWithWhatIsReportedAndNeverBeyondTheSamples) {
  // Of 1,000 samples between 0 and 100, whole or not, with so many buckets.
  const SampleFacts whole{0, 100, 1000, true}, real{0, 100, 1000, false};
  EXPECT_LT(distributionBits(whole, 0), distributionBits(whole, 2));
  EXPECT_LT(distributionBits(whole, 2), distributionBits(whole, 50));
  EXPECT_LT(distributionBits(whole, 50), distributionBits(real, 50));
  // A count below 1,001, two of 101 samples, a sum up to 100,000, and squares up to 2,500,000.
  EXPECT_NEAR(distributionBits(whole, 0),
              std::log2(1001) + 2 * std::log2(101) + std::log2(100001) + std::log2(2500001), 1e-6);
  // One sample is one of 101 values, however often it is told; none and equal ones tell nothing.
  EXPECT_NEAR(distributionBits({0, 100, 1, true}, 50), 1 + std::log2(101), 1e-6);
  EXPECT_EQ(distributionBits({0, 100, 0, true}, 50), 0);
  EXPECT_NEAR(distributionBits({5, 5, 1000, true}, 50), std::log2(1001), 1e-6);
}

class PrivacyTest : public ToolTest {
 protected:
  void SetUp() override {
    putWhitelist(R"({"G": {"ScalarKeys": {"flag": {}, "big": {"sig_fig": 2}, "old": {},
                            "vellum.usage.cur_boot_session_cpu_uptime": {}},
                           "ScalarKeyPrefixes": {"net.": {}},
                           "DistributionKeys": {"w": {"intervals": [1, 2, 3, 50, 100]}, "p": {}}},
                     "Off": {"ScalarKeys": {"off": {}}}})");
    putList(kPreferences + "vellum.da.plist", R"({"Off": false})");
    putList("device/Library/Application Support/Tallybook/Metrics.plist",
            R"({"Metrics": [{"Key": "net.known", "Type": "counter"}]})");
    std::string rows =
        "scalar,net.known,20000,,5\nscalar,net.eth0.rx,20000,,0\n"
        "scalar,net.eth0.rx,20001,,1023\nscalar,off,20000,,1\nscalar,no,20000,,1\n";
    for (int day = 0; day < 40; ++day) {
      rows += fmt::format("scalar,flag,{},,{}\nscalar,big,{},,{}\n", 20000 + day, day % 2,
                          20000 + day, 100 + day * 1000);
    }
    for (const char* sample : {"0.5", "40", "41", "42", "43"}) {
      rows += fmt::format("distribution,w,20000,1,{}\ndistribution,p,20000,1,{}\n", sample, sample);
    }
    putRows(rows);
  }
};

TEST_F(PrivacyTest, EachEntryIsMeasuredOverTheStore) {
  const Outcome outcome = run({"whitelist", "check", "--privacy", "--json"});
  const auto document = outcome.json();
  const auto& privacy = document["privacy"];
  std::map<std::string, nlohmann::json> entries;
  double sum = 0, former = 1e9;
  for (const auto& entry : privacy["entries"]) {
    entries[entry["entry"]] = entry;
    sum += entry["bits"].get<double>();
    EXPECT_LE(entry["bits"], former) << "those that reveal most come first";
    former = entry["bits"];
  }
  EXPECT_NEAR(privacy["bits"], sum, 0.1);
  EXPECT_EQ(privacy["firstDay"], 20000);
  EXPECT_EQ(privacy["lastDay"], 20039);
  EXPECT_FALSE(entries.contains("off")) << "it is not in force";
  const struct {
    const char *entry, *values;
  } cases[] = {
      {"flag", R"({"/bits": 1.0, "/keys": 1, "/range/highest": 1, "/values/count": 2,
                   "/notes/0/concern": "exact_number", "/proposals": []})"},
      // 100 to 39,100: 91 outputs up to 1,000, 90 more up to 10,000, and 29 up to 39,000.
      {"big", R"({"/bits": 7.71, "/range/lowest": 100, "/range/highest": 39100,
                  "/values": {"count": 32, "more": true}, "/reported/more": true, "/notes": [],
                  "/proposals/0/options": {"sig_fig": 1}, "/proposals/0/relativeError": 0.5,
                  "/proposals/1/options": {"bucket_interval": 2000},
                  "/proposals/1/absoluteError": 1000.0})"},
      {"old", R"({"/bits": 0.0, "/keys": 0, "/range": null, "/notes": []})"},
      {"vellum.usage.cur_boot_session_cpu_uptime", R"({"/keys": 1, "/range": null})"},
      {"net.", R"({"/bits": 10.0, "/keys": 2, "/mostBits": 10.0, "/notes/1/concern":
                   "identifier_in_key", "/notes/1/count": 1, "/notes/2/concern": "unlisted_keys",
                   "/notes/2/detail": "net.eth0.rx"})"},
      {"w", R"({"/notes/0/concern": "exact_extremes", "/notes/1/concern": "lone_samples",
                "/notes/1/count": 1, "/reported/count": 1, "/values/count": 5,
                "/proposals/0/options": {}})"},
      {"p", R"({"/range/highest": 43.0, "/proposals": []})"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.entry);
    expectValues(entries[c.entry], c.values);
  }
  EXPECT_GT(entries["w"]["bits"], entries["p"]["bits"]);
  const std::string text = run({"whitelist", "check", "--privacy"}).out;
  expectParts(text, {"at most ", " bits a day, of 7 keys", "from 2024-10-04 to 2024-11-12",
                     "sig_fig 1: at most 50 % off", "eth0 (a network interface in net.eth0.rx)"});
}

}  // namespace
}  // namespace tally::tools
