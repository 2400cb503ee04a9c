#!/usr/bin/env python3
"""Writes a plausible day of a wrist device as CSV for `tallyctl store import`.

make-day.py DAY [SEED]: more than 200 scalar keys and 30 distributions for that day (days since
1970-01-01). The same day and seed give the same rows.
"""
import csv
import math
import random
import sys

# Scalars: a component, its metrics, and how large each is on an ordinary day.
SCALARS = {
    "vellum.power": {"charge_sessions": 2, "screen_on_minutes": 96, "low_power_minutes": 0,
                     "wakeups": 4200, "deep_sleep_minutes": 910, "battery_cycles": 212,
                     "full_charges": 1, "thermal_throttles": 0, "brownouts": 0},
    "vellum.display": {"raise_to_wake": 148, "taps": 930, "always_on_minutes": 720,
                       "brightness_changes": 61, "burn_in_shifts": 24},
    "vellum.radio.wifi": {"rx_bytes": 48_731_904, "tx_bytes": 9_114_222, "associations": 7,
                          "roams": 3, "beacon_losses": 11, "scan_count": 88},
    "vellum.radio.bluetooth": {"connections": 19, "disconnects": 18, "retransmits": 2310,
                               "bytes_to_phone": 12_400_112, "bytes_from_phone": 20_118_450,
                               "pairing_failures": 0},
    "vellum.radio.cell": {"attach_count": 4, "calls": 1, "rx_bytes": 733_002, "tx_bytes": 91_244,
                          "out_of_service_minutes": 34},
    "vellum.gnss": {"sessions": 2, "fix_failures": 1, "time_to_first_fix_total": 41,
                    "assisted_fixes": 2},
    "vellum.health": {"heart_rate_samples": 8640, "irregular_notices": 0, "stand_hours": 11,
                      "workouts": 1, "workout_minutes": 47, "fall_alerts": 0,
                      "oxygen_measurements": 22, "sensor_resets": 1},
    "vellum.notifications": {"delivered": 137, "dismissed": 101, "acted_on": 9, "muted": 22,
                             "haptics_played": 164},
    "vellum.watchdog": {"app_hangs": 1, "daemon_restarts": 2, "kernel_panics": 0,
                        "stackshots": 1, "jetsam_kills": 14},
    "vellum.storage": {"pages_written": 391_002, "pages_read": 1_882_114, "trim_commands": 71,
                       "fsync_count": 20_411, "journal_replays": 0},
    "vellum.sync": {"records_up": 311, "records_down": 542, "conflicts": 2, "full_syncs": 1,
                    "bytes_up": 733_010},
    "vellum.audio": {"sessions": 6, "underruns": 3, "dictation_minutes": 12, "loud_warnings": 0},
    "vellum.update": {"checks": 1, "downloads": 0, "install_failures": 0},
}
APPS = ["clock", "weather", "mail", "messages", "maps", "music", "workout", "timer", "alarms",
        "calendar", "wallet", "photos", "podcasts", "breathe", "compass", "phone", "settings",
        "stocks", "remote", "voice-memos", "sleep", "home", "reminders", "contacts"]
APP_METRICS = {"launches": 9, "foreground_seconds": 310, "background_refreshes": 14,
               "crashes": 0.05, "memory_peak_kib": 31_000, "complication_updates": 40}
# Rows that the whitelist does not name: they must not leave the device.
PRIVATE = {"vellum.contacts.favourite_count": 12, "vellum.location.home_arrivals": 2,
           "vellum.mail.accounts": 3, "vellum.health.raw_weight_grams": 71_300}

# Distributions: samples a day, and a function of the random source.
def normal(mean, deviation):
    return lambda r: round(r.gauss(mean, deviation), 3)

def lognormal(median, sigma):
    return lambda r: round(median * math.exp(r.gauss(0, sigma)), 3)

def uniform_int(low, high):
    return lambda r: r.randint(low, high)

