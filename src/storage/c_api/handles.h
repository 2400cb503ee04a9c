// What the handles of storage_c.h point to.
#pragma once

#include <memory>
#include <vector>

#include "base/c_border.h"
#include "platform/platform.h"
#include "storage/storage_c.h"

struct tallystorage_device final : tally::CHandle<0x74737401> {
  std::shared_ptr<tally::Platform> services;
};

struct tallystorage_disks final : tally::CHandle<0x74737402> {
  std::vector<tally::FlashDisk> list;
};

struct tallystorage_values final : tally::CHandle<0x74737403> {
  struct Entry {
    tally::KvRef<tally::KvString> name;
    tally::KvRef<tally::KvObject> value;  // a number or a string
  };
  std::vector<Entry> list;
};
