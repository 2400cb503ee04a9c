// What identifies a machine or its user, replaced by numbers: the same one everywhere in a
// recording, and another one in the next.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "host/record/recorded_tree.h"

namespace tally {

// docs/linux.md lists the rules. Text is untrusted and may be anything.
class Pseudonyms {
 public:
  // A name of a network interface, a host or a volume. The kind is the word before the number: "if"
  // and "if1". Numbers are given in the order of the calls.
  void addName(std::string_view kind, const std::string& name);
  // Learns what a file holds that is identifying by its name, such as a serial number.
  void learn(std::string_view path, std::string_view text);

  std::string path(std::string_view path);
  // Of the link at a path.
  std::string target(std::string_view path, std::string_view target);
  std::string content(std::string_view path, std::string_view text);

 private:
  std::string number(std::string_view kind, std::string_view original);
  struct Name {
    std::string pseudonym;
    bool isWord;  // replaced wherever a text has it as a word, not only where it is distinctive
  };
  std::string named(std::string_view kind, const std::string& name, bool isWord);
  // Which names are replaced: in paths those that are distinctive, in texts also those that are
  // words, and where names are expected even "0".
  enum class Where { Path, Text, Name };
  static bool isReplaced(const std::string& name, bool isWord, Where where);
  std::string words(std::string_view text, Where where);
  std::string shapes(std::string_view text, bool isPath);
  std::string folders(std::string_view path);
  std::string kernelPath(std::string_view path, bool isOfProcesses);
  std::string component(std::string_view above, std::string_view name);
  std::string freeText(std::string_view text);
  std::string secret(std::string_view name, std::string_view text);
  std::string mounts(std::string_view table);
  std::string eventLines(std::string_view text);

  std::map<std::string, Name, std::less<>> names_;
  std::map<std::string, std::map<std::string, std::uint32_t>, std::less<>> numbers_;  // by kind
};

// The recording without what identifies its machine.
RecordedTree anonymous(const RecordedTree& recorded);

}  // namespace tally
