// HwReport for C, and for every language that can call C: list the statistics channels of a device,
// subscribe, sample, subtract samples, and read values.
//
// Results. A function that returns int returns HWREPORT_OK or the code of what failed;
// hwreport_error_text says why, in words. Outputs of a call that failed are 0, NULL for a handle
// and "" for a text. No function aborts or throws, also when memory runs out.
//
// Handles. A handle that a function stores through its last parameter belongs to the caller, who
// frees it once. Handles can be freed in any order: a subscription outlives its device, a sample
// its subscription. NULL and a handle of another kind are rejected (HWREPORT_BAD_ARGUMENT); freeing
// NULL does nothing. A handle must not be used after it was freed.
//
// Texts are UTF-8 and end with a zero byte. Those that are passed in are copied. Those that come
// from a set of channels live until the set is freed, or until channels are added to it or removed
// from it.
//
// Threads. Every function can be called from any thread. What comes from one hwreport_open (sets,
// subscriptions, samples) is used by one thread at a time; different devices can be used at the
// same time.
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
  HWREPORT_OK = 0,
  // NULL, a handle of another kind, an index past the end, an unknown constant, text that is not
  // UTF-8.
  HWREPORT_BAD_ARGUMENT = 1,
  HWREPORT_NO_MEMORY = 2,
  HWREPORT_NOT_FOUND = 3,  // no such device root, no statistics hub
  HWREPORT_NO_VALUE = 4,   // the channel does not have it: not sampled, another format, missing
  HWREPORT_CHANGED = 5,    // drivers came or went meanwhile: call again
  HWREPORT_FAILED = 6      // a driver or the hub failed
};

// What the calling thread's last failure was, one line of text; "" before the first. It stays until
// the thread's next failure. Never NULL.
TALLY_API const char *hwreport_error_text(void);

// A device, by its root directory: "/" is this machine. NULL stands for the environment variable
// TALLYRUN_ROOT, or else "/". Drivers are read when they are asked for, not here. What is wrong
// with a device's description is written to standard error.
typedef struct hwreport_device hwreport_device;
TALLY_API int hwreport_open(const char *root, hwreport_device **device);
TALLY_API void hwreport_close(hwreport_device *device);

// A set of channels: those that drivers publish, or a sample. Its channels are numbered from 0. A
// sample has the order of the set that was subscribed; a channel that the hub does not serve is
// left out.
typedef struct hwreport_channels hwreport_channels;
// Every channel that a driver publishes. A driver that cannot be read is passed over.
TALLY_API int hwreport_list(hwreport_device *device, hwreport_channels **channels);
TALLY_API void hwreport_free(hwreport_channels *channels);
// 0 for what is not a set.
TALLY_API size_t hwreport_count(const hwreport_channels *channels);

// Filters: each removes the other channels from the set, which may end empty. Called one after the
// other they select what passes all of them.
//
// Of this group, this subgroup, or both; one of the two may be NULL.
TALLY_API int hwreport_keep_group(hwreport_channels *channels, const char *group,
                                  const char *subgroup);
TALLY_API int hwreport_keep_name(hwreport_channels *channels, const char *name);
// In one of the categories of a mask. A channel whose type cannot be read is in every one.
TALLY_API int hwreport_keep_categories(hwreport_channels *channels, uint16_t categories);
// By a number, HWREPORT_FORMAT for example.
TALLY_API int hwreport_keep_number(hwreport_channels *channels, int field, uint64_t number);
// Adds the channels of another set, which stays as it is. Channels that both have are there twice.
TALLY_API int hwreport_add(hwreport_channels *channels, hwreport_channels *more);

// Fields of a channel.
enum {
  HWREPORT_NAME = 1,  // by the driver's legend, or else the printable bytes of its id
  HWREPORT_GROUP = 2,
  HWREPORT_SUBGROUP = 3,
  HWREPORT_DRIVER_NAME = 4,  // "NAME <id 0xID>"
  HWREPORT_UNIT_LABEL = 5    // "ms", "KiB", "events"
};
// HWREPORT_NO_VALUE when the channel has no such text.
TALLY_API int hwreport_text(hwreport_channels *channels, size_t index, int field,
                            const char **text);
