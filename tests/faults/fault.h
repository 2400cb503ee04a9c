// One fault in one run: which call on a file below a folder fails, or is the last of the run.
//
// The calls are those of the program's own objects, which the linker leads here first
// (file_calls.cpp), and SQLite's, which is given functions to call (store_calls.cpp); its
// allocations, and those of SQLite, are the test's (memory_calls.cpp). So the program is tested as
// it is, without hooks of its own, and no call escapes.
#pragma once

#include <string>
#include <string_view>

#include "faults/disk.h"

namespace tally::faults {

// What can become of a call, one bit each.
constexpr unsigned kNoSpace = 1, kInputOutput = 2, kDenied = 4, kInterrupted = 8;
constexpr unsigned kLastCall = 16;    // it changes something, so the run may end before it
constexpr unsigned kHalfWrite = 32;   // only half of its bytes may get there before the run ends
constexpr unsigned kShortWrite = 64;  // it may write half of its bytes and return so
constexpr unsigned kNoMemory = 128;   // it allocates memory

struct Fault {
  enum class Effect { Fail, Kill, KillHalfWay, WriteHalf, PowerCut };
  const char* name;
  Effect effect;
  unsigned possible;             // only calls with one of these bits count
  int code = 0;                  // with which errno a call fails
  long stride = 1;               // between the calls that are tried
  bool lasts = false;            // whether later calls fail as well
  Loss loss = Loss::Everything;  // of a power cut
  // The run must not notice it.
  bool isHarmless() const { return possible == kInterrupted || effect == Effect::WriteHalf; }
};

// The exit status of a process that a fault has ended.
constexpr int kKilledStatus = 86;

// From here on the n-th call below the folder meets the fault. REQUIRES: a process of its own, with
// one thread and no open file there.
void arm(const Fault& fault, long n, const std::string& folder);
void disarm();
// Cuts the power at the end of a run that has not met the fault.
void endWithPowerCut();
// Forgets which directories were entered before.
void forgetDirectories();
// Of this process, or of the last child that was forked after this was first asked.
bool& faultWasMet();
std::string describeCall();

enum class Verdict { Go, Fail, WriteHalf, KillHalfWay };
// Asked at each call; does not return when the run ends before it.
Verdict judge(const char* call, std::string_view path, unsigned possible);
// Asked at each allocation.
bool memoryRunsOut(const char* call);
// For a half write that is the run's last call.
[[noreturn]] void die();
// errno of the armed fault.
int faultCode();

// Stops the wall clock of the program at this time.
void setClock(double secondsSince1970);

// Makes SQLite's calls subject to faults as well.
void watchStore();
// Of an open file; empty when it was not opened here.
const std::string& pathOf(int descriptor);

}  // namespace tally::faults
