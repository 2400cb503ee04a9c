// The yardstick for the day module: the program if every run were linked with all that a day needs.
#include "base/process.h"
#include "day_module.h"

int main(int count, char** arguments) {
  tally::surviveFailedWrites();
  return tallyrunRunDay(count, arguments);
}
