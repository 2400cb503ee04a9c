// Prints the disks and the flash storage's health from C (TALLYRUN_ROOT, or /).
// health [DISK]: of that disk; else of the device's storage.
#include <inttypes.h>
#include <stdio.h>
#include <stdlib.h>
#include <storage/storage_c.h>

static void check(int code) {
  if (code == TALLYSTORAGE_OK) return;
  fprintf(stderr, "%s\n", tallystorage_error_text());
  exit(1);
}

static void print_value(const tallystorage_values *values, size_t index) {
  const char *name, *text;
  int kind;
  int64_t integer;
  uint64_t natural;
  double real;
  check(tallystorage_value_name(values, index, &name));
  check(tallystorage_value_kind(values, index, &kind));
  printf("%s = ", name);
  switch (kind) {
    case TALLYSTORAGE_INT64:
      check(tallystorage_value_int64(values, index, &integer));
      printf("%" PRId64 "\n", integer);
      break;
    case TALLYSTORAGE_UINT64:
      check(tallystorage_value_uint64(values, index, &natural));
      printf("%" PRIu64 "\n", natural);
      break;
    case TALLYSTORAGE_DOUBLE:
      check(tallystorage_value_double(values, index, &real));
      printf("%g\n", real);
      break;
    default:
      check(tallystorage_value_text(values, index, &text));
      printf("%s\n", text);
  }
}

int main(int argc, char **argv) {
  tallystorage_device *device;
  tallystorage_disks *disks;
  tallystorage_values *health, *info;
  check(tallystorage_open(NULL, &device));
  check(tallystorage_list_disks(device, &disks));
  for (size_t i = 0; i < tallystorage_disk_count(disks); ++i) {
    const char *name, *kind;
    uint32_t flags;
    check(tallystorage_disk_name(disks, i, &name));
    check(tallystorage_disk_kind(disks, i, &kind));
    check(tallystorage_disk_flags(disks, i, &flags));
    printf("disk %s: %s%s\n", name, kind,
           flags & TALLYSTORAGE_DISK_HAS_FIGURES ? ", says how worn it is" : "");
  }
  const char *disk = argc > 1 ? argv[1] : NULL;
  check(tallystorage_nand_health(device, disk, &health));
  for (size_t i = 0; i < tallystorage_value_count(health); ++i) print_value(health, i);
  size_t index;
  check(tallystorage_nand_info(device, disk, &info));
  check(tallystorage_find(info, "vellum.NANDInfo.ExportVersion", &index));
  print_value(info, index);
  tallystorage_free_values(info);
  tallystorage_free_values(health);
  tallystorage_free_disks(disks);
  tallystorage_close(device);
  return 0;
}
