// What tallyrun loads for a run that has something to do.
#pragma once

// The whole run with the program's arguments; its exit status.
extern "C" int tallyrunRunDay(int count, char** arguments);

inline constexpr char kDayModule[] = "tallyrun-day.so", kDayFunction[] = "tallyrunRunDay";
