// The storage library for C, and for every language that can call C: the disks of a device, and
// what is known of their flash, as names and values.
//
// Results. A function that returns int returns TALLYSTORAGE_OK or the code of what failed;
// tallystorage_error_text says why, in words. Outputs of a call that failed are 0, NULL for a
// handle and "" for a text. No function aborts or throws, also when memory runs out.
//
// Handles. A handle that a function stores through its last parameter belongs to the caller, who
// frees it once, in any order: disks and values do not need their device any more. NULL and a
// handle of another kind are rejected (TALLYSTORAGE_BAD_ARGUMENT); freeing NULL does nothing. A
// handle must not be used after it was freed.
//
// Texts are UTF-8 and end with a zero byte. Those that are passed in are copied; those that come
// from a handle live until it is freed.
//
// Threads. Every function can be called from any thread. A device is used by one thread at a time;
// different devices can be used at the same time. Disks and values never change, so that several
// threads can read them.
//
// Constants and functions are only ever added, so that programs need not be built again.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include "kv/export.h"

#ifdef __cplusplus
extern "C" {
#endif

enum {
  TALLYSTORAGE_OK = 0,
  // NULL, a handle of another kind, an index past the end, text that is not UTF-8.
  TALLYSTORAGE_BAD_ARGUMENT = 1,
  TALLYSTORAGE_NO_MEMORY = 2,
  // No such device root, no such disk, no storage driver that exports figures, no value of the
  // name.
  TALLYSTORAGE_NOT_FOUND = 3,
  TALLYSTORAGE_NO_VALUE = 4,  // the value is of another kind, or too large for the type
  TALLYSTORAGE_FAILED = 6     // the driver failed, or what it exports cannot be read
};

// What the calling thread's last failure was, one line of text; "" before the first. It stays until
// the thread's next failure. Never NULL.
TALLY_API const char *tallystorage_error_text(void);

// A device, by its root directory: "/" is this machine. NULL stands for the environment variable
// TALLYRUN_ROOT, or else "/". Drivers are read when they are asked for, not here. They and what is
// wrong with a device's description are reported on standard error.
typedef struct tallystorage_device tallystorage_device;
TALLY_API int tallystorage_open(const char *root, tallystorage_device **device);
TALLY_API void tallystorage_close(tallystorage_device *device);

// The flash disks that the kernel shows, numbered from 0; asking may wake them. None when the
// device describes a storage driver of its own, which is asked without a disk's name.
typedef struct tallystorage_disks tallystorage_disks;
TALLY_API int tallystorage_list_disks(tallystorage_device *device, tallystorage_disks **disks);
TALLY_API void tallystorage_free_disks(tallystorage_disks *disks);
// 0 for what is not a list of disks.
TALLY_API size_t tallystorage_disk_count(const tallystorage_disks *disks);
// As the kernel calls it: "mmcblk0".
TALLY_API int tallystorage_disk_name(const tallystorage_disks *disks, size_t index,
                                     const char **name);
// "eMMC", "UFS", "raw NAND", "NVMe" or "other".
TALLY_API int tallystorage_disk_kind(const tallystorage_disks *disks, size_t index,
                                     const char **kind);
enum {
  TALLYSTORAGE_DISK_IS_STORAGE = 1,  // the device's data lies on it
  TALLYSTORAGE_DISK_IS_REMOVABLE = 2,
  TALLYSTORAGE_DISK_HAS_FIGURES = 4  // it says how worn it is: its name can be asked
};
// A mask of these bits; others may be added.
TALLY_API int tallystorage_disk_flags(const tallystorage_disks *disks, size_t index,
                                      uint32_t *flags);

// Names and values, numbered from 0, in the order in which they are reported.
typedef struct tallystorage_values tallystorage_values;
// Every figure of the flash storage by its report key ("vellum.NANDInfo.BytesPerPage"). A disk's
// name, or NULL for the storage of the device. Asks the driver afresh. The purgeable space may be
// unknown: the entry "vellum.NANDInfo.Reclaim.Error" says so, and the rest is there.
TALLY_API int tallystorage_nand_info(tallystorage_device *device, const char *disk,
                                     tallystorage_values **values);
// The health summary: wear in percent, end-to-end and read errors, spare blocks, and the largest
// figure of each group. What the driver does not export is left out.
TALLY_API int tallystorage_nand_health(tallystorage_device *device, const char *disk,
                                       tallystorage_values **values);
TALLY_API void tallystorage_free_values(tallystorage_values *values);
// 0 for what is not a set of values.
TALLY_API size_t tallystorage_value_count(const tallystorage_values *values);
// The index of a name; TALLYSTORAGE_NOT_FOUND when there is none.
TALLY_API int tallystorage_find(const tallystorage_values *values, const char *name, size_t *index);
TALLY_API int tallystorage_value_name(const tallystorage_values *values, size_t index,
                                      const char **name);
enum {
  TALLYSTORAGE_INT64 = 1,
  TALLYSTORAGE_UINT64 = 2,
  TALLYSTORAGE_DOUBLE = 3,
  TALLYSTORAGE_TEXT = 4
};
// The type that holds the value without loss.
TALLY_API int tallystorage_value_kind(const tallystorage_values *values, size_t index, int *kind);
// TALLYSTORAGE_NO_VALUE for a text, for a double, and for an integer that the type cannot hold.
TALLY_API int tallystorage_value_int64(const tallystorage_values *values, size_t index,
                                       int64_t *value);
TALLY_API int tallystorage_value_uint64(const tallystorage_values *values, size_t index,
                                        uint64_t *value);
// Any number, rounded where it is an integer above 2^53.
TALLY_API int tallystorage_value_double(const tallystorage_values *values, size_t index,
                                        double *value);
// A text only.
TALLY_API int tallystorage_value_text(const tallystorage_values *values, size_t index,
                                      const char **text);

#ifdef __cplusplus
}
#endif
