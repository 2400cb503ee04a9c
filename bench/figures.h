// The rows of a benchmark in the table of docs/performance.md, beside the text that it prints.
//
//   addFigure("pass over the samples", pass, "s CPU", "reading the store", floor, atMost(1.5));
//   addFigure("tallyrun -f", whole, "s CPU", "the same in Python", script, timesLess(60));
//   addFigure("peak of tallyrun -f", peak, "MiB", atMost(28));
//
// The first two are judged by their ratio to a yardstick, which is measured in the same run and in
// the same unit; the third, without a yardstick, by the target itself. Names are unique in the
// table: scripts/bench names those that miss their target by more than a tenth, and fails.
//
// A program in another language appends the same lines to the file that BENCH_FIGURES names, fields
// separated by tabs (bench/bench_figures.py does it for Python):
//   name, value, unit, yardstick or nothing, its value or nothing, sense, target
#pragma once

#include <cstdio>
#include <cstdlib>

namespace tally::bench {

struct Target {
  const char* sense = "none";  // as in the line
  double value = 0;
};
// Of the figure divided by its yardstick, or of the figure alone, in its unit.
constexpr Target atMost(double value) { return {"at most", value}; }
constexpr Target atLeast(double value) { return {"at least", value}; }
// Of the yardstick divided by the figure: so many times less, at least.
constexpr Target timesLess(double value) { return {"times less", value}; }
// Shown, and never missed.
constexpr Target noTarget() { return {}; }

// Null unless scripts/bench runs this program. Ends it where the rows cannot be written: a target
// must not go unnoticed.
inline std::FILE* openFigures() {
  const char* const path = std::getenv("BENCH_FIGURES");
  if (path == nullptr) return nullptr;
  std::FILE* const file = std::fopen(path, "ae");
  if (file != nullptr) return file;
  std::perror(path);
  std::exit(1);
}

inline void addFigure(const char* name, double value, const char* unit, const char* yardstick,
                      double yardstickValue, Target target) {
  if (std::FILE* const file = openFigures()) {
    std::fprintf(file, "%s\t%.6g\t%s\t%s\t%.6g\t%s\t%.6g\n", name, value, unit, yardstick,
                 yardstickValue, target.sense, target.value);
    std::fclose(file);
  }
}

inline void addFigure(const char* name, double value, const char* unit, Target target) {
  if (std::FILE* const file = openFigures()) {
    std::fprintf(file, "%s\t%.6g\t%s\t\t\t%s\t%.6g\n", name, value, unit, target.sense,
                 target.value);
    std::fclose(file);
  }
}

}  // namespace tally::bench
