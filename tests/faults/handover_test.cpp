// A hand-over whose n-th call on a file fails or is the last: whatever happens then, each log
// leaves once, with its information, and under a number that no other log gets.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <map>

#include "base/files/file.h"
#include "fakes/fake_platform.h"
#include "fakes/temporary_folder.h"
#include "faults/fault.h"
#include "host/spool/log_handover.h"
#include "host/spool/waiting_logs.h"

namespace tally::faults {
namespace {

namespace fs = std::filesystem;
using Effect = Fault::Effect;

const Fault kHandoverFaults[] = {
    {"Killed", Effect::Kill, kLastCall},
    {"KilledHalfWay", Effect::KillHalfWay, kHalfWrite},
    {"PowerCut", Effect::PowerCut, kLastCall},
    {"PowerCutAfterNames", Effect::PowerCut, kLastCall, 0, 1, false, Loss::Contents},
    {"PowerCutAtRandom", Effect::PowerCut, kLastCall, 0, 1, false, Loss::AtRandom},
    {"NoSpace", Effect::Fail, kNoSpace, ENOSPC},
    {"InputOutput", Effect::Fail, kInputOutput, EIO},
    {"DeniedFromThere", Effect::Fail, kDenied, EACCES, 1, true},
};

// What happens before the next call.
struct Retry {
  const char* to;
  bool uploads;  // whatever is there has been taken away by then
};
const Retry kRetries[] = {{"/out", false}, {"/out", true}, {"/other", true}};

constexpr const char* kPseudonym = "00112233445566778899aabbccddeeff";

// Where nothing waits for a disk.
struct InMemory {
  InMemory() {
    if (::access("/dev/shm", W_OK) == 0) ::setenv("TMPDIR", "/dev/shm", 1);
  }
};

class HandoverWalk : public testing::Test, InMemory, protected TemporaryFolder {
 protected:
  // The second log's number has not been noted: its submission was killed before that.
  void prepare() {
    for (const char* name : {"device", "kept"}) fs::remove_all(at(name));
    for (const char* name : {"out", "other"}) fs::create_directories(device(name));
    for (int number : {1, 2}) {
      const std::string stem = "device" + std::string(kSubmittedLogs.path) + "/" +
                               sequencePrefix(static_cast<std::uint64_t>(number)) + "day";
      put(stem + ".log", "body " + std::to_string(number));
      putPlist(stem + ".info.plist", "<dict><key>Name</key><string>day</string>" +
                                         pseudonym("DevicePseudonym") +
                                         "<key>SequenceNumber</key><integer>" +
                                         std::to_string(number) + "</integer></dict>");
    }
    putPlist("device" + std::string(kIdentityFolder) + "/" + std::string(kIdentityFile),
             "<dict>" + pseudonym("DevicePseudonym") +
                 "<key>LastSequenceNumbers</key><dict><key>day</key><integer>1</integer></dict>"
                 "</dict>");
  }
  static std::string pseudonym(const std::string& key) {
    return "<key>" + key + "</key><string>" + kPseudonym + "</string>";
  }
  std::string device(std::string_view path) const { return at("device/" + std::string(path)); }

  // In a process of its own, which the fault ends or not.
  void take(const std::string& to, const Fault* fault = nullptr, long n = 0) const {
    faultWasMet() = false;
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
      const bool cut = fault != nullptr && fault->effect == Effect::PowerCut;
      if (cut) followDisk(device(""), at("kept"));
      if (fault != nullptr) arm(*fault, n, at("device"));
      fakes::FakeSystemLog log;
      (void)LogHandover(DeviceRoot(at("device")), log, {}, [] {
        return true;
      }).take(device(to.substr(1)), std::nullopt);
      if (cut) endWithPowerCut();
      ::_exit(0);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status)) << status;
  }

  // Each log's information must be there when it is.
  void upload(const char* from) {
    const auto logs = listSpooled(*Directory::open(device(from)));
    ASSERT_TRUE(logs);
    for (const SpooledLog& log : *logs) {
      const std::string path = device(from) + "/" + log.fileName;
      ASSERT_TRUE(log.deviceSequence) << path;
      EXPECT_EQ(*readFile(path, 100), "body " + std::to_string(*log.deviceSequence));
      ++uploaded[*log.deviceSequence];
      fs::remove(path);
      fs::remove(path.substr(0, path.size() - kBodySuffix.size()) + ".info.plist");
    }
  }

  bool tryPoint(const Fault& fault, const Retry& retry, long point) {
    SCOPED_TRACE(std::string(fault.name) + " at call " + std::to_string(point) + ", then to " +
                 retry.to + (retry.uploads ? " after an upload" : ""));
    prepare();
    uploaded.clear();
    take("/out", &fault, point);
    const bool met = faultWasMet();
    SCOPED_TRACE(describeCall());
    if (retry.uploads) upload("out");
    // What follows may be ended as well, early, where it deals with what was left.
    constexpr long kCallsOfRecovery = 13;
    take(retry.to, &kHandoverFaults[0], 1 + point % kCallsOfRecovery);
    take(retry.to);
    for (const char* folder : {"out", "other"}) {
      upload(folder);
      EXPECT_TRUE(fs::is_empty(device(folder))) << fs::directory_iterator(device(folder))->path();
    }
    EXPECT_EQ(uploaded, (std::map<std::uint64_t, int>{{1, 1}, {2, 1}}));
    const auto identity = IdentityFile(DeviceRoot(at("device"))).read();
    EXPECT_TRUE(identity && identity->device == kPseudonym && identity->next("day") == 3);
    return met;
  }

  std::map<std::uint64_t, int> uploaded;
};

TEST_F(HandoverWalk, EachLogLeavesOnce) {
  for (const Fault& fault : kHandoverFaults) {
    for (const Retry& retry : kRetries) {
      long point = 1;
      while (tryPoint(fault, retry, point) && !HasFailure()) point += FAULT_STRIDE;
      EXPECT_GT(point, fault.effect == Effect::KillHalfWay ? 5 : 20) << fault.name;
      if (HasFailure()) return;
    }
  }
}

}  // namespace
}  // namespace tally::faults