DISTRIBUTIONS = {
    "vellum.app.launch_ms": (180, lognormal(420, 0.5)),
    "vellum.app.resume_ms": (260, lognormal(120, 0.4)),
    "vellum.battery.temperature_c": (288, normal(29, 2.4)),
    "vellum.battery.level_percent": (288, uniform_int(18, 100)),
    "vellum.battery.drain_per_hour": (24, normal(4.2, 1.1)),
    "vellum.bluetooth.rssi_dbm": (960, normal(-62, 7)),
    "vellum.bluetooth.latency_ms": (540, lognormal(38, 0.7)),
    "vellum.wifi.rssi_dbm": (300, normal(-58, 9)),
    "vellum.wifi.associate_ms": (7, lognormal(900, 0.4)),
    "vellum.cell.signal_bars": (120, uniform_int(0, 4)),
    "vellum.cpu.load_percent": (1440, lognormal(7, 0.9)),
    "vellum.cpu.temperature_c": (1440, normal(33, 3.1)),
    "vellum.memory.free_mib": (288, normal(212, 40)),
    "vellum.memory.compressor_ratio": (96, normal(2.7, 0.3)),
    "vellum.display.frame_ms": (2400, lognormal(15.8, 0.18)),
    "vellum.display.wake_ms": (148, lognormal(210, 0.25)),
    "vellum.storage.read_us": (1800, lognormal(240, 0.8)),
    "vellum.storage.write_us": (1200, lognormal(610, 0.9)),
    "vellum.storage.fsync_ms": (640, lognormal(3.2, 1.0)),
    "vellum.gnss.fix_seconds": (2, lognormal(19, 0.5)),
    "vellum.health.heart_rate_bpm": (8640, normal(71, 14)),
    "vellum.health.sensor_warmup_ms": (40, lognormal(800, 0.2)),
    "vellum.notifications.delivery_ms": (137, lognormal(310, 0.8)),
    "vellum.sync.session_seconds": (26, lognormal(4.5, 0.7)),
    "vellum.sync.record_bytes": (853, lognormal(900, 1.1)),
    "vellum.audio.buffer_ms": (420, normal(21, 1.5)),
    "vellum.haptics.duration_ms": (164, uniform_int(20, 400)),
    "vellum.speech.recognise_ms": (14, lognormal(640, 0.3)),
    "vellum.power.charge_minutes": (2, normal(58, 12)),
    "vellum.power.suspend_seconds": (1100, lognormal(41, 1.2)),
    "vellum.kernel.ipc_us": (3000, lognormal(22, 0.6)),
    "vellum.contacts.call_seconds": (3, lognormal(95, 0.9)),
}


def scalar_rows(random_source):
    for component, metrics in SCALARS.items():
        for metric, usual in metrics.items():
            yield f"{component}.{metric}", around(random_source, usual)
    for app in APPS:
        for metric, usual in APP_METRICS.items():
            yield f"vellum.app.{app}.{metric}", around(random_source, usual)
    for key, usual in PRIVATE.items():
        yield key, around(random_source, usual)


def around(random_source, usual):
    """An integer near the usual value; rare events stay rare."""
    if usual < 5:
        return int(random_source.random() < usual / (usual + 1)) * max(1, round(usual))
    return max(0, round(usual * random_source.uniform(0.6, 1.4)))


def main():
    if len(sys.argv) not in (2, 3):
        sys.exit(__doc__)
    day = int(sys.argv[1])
    random_source = random.Random(f"{sys.argv[2] if len(sys.argv) == 3 else ''}:{day}")
    out = csv.writer(sys.stdout, lineterminator="\n")
    out.writerow(["kind", "key", "day", "offset", "value"])
    for key, value in scalar_rows(random_source):
        out.writerow(["scalar", key, day, "", value])
    for key, (count, sample) in DISTRIBUTIONS.items():
        for offset in sorted(random_source.randrange(86400) for _ in range(count)):
            out.writerow(["distribution", key, day, offset, sample(random_source)])


if __name__ == "__main__":
    main()
