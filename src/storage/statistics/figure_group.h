// The groups in which people read the storage figures.
#pragma once

#include <array>
#include <cstdint>
#include <string_view>

namespace tally {

enum class FigureGroup : std::uint8_t {
  Unassigned,  // a row of the counter table that names no group; does not compile
  Device,
  Space,
  Wear,
  Traffic,
  Errors,
  Recovery,
  Collection,
  Memory,
  Cache,
  Bands,
  Maintenance,
  Other,
  NotReported,  // the driver exports it, but no report contains it
};

struct FigureGroupTitle {
  FigureGroup group;
  std::string_view title;
};

// In the order in which the groups are shown.
inline constexpr auto kFigureGroups = std::to_array<FigureGroupTitle>({
    {FigureGroup::Device, "Device"},
    {FigureGroup::Space, "Space"},
    {FigureGroup::Wear, "Wear"},
    {FigureGroup::Traffic, "Traffic"},
    {FigureGroup::Errors, "Errors"},
    {FigureGroup::Recovery, "Reconstruction"},
    {FigureGroup::Collection, "Garbage collection and refresh"},
    {FigureGroup::Memory, "Memory pressure"},
    {FigureGroup::Cache, "Write cache and indirection"},
    {FigureGroup::Bands, "Bands"},
    {FigureGroup::Maintenance, "Maintenance and boot"},
    {FigureGroup::Other, "Other"},
});

}  // namespace tally
