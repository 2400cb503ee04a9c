#include "host/kernel/source_table.h"

#include <algorithm>

#include "host/kernel/sources/cpu/interrupts.h"
#include "host/kernel/sources/cpu/processor_time.h"
#include "host/kernel/sources/cpu/processors.h"
#include "host/kernel/sources/memory/memory.h"
#include "host/kernel/sources/network/interfaces.h"
#include "host/kernel/sources/power/sleep.h"
#include "host/kernel/sources/power/supplies.h"
#include "host/kernel/sources/storage/disk.h"
#include "host/kernel/sources/storage/zram.h"
#include "host/kernel/sources/system/memory_errors.h"
#include "host/kernel/sources/system/pressure.h"
#include "host/kernel/sources/system/time.h"
#include "host/kernel/sources/thermal/sensors.h"
#include "host/kernel/sources/thermal/thermal.h"

namespace tally {
namespace {

constexpr SourceRow kSources[] = {
    {KernelSource::Disk, "disk", "Disks", findDisks},
    {KernelSource::Zram, "zram", "Compressed memory", findZram},
    {KernelSource::Network, "net", "Network", findInterfaces},
    {KernelSource::Pressure, "pressure", "Pressure", findPressure},
    {KernelSource::Memory, "memory", "Memory", findMemory},
    {KernelSource::Paging, "paging", "Paging", findPaging},
    {KernelSource::ProcessorTime, "cpu", "Processors", findProcessorTime},
    {KernelSource::ProcessorIdle, "cpu", "Processors", findIdleStates},
    {KernelSource::ProcessorFrequency, "cpu", "Processors", findFrequencies},
    {KernelSource::ProcessorThrottling, "cpu", "Processors", findThrottling},
    {KernelSource::Interrupts, "irq", "Interrupts", findInterrupts},
    {KernelSource::SoftInterrupts, "softirq", "Soft interrupts", findSoftInterrupts},
    {KernelSource::ThermalZone, "thermal", "Thermal zones", findThermalZones},
    {KernelSource::Cooling, "cooling", "Cooling", findCoolingDevices},
    {KernelSource::Sensor, "hwmon", "Sensors", findSensors},
    {KernelSource::PowerSupply, "power", "Power supplies", findPowerSupplies},
    {KernelSource::WakeupSource, "wakeup", "Wakeup sources", findWakeupSources},
    {KernelSource::Suspend, "suspend", "Sleep", findSuspend},
    {KernelSource::MemoryErrors, "edac", "Memory errors", findMemoryErrors},
    {KernelSource::Time, "time", "Time", findTime},
};

}  // namespace

std::span<const SourceRow> sourceTable() { return kSources; }

const SourceRow& sourceRow(KernelSource source) {
  return *std::ranges::find(kSources, source, &SourceRow::source);
}

}  // namespace tally
