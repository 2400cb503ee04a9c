// One fault in one run: which call of those below a folder fails, or is the run's last.
//
// The calls are those of the program's own objects, which the linker leads here first
// (file_calls.cpp), and SQLite's, which is given functions to call (store_calls.cpp); its
// allocations, and those of SQLite, are the test's (memory_calls.cpp). So the program is tested as
// it is: it has no seam for this, and no call can be made around it.
#pragma once

#include <string>
#include <string_view>

#include "faults/disk.h"

namespace tally::faults {

// What can become of a call, one bit each.
constexpr unsigned kNoSpace = 1, kInputOutput = 2, kDenied = 4, kInterrupted = 8;
constexpr unsigned kLastCall = 16;   // it changes something, so it matters whether it is still made
constexpr unsigned kHalfWrite = 32;  // only half of its bytes may get there before the run ends
constexpr unsigned kShortWrite = 64;  // it may take half of its bytes and say so
constexpr unsigned kNoMemory = 128;   // it is no call on a file, but asks for memory

struct Fault {
  enum class Effect { Fail, Kill, KillHalfWay, WriteHalf, PowerCut };
  const char* name;
  Effect effect;
  unsigned possible;             // where: the calls of which this is true are counted
  int code = 0;                  // with which errno a call fails
  long stride = 1;               // from one call that meets it to the next
  bool lasts = false;            // whether the calls after it fail like it
  Loss loss = Loss::Everything;  // of a power cut
  // The run must not so much as notice.
  bool isHarmless() const { return possible == kInterrupted || effect == Effect::WriteHalf; }
};

// How a process ends whose last call that was.
constexpr int kKilledStatus = 86;

// From here on the n-th call on what lies below the folder meets the fault. REQUIRES: a process of
// its own, with one thread, that has nothing open there.
void arm(const Fault& fault, long n, const std::string& folder);
void disarm();
// The power cut that the run has not met so far.
void endWithPowerCut();
// Directories that were entered before count as new.
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

// The wall clock of the program, which stands still.
void setClock(double secondsSince1970);

// Makes SQLite's calls ask as well.
void watchStore();
// Of an open file; empty when it was not opened here.
const std::string& pathOf(int descriptor);

}  // namespace tally::faults
