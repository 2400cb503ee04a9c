// Every fuzz target on its seeds and regressions, without a fuzzer: fuzz_replay FOLDER, where
// corpus/ and regressions/ are. Names each input before it runs, so the last one named is the one
// at fault.
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "fuzz.h"

// The build lists the targets in FUZZ_TARGETS and gives each entry point the name of its file.
#define TARGET(name) extern "C" int fuzz_##name(const std::uint8_t* data, std::size_t size);
FUZZ_TARGETS
#undef TARGET

int main(int count, char** arguments) {
  namespace fs = std::filesystem;
  constexpr struct {
    const char* name;
    int (*run)(const std::uint8_t*, std::size_t);
  } kTargets[] = {
#define TARGET(name) {#name, fuzz_##name},
      FUZZ_TARGETS
#undef TARGET
  };
  std::FILE* const said = ::fdopen(::dup(STDERR_FILENO), "w");
  stdout = stderr = std::fopen("/dev/null", "w");  // what the code under test prints
  if (count != 2 || said == nullptr || stdout == nullptr) return 2;
  std::setbuf(said, nullptr);
  for (const auto& target : kTargets) {
    std::size_t inputs = 0;
    for (const char* const kind : {"corpus", "regressions"}) {
      const fs::path folder = fs::path(arguments[1]) / kind / target.name;
      if (!fs::exists(folder)) continue;
      for (const auto& file : fs::directory_iterator(folder)) {
        std::fprintf(said, "%s\n", file.path().c_str());
        std::ifstream stream(file.path(), std::ios::binary);
        const std::vector<char> bytes(std::istreambuf_iterator<char>(stream), {});
        target.run(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
        ++inputs;
      }
    }
    tally::fuzz::require(inputs != 0, target.name);  // a target without an input tests nothing
  }
  return 0;
}