enum {
  HWREPORT_FORMAT = 1,      // one of the four below; 0 until the first sample of some channels
  HWREPORT_CATEGORIES = 2,  // a mask of 16 bits
  HWREPORT_UNIT = 3,        // the unit word, as hwreport_scale takes it
  HWREPORT_DRIVER_ID = 4,   // the registry entry of the driver
  HWREPORT_CHANNEL_ID = 5
};
enum {
  HWREPORT_FORMAT_SIMPLE = 1,     // one value
  HWREPORT_FORMAT_STATE = 2,      // an element for each state
  HWREPORT_FORMAT_HISTOGRAM = 3,  // an element for each bucket
  HWREPORT_FORMAT_ARRAY = 4       // many values
};
TALLY_API int hwreport_number(hwreport_channels *channels, size_t index, int field,
                              uint64_t *number);

// A subscription has the hub keep these channels ready. The set is copied. An empty one is
// rejected.
typedef struct hwreport_subscription hwreport_subscription;
TALLY_API int hwreport_subscribe(hwreport_device *device, hwreport_channels *channels,
                                 hwreport_subscription **subscription);
TALLY_API void hwreport_unsubscribe(hwreport_subscription *subscription);
// The subscribed channels with their values as they are now.
TALLY_API int hwreport_sample(hwreport_subscription *subscription, hwreport_channels **sample);
// later - earlier, channel by channel, of two samples of one subscription. A channel that the
// earlier sample lacks keeps its absolute values. Counts and residencies are subtracted; a bucket's
// smallest and largest value are those of the later sample.
TALLY_API int hwreport_delta(hwreport_channels *earlier, hwreport_channels *later,
                             hwreport_channels **delta);

// Values of a sample, in the channel's unit. What a driver did not fill in is HWREPORT_MISSING
// among elements, and HWREPORT_NO_VALUE as the result of a call for one value.
#define HWREPORT_MISSING INT64_MIN

TALLY_API int hwreport_simple_value(hwreport_channels *channels, size_t index, int64_t *value);

// Columns of the elements of a channel.
enum {
  HWREPORT_ARRAY_VALUES = 1,
  HWREPORT_STATE_IDS = 2,          // 64 bits, often eight characters: hwreport_state_name
  HWREPORT_STATE_TRANSITIONS = 3,  // how often the state was entered
  HWREPORT_STATE_RESIDENCIES = 4,  // how long it lasted
  HWREPORT_BUCKET_HITS = 5,        // how many values fell into the bucket
  HWREPORT_BUCKET_MINIMA = 6,      // the smallest of them
  HWREPORT_BUCKET_MAXIMA = 7,      // the largest
  HWREPORT_BUCKET_SUMS = 8,        // their sum
  HWREPORT_BUCKET_LOWER_BOUNDS = 9,
  HWREPORT_BUCKET_UPPER_BOUNDS = 10  // bounds are missing when the driver does not state them
};
// Copies one column, an element each, up to the capacity, and stores in *count how many elements
// there are: more than the capacity if some were left out. values may be NULL if the capacity is 0.
// Unsigned columns (ids, transitions, residencies, hits) keep their 64 bits.
TALLY_API int hwreport_elements(hwreport_channels *channels, size_t index, int column,
                                int64_t *values, size_t capacity, size_t *count);

// HWREPORT_NO_VALUE unless every state of the channel has a printable id.
TALLY_API int hwreport_state_name(hwreport_channels *channels, size_t index, size_t state,
                                  const char **name);
// The state's share of all residencies, 0 to 1.
TALLY_API int hwreport_state_share(hwreport_channels *channels, size_t index, size_t state,
                                   double *share);
// The state that was updated last.
TALLY_API int hwreport_state_current(hwreport_channels *channels, size_t index, size_t *state);
// The smallest and the largest value of all buckets that have hits. Either pointer may be NULL.
TALLY_API int hwreport_histogram_range(hwreport_channels *channels, size_t index, int64_t *minimum,
                                       int64_t *maximum);

// A value expressed in another unit; HWREPORT_NO_VALUE when the quantities differ or a unit cannot
// be scaled.
TALLY_API int hwreport_scale(uint64_t value, uint64_t from_unit, uint64_t to_unit, double *scaled);

#ifdef __cplusplus
}
#endif
