#include "process_cost.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>

namespace tally::bench {
namespace {

double seconds(const timeval& time) {
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) * 1e-6;
}

std::vector<char*> pointers(std::vector<std::string>& strings) {
  std::vector<char*> result;
  result.reserve(strings.size() + 1);
  for (std::string& string : strings) result.push_back(string.data());
  result.push_back(nullptr);
  return result;
}

}  // namespace

ProcessCost runProcess(const std::vector<std::string>& command,
                       const std::vector<std::string>& environment) {
  std::vector<std::string> arguments = command;
  std::vector<std::string> variables = environment;
  for (char** entry = environ; *entry != nullptr; ++entry) variables.emplace_back(*entry);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 2, "/dev/null", O_WRONLY, 0);
  ProcessCost cost;
  const auto start = std::chrono::steady_clock::now();
  pid_t child = 0;
  if (posix_spawnp(&child, arguments[0].c_str(), &actions, nullptr, pointers(arguments).data(),
                   pointers(variables).data()) == 0) {
    int status = 0;
    rusage usage{};
    ::wait4(child, &status, 0, &usage);
    cost.wallSeconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    cost.cpuSeconds = seconds(usage.ru_utime) + seconds(usage.ru_stime);
    cost.peakKibibytes = usage.ru_maxrss;
    if (WIFEXITED(status)) cost.exitStatus = WEXITSTATUS(status);
  }
  posix_spawn_file_actions_destroy(&actions);
  return cost;
}

ProcessCost medianRun(int runs, const std::vector<std::string>& command,
                      const std::vector<std::string>& environment) {
  runProcess(command, environment);
  std::vector<ProcessCost> costs;
  costs.reserve(static_cast<std::size_t>(runs));
  for (int i = 0; i < runs; ++i) costs.push_back(runProcess(command, environment));
  const auto middle = costs.begin() + runs / 2;
  std::nth_element(costs.begin(), middle, costs.end(),
                   [](const auto& a, const auto& b) { return a.wallSeconds < b.wallSeconds; });
  return *middle;
}

}  // namespace tally::bench
