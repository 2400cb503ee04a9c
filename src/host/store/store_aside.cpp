#include "host/store/store_aside.h"

#include <algorithm>
#include <cerrno>
#include <chrono>

#include "base/files/file_lock.h"
#include "base/files/set_aside.h"
#include "base/number_text.h"

namespace tally {
namespace {

constexpr std::string_view kWord = "newer";
constexpr std::string_view kLockName = ".newer-store.lock";
// Readers have the store open for a moment; whoever stays longer is at work.
constexpr std::chrono::milliseconds kPatience{1000};

// All of the store into its file, so that one rename moves the whole. Nobody else has it open.
Status foldIntoOneFile(Database& database, const Directory& directory, const std::string& name) {
  if (auto folded = database.foldLog(); !folded) return folded;
  for (const char* const end : {"-wal", "-journal"}) {
    const auto log = directory.identity(name + end);
    if (log && log->size > 0) return database.error("its log cannot be folded");
  }
  // Another store of the same name must not find them.
  for (const char* const end : {"-journal", "-wal", "-shm"}) {
    if (auto removed = directory.remove(name + end); !removed) return removed;
  }
  return directory.sync();
}

}  // namespace

Status setNewerStoreAside(const StoreFile& file) {
  const auto directory = file.directory.open();
  if (!directory) return directory.error();
  // Of several processes the first one does it; the others find its new store.
  const auto lock = FileLock::acquire(*directory, kLockName);
  if (!lock) return lock.error();
  if (!directory->identity(file.name)) return Done{};
  const auto open = [&] {
    return Database::open(*directory, file.name, Database::Access::ReadWrite);
  };
  auto found = open();
  if (!found) return found.error();
  found->foldLogOnClose(false);
  const std::string newer = newerThanKnown(*found);
  if (newer.empty()) return Done{};
  {
    const Database closed = *std::move(found);  // it would be one of the others
  }

  auto database = open();
  if (!database) return database.error();
  database->foldLogOnClose(false);  // by then its name is another store's
  const auto alone = database->shutOthersOut(kPatience);
  if (!alone) return alone.error();
  if (!*alone) {
    return database->error(newer + ", which has it open; nothing is recorded until that ends");
  }
  if (newerThanKnown(*database).empty()) return Done{};
  if (auto folded = foldIntoOneFile(*database, *directory, file.name); !folded) return folded;
  const auto aside = setAside(*directory, file.name, kWord, kMostStoresSetAside);
  if (!aside) return aside.error();
  if (file.notify) {
    file.notify(
        database->error(newer + "; kept as " + *aside + ", and an empty store is started").message);
  }
  return directory->sync();
}

bool awaitSettingAside(const StoreFile& file) {
  const auto directory = file.directory.open();
  if (!directory || !directory->identity(std::string(kLockName))) return false;
  return static_cast<bool>(FileLock::acquire(*directory, kLockName));
}

std::vector<StoreSetAside> storesSetAside(const StoreFile& file) {
  std::vector<StoreSetAside> found;
  const std::string stem = file.name + asideMark(kWord);
  const auto names = file.directory.list();
  if (!names) return found;
  for (const std::string& name : *names) {
    if (!name.starts_with(stem)) continue;
    const auto number = parseInt64(name.substr(stem.size()));
    if (!number || *number < 1 || *number > kMostStoresSetAside) continue;
    const auto identity = file.directory.identity(name);
    if (!identity || !identity->regular) continue;
    found.push_back({name, static_cast<std::uint32_t>(*number), identity->size});
  }
  std::ranges::sort(found, {}, &StoreSetAside::number);
  return found;
}

StoreFile storeSetAside(const StoreFile& file, std::uint32_t number) {
  return {file.directory, file.name + asideMark(kWord) + std::to_string(number), file.notify};
}

}  // namespace tally
