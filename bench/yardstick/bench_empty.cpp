// The yardstick for start-up: what any C++ program costs. The standard library is really linked.
#include <iostream>

int main(int count, char**) {
  if (count > 1) std::cout << "the empty program takes no arguments\n";
  return 0;
}
