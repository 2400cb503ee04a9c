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
    {KernelSource::Disk, "disk", "Disks", "DISK", findDisks},
    {KernelSource::Zram, "zram", "Compressed memory", "DISK", findZram},
    {KernelSource::Network, "net", "Network", "INTERFACE", findInterfaces},
    {KernelSource::Pressure, "pressure", "Pressure", "", findPressure},
    {KernelSource::Memory, "memory", "Memory", "", findMemory},
    {KernelSource::Paging, "paging", "Paging", "", findPaging},
    {KernelSource::ProcessorTime, "cpu", "Processors", "", findProcessorTime},
    {KernelSource::ProcessorTimes, "cpu", "Processors", "CPU", nullptr},
    {KernelSource::ProcessorIdle, "cpu", "Processors", "CPU", findIdleStates},
    {KernelSource::ProcessorFrequency, "cpu", "Processors", "CPU", findFrequencies},
    {KernelSource::ProcessorThrottling, "cpu", "Processors", "CPU", findThrottling},
    {KernelSource::Interrupts, "irq", "Interrupts", "LINE", findInterrupts},
    {KernelSource::SoftInterrupts, "softirq", "Soft interrupts", "KIND", findSoftInterrupts},
    {KernelSource::ThermalZone, "thermal", "Thermal zones", "ZONE", findThermalZones},
    {KernelSource::Cooling, "cooling", "Cooling", "DEVICE", findCoolingDevices},
    {KernelSource::Sensor, "hwmon", "Sensors", "CHIP.SENSOR", findSensors},
    {KernelSource::PowerSupply, "power", "Power supplies", "SUPPLY", findPowerSupplies},
    {KernelSource::WakeupSource, "wakeup", "Wakeup sources", "SOURCE", findWakeupSources},
    {KernelSource::Suspend, "suspend", "Sleep", "", findSuspend},
    {KernelSource::MemoryErrors, "edac", "Memory errors", "CONTROLLER", findMemoryErrors},
    {KernelSource::Time, "time", "Time", "", findTime},
};

}  // namespace

std::span<const SourceRow> sourceTable() { return kSources; }

const SourceRow& sourceRow(KernelSource source) {
  return *std::ranges::find(kSources, source, &SourceRow::source);
}

}  // namespace tally
