// The files of a metrics store, which SQLite opens through the directory that holds them.
#pragma once

#include <string>
#include <string_view>

#include "base/files/directory.h"

namespace tally {

// SQLite works on paths, which it looks up again for each of a store's files: the database, its
// log, the log's index and the journal. A store lies in a directory that a user can change
// meanwhile, so its files get names that lead through the open directory, and an SQLite file system
// that accepts no others. It opens no link, pipe or device, and no file that Directory::check
// refuses; nothing is made, removed or given away anywhere else, whatever a journal may ask for.

// The file system's name, for sqlite3_open_v2. Null when this SQLite cannot have it.
const char* storeFileSystem();

// The name under which the file system knows the database `name` of the directory, which stays open
// for the life of the process: SQLite removes files when the last connection closes.
std::string storeFileName(const Directory& directory, std::string_view name);

// Why the last file was refused on this thread, in words that name it; empty when none was. Asking
// forgets it.
std::string takeStoreFileRefusal();

}  // namespace tally
