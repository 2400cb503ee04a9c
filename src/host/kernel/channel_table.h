// The statistics channels of the kernel: the one table from which legends, the sweep, the recorder,
// `tallyctl channels list --verbose` and the table of docs/linux.md are made.
#pragma once

#include <algorithm>
#include <iterator>
#include <span>
#include <string_view>

#include "host/kernel/channel_row.h"

namespace tally {

namespace channel_table {

using enum KernelSource;
using namespace unit;
constexpr auto kSimple = ChannelFormat::Simple;
constexpr auto kState = ChannelFormat::State;
constexpr auto kArray = ChannelFormat::Array;
constexpr auto kCounter = Semantics::Counter;
constexpr auto kGauge = Semantics::Gauge;
constexpr auto kStates = Semantics::State;
constexpr auto kUnsteady = Semantics::UnsteadyCounter;
constexpr auto kBoot = CounterScope::Boot;
constexpr auto kCreation = CounterScope::Creation;
constexpr auto kLifetime = CounterScope::Lifetime;

// The rows of a source are next to each other. Of a file with several values they are in the order
// of its fields.
// clang-format off
constexpr ChannelRow kRows[] = {
{Disk, "reads", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "disk#.reads", "reads that were completed"},
{Disk, "merged-reads", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "", "reads that were merged with others"},
{Disk, "read", kKibibytes, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "disk#.read", "data that was read"},
{Disk, "read-time", kMilliseconds, kSimple, kCounter, kCreation, 32, "/sys/block/*/stat", "", "time that reads took, added up"},
{Disk, "writes", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "disk#.writes", "writes that were completed"},
{Disk, "merged-writes", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "", "writes that were merged with others"},
{Disk, "written", kKibibytes, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "disk#.written", "data that was written"},
{Disk, "write-time", kMilliseconds, kSimple, kCounter, kCreation, 32, "/sys/block/*/stat", "", "time that writes took, added up"},
{Disk, "in-flight", kNone, kSimple, kGauge, kCreation, 0, "/sys/block/*/stat", "", "operations under way"},
{Disk, "busy", kMilliseconds, kSimple, kCounter, kCreation, 32, "/sys/block/*/stat", "disk#.busy", "time with an operation under way"},
{Disk, "queue-time", kMilliseconds, kSimple, kCounter, kCreation, 32, "/sys/block/*/stat", "", "time that operations took, added up"},
{Disk, "discards", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "", "discards that were completed"},
{Disk, "merged-discards", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "", "discards that were merged with others"},
{Disk, "discarded", kKibibytes, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "disk#.discarded", "data that was discarded"},
{Disk, "discard-time", kMilliseconds, kSimple, kCounter, kCreation, 32, "/sys/block/*/stat", "", "time that discards took, added up"},
{Disk, "flushes", kEvents, kSimple, kCounter, kCreation, 64, "/sys/block/*/stat", "disk#.flushes", "flushes of the write cache"},
{Disk, "flush-time", kMilliseconds, kSimple, kCounter, kCreation, 32, "/sys/block/*/stat", "", "time that flushes took, added up"},

{Zram, "stored", kBytes, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "zram.stored", "data in the disk, as it was written"},
{Zram, "compressed", kBytes, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "zram.compressed", "the same data compressed"},
{Zram, "memory", kBytes, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "zram.memory", "memory that the disk takes"},
{Zram, "limit", kBytes, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "", "memory that the disk may take; 0: no limit"},
{Zram, "most-memory", kBytes, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "", "most memory that the disk took"},
{Zram, "same-pages", kNone, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "", "pages of one repeated value, which take no memory"},
{Zram, "compacted-pages", kNone, kSimple, kCounter, kCreation, 64, "/sys/block/zram*/mm_stat", "", "pages that compaction freed"},
{Zram, "huge-pages", kNone, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/mm_stat", "", "pages that cannot be compressed"},
{Zram, "huge-pages-ever", kNone, kSimple, kCounter, kCreation, 64, "/sys/block/zram*/mm_stat", "", "pages that could not be compressed since the disk was set up"},
{Zram, "written-back", kFourKibibytes, kSimple, kGauge, kCreation, 0, "/sys/block/zram*/bd_stat", "", "data that is on its backing device"},
{Zram, "read-back", kFourKibibytes, kSimple, kCounter, kCreation, 64, "/sys/block/zram*/bd_stat", "", "data that was read from its backing device"},
{Zram, "write-back", kFourKibibytes, kSimple, kCounter, kCreation, 64, "/sys/block/zram*/bd_stat", "zram.write-back", "data that was written to its backing device"},

{Network, "received", kBytes, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "net#.received", "data that was received"},
{Network, "received-packets", kPackets, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "packets that were received"},
{Network, "receive-errors", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "net#.errors", "faulty packets that were received"},
{Network, "receive-drops", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "net#.drops", "received packets that were dropped"},
{Network, "receive-overruns", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "received packets that the device had no room for"},
{Network, "receive-frame-errors", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "received packets with a faulty frame"},
{Network, "received-compressed", kPackets, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "compressed packets that were received"},
{Network, "received-multicast", kPackets, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "multicast packets that were received"},
{Network, "sent", kBytes, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "net#.sent", "data that was sent"},
{Network, "sent-packets", kPackets, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "packets that were sent"},
{Network, "send-errors", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "net#.errors", "packets that could not be sent"},
{Network, "send-drops", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "net#.drops", "packets that were dropped instead of sent"},
{Network, "send-overruns", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "packets that the device had no room for"},
{Network, "collisions", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "collisions on the medium"},
{Network, "carrier-losses", kEvents, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "losses of the carrier while sending"},
{Network, "sent-compressed", kPackets, kSimple, kCounter, kCreation, 64, "/proc/net/dev", "", "compressed packets that were sent"},

{Pressure, "cpu.some", kMicroseconds, kSimple, kCounter, kBoot, 64, "/proc/pressure/cpu", "pressure.cpu.some", "time in which a task waited for a processor"},
{Pressure, "memory.some", kMicroseconds, kSimple, kCounter, kBoot, 64, "/proc/pressure/memory", "pressure.memory.some", "time in which a task waited for memory"},
{Pressure, "memory.full", kMicroseconds, kSimple, kCounter, kBoot, 64, "/proc/pressure/memory", "pressure.memory.full", "time in which every task waited for memory"},
{Pressure, "io.some", kMicroseconds, kSimple, kCounter, kBoot, 64, "/proc/pressure/io", "pressure.io.some", "time in which a task waited for storage"},
{Pressure, "io.full", kMicroseconds, kSimple, kCounter, kBoot, 64, "/proc/pressure/io", "pressure.io.full", "time in which every task waited for storage"},
{Pressure, "irq.full", kMicroseconds, kSimple, kCounter, kBoot, 64, "/proc/pressure/irq", "pressure.irq.full", "time in which every task waited for interrupts"},

{Memory, "total", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "", "memory that the kernel manages"},
{Memory, "available", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "memory.available", "memory that programs can get without swapping"},
{Memory, "free", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "", "memory that nothing is in"},
{Memory, "cached", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "", "copies of files"},
{Memory, "anonymous", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "memory.anonymous", "what programs have allocated"},
{Memory, "shared", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "", "shared memory and the files of tmpfs"},
{Memory, "swap-total", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "", "swap space"},
{Memory, "swap-free", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "memory.swap-free", "swap space that is free"},
{Memory, "slab", kKibibytes, kSimple, kGauge, kBoot, 0, "/proc/meminfo", "", "objects of the kernel"},

{Paging, "read", kKibibytes, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "", "data that was read from storage"},
{Paging, "written", kKibibytes, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "", "data that was written to storage"},
{Paging, "swap-ins", kNone, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "paging.swap-ins", "pages that were swapped in"},
{Paging, "swap-outs", kNone, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "paging.swap-outs", "pages that were swapped out"},
{Paging, "faults", kEvents, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "", "page faults"},
{Paging, "major-faults", kEvents, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "paging.major-faults", "page faults that waited for storage"},
{Paging, "out-of-memory-kills", kEvents, kSimple, kCounter, kBoot, 64, "/proc/vmstat", "paging.out-of-memory-kills", "processes that were killed for want of memory"},

{ProcessorTime, "user", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.user", "time in programs"},
{ProcessorTime, "nice", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.nice", "time in programs of low priority"},
{ProcessorTime, "system", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.system", "time in the kernel"},
{ProcessorTime, "idle", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.idle", "time with nothing to do"},
{ProcessorTime, "iowait", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.iowait", "idle time in which a task waited for storage"},
{ProcessorTime, "irq", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.irq", "time in interrupts"},
{ProcessorTime, "softirq", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.irq", "time in soft interrupts"},
{ProcessorTime, "steal", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "", "time in which the hypervisor ran something else"},
{ProcessorTime, "guest", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "", "time in guests, which is also in user"},
{ProcessorTime, "guest-nice", kMilliseconds, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "", "time in guests of low priority, which is also in nice"},
{ProcessorTime, "context-switches", kEvents, kSimple, kCounter, kBoot, 64, "/proc/stat", "cpu.context-switches", "switches from one task to another"},
{ProcessorTime, "forks", kEvents, kSimple, kCounter, kBoot, 64, "/proc/stat", "cpu.forks", "processes and threads that were started"},
{ProcessorTime, "interrupts", kEvents, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "cpu.interrupts", "interrupts of all lines"},
{ProcessorTime, "soft-interrupts", kEvents, kSimple, kUnsteady, kBoot, 64, "/proc/stat", "", "soft interrupts of all kinds"},
{ProcessorTime, "soft-interrupts-by-kind", kEvents, kArray, kUnsteady, kBoot, 64, "/proc/stat", "", "soft interrupts: HI, TIMER, NET_TX, NET_RX, BLOCK, IRQ_POLL, TASKLET, SCHED, HRTIMER, RCU"},
{ProcessorTime, "running", kNone, kSimple, kGauge, kBoot, 0, "/proc/stat", "", "tasks that run or could"},
{ProcessorTime, "blocked", kNone, kSimple, kGauge, kBoot, 0, "/proc/stat", "", "tasks that wait for storage"},

{ProcessorTimes, "times", kMilliseconds, kArray, kUnsteady, kBoot, 64, "/proc/stat", "", "time of one processor: user, nice, system, idle, iowait, irq, softirq, steal, guest, guest-nice"},

{ProcessorIdle, "idle", kMicroseconds, kState, kStates, kBoot, 64, "/sys/devices/system/cpu/*/cpuidle", "", "time in each idle state"},

{ProcessorFrequency, "frequencies", kMilliseconds, kState, kStates, kBoot, 64, "/sys/devices/system/cpu/*/cpufreq/stats/time_in_state", "", "time at each frequency, in kHz; of all processors that share the clock"},
{ProcessorFrequency, "frequency", kKilohertz, kSimple, kGauge, kBoot, 0, "/sys/devices/system/cpu/*/cpufreq/scaling_cur_freq", "", "frequency now"},
{ProcessorFrequency, "frequency-changes", kEvents, kSimple, kCounter, kBoot, 32, "/sys/devices/system/cpu/*/cpufreq/stats/total_trans", "cpu.frequency-changes", "changes of the frequency"},

{ProcessorThrottling, "throttles", kEvents, kSimple, kCounter, kBoot, 64, "/sys/devices/system/cpu/*/thermal_throttle/core_throttle_count", "cpu.throttles", "times that heat slowed the core down"},
{ProcessorThrottling, "throttled", kMilliseconds, kSimple, kCounter, kBoot, 64, "/sys/devices/system/cpu/*/thermal_throttle/core_throttle_total_time_ms", "cpu.throttled", "time for which heat slowed the core down"},
{ProcessorThrottling, "package-throttles", kEvents, kSimple, kCounter, kBoot, 64, "/sys/devices/system/cpu/*/thermal_throttle/package_throttle_count", "", "times that heat slowed the package down"},
{ProcessorThrottling, "package-throttled", kMilliseconds, kSimple, kCounter, kBoot, 64, "/sys/devices/system/cpu/*/thermal_throttle/package_throttle_total_time_ms", "", "time for which heat slowed the package down"},

{Interrupts, "", kEvents, kArray, kCounter, kBoot, 32, "/proc/interrupts", "", "interrupts of one line by processor"},

{SoftInterrupts, "", kEvents, kArray, kCounter, kBoot, 32, "/proc/softirqs", "", "soft interrupts of one kind by processor"},

{ThermalZone, "temperature", kMillidegrees, kSimple, kGauge, kBoot, 0, "/sys/class/thermal/thermal_zone*/temp", "thermal#.temperature", "temperature"},

{Cooling, "state", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/thermal/cooling_device*/cur_state", "", "how much it cools, from 0 to its last state"},
{Cooling, "last-state", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/thermal/cooling_device*/max_state", "", "the most that it can cool"},
{Cooling, "changes", kEvents, kSimple, kCounter, kCreation, 32, "/sys/class/thermal/cooling_device*/stats/total_trans", "cooling.changes", "changes of the state"},
{Cooling, "states", kMilliseconds, kState, kStates, kCreation, 64, "/sys/class/thermal/cooling_device*/stats/time_in_state_ms", "", "time in each state"},

{Sensor, "", kMillidegrees, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/temp*_input", "sensor#.temperature", "temperature"},
{Sensor, "", kNone, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/fan*_input", "fan#.speed", "revolutions per minute"},
{Sensor, "", kMillivolts, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/in*_input", "", "voltage"},
{Sensor, "", kMilliamperes, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/curr*_input", "", "current"},
{Sensor, "", kMicrowatts, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/power*_input", "", "power"},
{Sensor, "", kMicrojoules, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/energy*_input", "", "energy that was used"},
{Sensor, "", kHertz, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/freq*_input", "", "frequency"},
{Sensor, "", kNone, kSimple, kGauge, kBoot, 0, "/sys/class/hwmon/hwmon*/humidity*_input", "", "relative humidity, in thousandths of a percent"},

{PowerSupply, "health", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/*_full", "battery#.health", "capacity as a percentage of what it was designed for"},
{PowerSupply, "charge-level", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/capacity", "battery#.level", "charge as a percentage of the capacity"},
{PowerSupply, "cycles", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/cycle_count", "battery#.cycles", "charging cycles in the life of the battery"},
{PowerSupply, "energy", kMicrojoules, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/energy_now", "", "energy in the battery"},
{PowerSupply, "energy-full", kMicrojoules, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/energy_full", "", "capacity"},
{PowerSupply, "energy-design", kMicrojoules, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/energy_full_design", "", "capacity that it was designed for"},
{PowerSupply, "charge", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/charge_now", "", "charge in the battery, in microampere hours"},
{PowerSupply, "charge-full", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/charge_full", "", "capacity, in microampere hours"},
{PowerSupply, "charge-design", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/charge_full_design", "", "capacity that it was designed for, in microampere hours"},
{PowerSupply, "voltage", kMicrovolts, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/voltage_now", "", "voltage"},
{PowerSupply, "current", kMicroamperes, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/current_now", "", "current"},
{PowerSupply, "power", kMicrowatts, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/power_now", "", "power"},
{PowerSupply, "temperature", kMillidegrees, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/temp", "battery#.temperature", "temperature of the battery"},
{PowerSupply, "online", kNone, kSimple, kGauge, kCreation, 0, "/sys/class/power_supply/*/online", "", "1: it gives power"},

{WakeupSource, "activations", kEvents, kSimple, kCounter, kCreation, 64, "/sys/class/wakeup/wakeup*/active_count", "wakeup.activations", "times that it became active"},
{WakeupSource, "events", kEvents, kSimple, kCounter, kCreation, 64, "/sys/class/wakeup/wakeup*/event_count", "", "events that it signalled"},
{WakeupSource, "wakeups", kEvents, kSimple, kCounter, kCreation, 64, "/sys/class/wakeup/wakeup*/wakeup_count", "wakeup.%.wakeups", "times that it may have ended or prevented a sleep"},
{WakeupSource, "active", kMilliseconds, kSimple, kCounter, kCreation, 64, "/sys/class/wakeup/wakeup*/total_time_ms", "wakeup.active", "time for which it was active"},

{Suspend, "sleeps", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/success", "suspend.sleeps", "times that the machine went to sleep"},
{Suspend, "failures", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/fail", "suspend.failures", "attempts to sleep that failed"},
{Suspend, "hardware-sleep", kMicroseconds, kSimple, kCounter, kBoot, 64, "/sys/power/suspend_stats/total_hw_sleep", "suspend.hardware-sleep", "time in the deepest sleep of the hardware"},
{Suspend, "failures-freezing", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_freeze", "", "attempts that failed while tasks were frozen"},
{Suspend, "failures-preparing", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_prepare", "", "attempts that failed while devices were prepared"},
{Suspend, "failures-suspending", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_suspend", "", "attempts that failed while devices were suspended"},
{Suspend, "failures-suspending-late", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_suspend_late", "", "attempts that failed in the late phase of it"},
{Suspend, "failures-suspending-noirq", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_suspend_noirq", "", "attempts that failed in the phase without interrupts"},
{Suspend, "failures-resuming", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_resume", "", "devices that failed to resume"},
{Suspend, "failures-resuming-early", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_resume_early", "", "devices that failed to resume in the early phase"},
{Suspend, "failures-resuming-noirq", kEvents, kSimple, kCounter, kBoot, 32, "/sys/power/suspend_stats/failed_resume_noirq", "", "devices that failed to resume in the phase without interrupts"},

{MemoryErrors, "corrected", kEvents, kSimple, kCounter, kBoot, 32, "/sys/devices/system/edac/mc/mc*/ce_count", "memory-errors.corrected", "errors that were corrected"},
{MemoryErrors, "uncorrected", kEvents, kSimple, kCounter, kBoot, 32, "/sys/devices/system/edac/mc/mc*/ue_count", "memory-errors.uncorrected", "errors that could not be corrected"},
{MemoryErrors, "corrected-elsewhere", kEvents, kSimple, kCounter, kBoot, 32, "/sys/devices/system/edac/mc/mc*/ce_noinfo_count", "", "errors that were corrected, of which no place is known"},
{MemoryErrors, "uncorrected-elsewhere", kEvents, kSimple, kCounter, kBoot, 32, "/sys/devices/system/edac/mc/mc*/ue_noinfo_count", "", "errors that could not be corrected, of which no place is known"},

{Time, "uptime", kMilliseconds, kSimple, kCounter, kBoot, 64, "/proc/uptime", "day.uptime", "time since the machine was started"},
{Time, "span", kSeconds, kSimple, kUnsteady, kLifetime, 64, "clock", "day.span", "the wall clock; its amount is the time over which the amounts of the day were counted"},
};
// clang-format on

}  // namespace channel_table

constexpr std::span<const ChannelRow> kChannelTable = channel_table::kRows;

constexpr std::span<const ChannelRow> rowsOf(KernelSource source) {
  const auto first = std::ranges::find(kChannelTable, source, &ChannelRow::source);
  const auto last = std::find_if(first, kChannelTable.end(),
                                 [&](const ChannelRow& row) { return row.source != source; });
  return {first, last};
}

}  // namespace tally
