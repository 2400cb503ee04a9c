#include "faults/fault.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

namespace tally::faults {
namespace {

const Fault* armed = nullptr;
long wanted = 0, counted = 0;
std::string watched;

// Shared with the parent, which asks what became of its child.
struct Notes {
  bool met = false;
  char call[256] = "";
};

Notes& notes() {
  static Notes* const shared = static_cast<Notes*>(
      ::mmap(nullptr, sizeof(Notes), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
  if (shared == MAP_FAILED) std::abort();
  return *shared;
}

}  // namespace

bool memoryRunsOut(const char* call) {
  return armed != nullptr && judge(call, watched, kNoMemory) == Verdict::Fail;
}

void arm(const Fault& fault, long n, const std::string& folder) {
  armed = &fault;
  forgetDirectories();
  wanted = n;
  counted = 0;
  watched = folder;
}

void endWithPowerCut() { cutPower(armed->loss, static_cast<unsigned>(wanted)); }

void disarm() { armed = nullptr; }

bool& faultWasMet() { return notes().met; }

std::string describeCall() { return notes().call; }

int faultCode() { return armed->code; }

void die() { ::_exit(kKilledStatus); }

Verdict judge(const char* call, std::string_view path, unsigned possible) {
  if (armed == nullptr || (possible & armed->possible) == 0 || !path.starts_with(watched)) {
    return Verdict::Go;
  }
  ++counted;
  if (counted < wanted || (counted > wanted && !armed->lasts)) return Verdict::Go;
  if (counted == wanted) {
    const std::string_view name = path.substr(path.rfind('/') + 1);
    std::snprintf(notes().call, sizeof notes().call, "%s %.*s", call, static_cast<int>(name.size()),
                  name.data());
    notes().met = true;
  }
  switch (armed->effect) {
    case Fault::Effect::Kill:
      die();
    case Fault::Effect::PowerCut:
      endWithPowerCut();
      die();
    case Fault::Effect::KillHalfWay:
      return Verdict::KillHalfWay;
    case Fault::Effect::WriteHalf:
      return Verdict::WriteHalf;
    case Fault::Effect::Fail:
      break;
  }
  return Verdict::Fail;
}

}  // namespace tally::faults
