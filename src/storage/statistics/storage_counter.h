// What is known of a counter that storage drivers export.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "storage/statistics/figure_group.h"

namespace tally {

// Elements first to last of an array, whose report names are numbered from firstReport on. Without
// a last one it is a single element, and its report name has no number.
struct ReportedElements {
  int first = -1;  // below 0: all elements, each with its own number
  int last = -1;
  int firstReport = first;
};

struct StorageCounter {
  std::uint16_t statistic;           // its key in the driver's buffer
  const char* name;                  // followed by a number for each element of an array
  std::uint16_t elements;            // of an array, further ones are ignored; 1: not an array
  FigureGroup group;                 // in which it is shown
  const char* reportName = nullptr;  // null: the same as `name`
  ReportedElements reported = {};

  constexpr bool isReported() const { return group != FigureGroup::NotReported; }
  constexpr std::string_view reportText() const {
    return reportName != nullptr ? reportName : name;
  }
  constexpr unsigned firstElement() const {
    return reported.first < 0 ? 0 : static_cast<unsigned>(reported.first);
  }
  // How many elements are reported; each of them is a row of the key map.
  constexpr unsigned reportCount() const {
    if (!isReported()) return 0;
    if (reported.first < 0) return elements;
    return reported.last < 0 ? 1 : static_cast<unsigned>(reported.last - reported.first + 1);
  }
  constexpr bool hasReportNumber() const {
    return reported.first < 0 ? elements > 1 : reported.last >= 0;
  }
  constexpr unsigned firstReportNumber() const {
    return reported.first < 0 ? 0 : static_cast<unsigned>(reported.firstReport);
  }
};

}  // namespace tally
