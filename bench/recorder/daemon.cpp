#include "recorder/daemon.h"

#include <signal.h>
#include <sqlite3.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <thread>

#include "base/files/device_root.h"
#include "host/ingress/recorder_client.h"
#include "kv/plist_codec.h"
#include "platform/metrics_store.h"

namespace tally::bench {
namespace {

using namespace std::chrono_literals;

constexpr auto kPatience = 120s;

std::string tallydProgram() {
  return std::filesystem::canonical("/proc/self/exe").parent_path() / "tallyd";
}

std::string ask(const std::string& root, std::string_view request) {
  auto answer = askRecorder(DeviceRoot(root), request, kPatience);
  return answer ? *std::move(answer) : std::string();
}

}  // namespace

void giveUp(std::string_view reason) {
  std::fprintf(stderr, "%.*s\n", static_cast<int>(reason.size()), reason.data());
  std::exit(1);
}

Daemon::Daemon(std::string_view settings, int udpPort) {
  char folder[] = "/tmp/tally-recorder-XXXXXX";
  require(::mkdtemp(folder) != nullptr, "no folder in /tmp");
  root_ = folder;
  const std::string preferences = root_ + "/Library/Preferences";
  std::filesystem::create_directories(preferences);
  std::ofstream(preferences + "/tallyd.plist")
      << R"(<plist version="1.0"><dict>)" << settings << "</dict></plist>\n";
  const std::string program = tallydProgram(), address = "127.0.0.1:" + std::to_string(udpPort);
  ::setenv("TALLYRUN_ROOT", root_.c_str(), 1);
  ::setenv("TALLYRUN_LOG", "stderr", 1);
  process_ = ::fork();
  if (process_ == 0) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    const char* const option = udpPort != 0 ? "--udp" : nullptr;
    ::execl(program.c_str(), "tallyd", option, address.c_str(), nullptr);
    ::_exit(1);
  }
  for (int i = 0; i < 1000 && ask(root_, "status").empty(); ++i) std::this_thread::sleep_for(10ms);
  require(figure("commits_failed") == 0 && !ask(root_, "status").empty(), "tallyd does not start");
}

Daemon::~Daemon() {
  ::kill(process_, SIGKILL);
  ::waitpid(process_, nullptr, 0);
  std::error_code ignored;
  std::filesystem::remove_all(root_, ignored);
}

void Daemon::commit() const { require(ask(root_, "commit") == "done\n", "tallyd cannot commit"); }

std::int64_t Daemon::figure(std::string_view name) const {
  const auto status = decodePlist(ask(root_, "status"));
  require(static_cast<bool>(status), "tallyd does not say its status");
  const auto* const fields = kvCast<KvDictionary>(status->get());
  return fields != nullptr ? fields->getInt64(name).value_or(0) : 0;
}

std::int64_t Daemon::settledMetrics() const {
  std::int64_t before = -1;
  for (std::int64_t now = figure("metrics"); now != before; now = figure("metrics")) {
    before = now;
    std::this_thread::sleep_for(100ms);
  }
  return before;
}

std::int64_t Daemon::stored(std::string_view key) const {
  sqlite3* store = nullptr;
  sqlite3_stmt* query = nullptr;
  std::int64_t sum = 0;
  if (::sqlite3_open_v2((root_ + std::string(kStorePath)).c_str(), &store, SQLITE_OPEN_READWRITE,
                        nullptr) == SQLITE_OK &&
      ::sqlite3_prepare_v2(store, "SELECT sum(value) FROM scalars WHERE key = ?1", -1, &query,
                           nullptr) == SQLITE_OK) {
    ::sqlite3_bind_text64(query, 1, key.data(), key.size(), SQLITE_STATIC, SQLITE_UTF8);
    if (::sqlite3_step(query) == SQLITE_ROW) sum = ::sqlite3_column_int64(query, 0);
  }
  ::sqlite3_finalize(query);
  ::sqlite3_close(store);
  return sum;
}

}  // namespace tally::bench
