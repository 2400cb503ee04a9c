// Records what a tree is asked for.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>

#include "host/record/recorded_tree.h"
#include "host/tree/system_tree.h"

namespace tally {

// Whatever is read through the observed tree is in the recording, so there is no list of files that
// could miss new sources.
class TreeRecorder {
 public:
  explicit TreeRecorder(const DeviceRoot& root);
  ~TreeRecorder();

  // The tree for those whose files are to be recorded. It may outlive the recorder.
  std::shared_ptr<const SystemTree> observedTree() const { return observed_; }

  // Copies what the tree has been asked for by now, with the links and directories on the way.
  void take();
  // Copies the files that have changed since the latest sample. False once the recording is full.
  bool takeSample(std::int64_t milliseconds);
  // What was recorded; nothing is left here.
  RecordedTree finish();

 private:
  struct Asked {
    std::mutex adding;
    std::map<std::string, std::set<TreeUse>> paths;
  };

  void add(const std::string& path, const std::set<TreeUse>& uses);
  void addNames(const std::string& directory);
  void addFile(const std::string& path, bool isRead);
  bool addEntry(const std::string& path, TreeEntry::Type type, std::string text);
  // The content; empty, with the reason among the faults, if it cannot be read.
  std::string read(const std::string& path);
  bool takeRoom(const std::string& path, std::size_t bytes);
  void fault(const std::string& path, const std::string& reason);

  std::shared_ptr<Asked> asked_;
  std::shared_ptr<const SystemTree> observed_;
  SystemTree tree_;
  RecordedTree recorded_;
  std::map<std::string, std::string> latest_;  // of the files that change
  std::set<std::string> faulty_;
  std::size_t bytes_ = 0;
};

}  // namespace tally
