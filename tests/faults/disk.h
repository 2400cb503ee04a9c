// The disk under a run: what a power cut leaves of what the run has changed.
//
// A file's contents are on the disk from the file's fsync, the names in a directory from the
// directory's. Anything else may be there or not, within the guarantees of file systems: the
// changes of names in one directory arrive in order, each as a whole, so that a rename never loses
// both names; nothing orders them against those in another directory, or against contents. Contents
// arrive in pieces as small as flash memory takes, in any order and apart from the file's size; a
// piece that did not arrive keeps its former bytes, or is zero where there were none.
#pragma once

#include <string>

namespace tally::faults {

// What the cut takes of that.
enum class Loss {
  Everything,
  Contents,  // while all names have arrived
  AtRandom,  // for each directory from some change on; for each file all, nothing or pieces
};

// From here on changes below the folder are recorded; what is there now counts as on the disk.
// Files that lose their names are kept in another folder of the volume.
void followDisk(const std::string& folder, const std::string& kept);

// Called before the contents of a file change, and when they have been synced.
void contentsChange(const std::string& path);
void contentsSynced(const std::string& path);

// Made before the call that changes a name, and told its result afterwards.
class NameChange {
 public:
  enum class Kind { Create, Remove, Rename };
  // For a rename, `to` is in the same directory.
  NameChange(Kind kind, const std::string& path, const std::string& to = "");
  // With the result of the call, which it returns.
  int done(int result) const;

 private:
  Kind kind_;
  std::string path_, to_, kept_;
  bool matters_ = false;
};
void namesSynced(const std::string& directory);

// Changes the folder to what would be found after a power cut now.
void cutPower(Loss loss, unsigned seed);

}  // namespace tally::faults
