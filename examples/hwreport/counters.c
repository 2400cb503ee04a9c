// Prints the statistics channels of a device (TALLYRUN_ROOT, or /) from C.
// counters [SECONDS [GROUP]]: what they counted meanwhile, and only those of one group.
#include <hwreport/hwreport_c.h>
#include <inttypes.h>
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

static void check(int code) {
  if (code == HWREPORT_OK) return;
  fprintf(stderr, "%s\n", hwreport_error_text());
  exit(1);
}

// One column of a channel's elements. The caller frees it.
static int64_t *column(hwreport_channels *channels, size_t index, int what, size_t *count) {
  check(hwreport_elements(channels, index, what, NULL, 0, count));
  int64_t *values = calloc(*count + 1, sizeof *values);
  if (values == NULL) exit(1);
  check(hwreport_elements(channels, index, what, values, *count, count));
  return values;
}

static void print_channel(hwreport_channels *channels, size_t index) {
  const char *driver, *name, *unit;
  uint64_t format;
  hwreport_text(channels, index, HWREPORT_DRIVER_NAME, &driver);
  hwreport_text(channels, index, HWREPORT_NAME, &name);  // "" if it has none
  hwreport_text(channels, index, HWREPORT_UNIT_LABEL, &unit);
  hwreport_number(channels, index, HWREPORT_FORMAT, &format);
  if (format == HWREPORT_FORMAT_SIMPLE) {
    int64_t value;
    if (hwreport_simple_value(channels, index, &value) != HWREPORT_OK) return;
    printf("%s: %s = %" PRId64 " %s\n", driver, name, value, unit);
    return;
  }
  int what = format == HWREPORT_FORMAT_STATE       ? HWREPORT_STATE_RESIDENCIES
             : format == HWREPORT_FORMAT_HISTOGRAM ? HWREPORT_BUCKET_HITS
                                                   : HWREPORT_ARRAY_VALUES;
  size_t count;
  int64_t *values = column(channels, index, what, &count);
  for (size_t i = 0; i < count; ++i) {
    if (values[i] == HWREPORT_MISSING) continue;
    const char *state = "";
    if (what == HWREPORT_STATE_RESIDENCIES) hwreport_state_name(channels, index, i, &state);
    printf("%s: %s[%zu] %s = %" PRId64 "\n", driver, name, i, state, values[i]);
  }
  free(values);
}

int main(int argc, char **argv) {
  hwreport_device *device;
  hwreport_channels *channels, *sample;
  hwreport_subscription *subscription;
  check(hwreport_open(NULL, &device));
  check(hwreport_list(device, &channels));
  if (argc > 2) check(hwreport_keep_group(channels, argv[2], NULL));
  check(hwreport_subscribe(device, channels, &subscription));
  check(hwreport_sample(subscription, &sample));
  if (argc > 1) {
    hwreport_channels *later, *delta;
    sleep((unsigned)atoi(argv[1]));
    check(hwreport_sample(subscription, &later));
    check(hwreport_delta(sample, later, &delta));
    hwreport_free(sample);
    hwreport_free(later);
    sample = delta;
  }
  for (size_t i = 0; i < hwreport_count(sample); ++i) print_channel(sample, i);
  hwreport_free(sample);
  hwreport_unsubscribe(subscription);
  hwreport_free(channels);
  hwreport_close(device);
  return 0;
}
