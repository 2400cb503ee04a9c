// Writes values as an XML property list, into a string or piece by piece to where it is kept.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <string_view>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// One document, written in the order of the calls. Containers that are begun must be ended; inside
// a dictionary each item follows its key. What is too deeply nested (a cycle always is), or would
// make the document larger than the bound, is an error, after which the document is of no use.
class XmlPlistWriter {
 public:
  // Takes pieces of the document, in order; false ends the writing.
  using Sink = std::function<bool(std::string_view)>;

  // Without a sink the whole document stays here, to be taken by finish().
  explicit XmlPlistWriter(std::size_t maximumBytes, Sink sink = nullptr);

  // REQUIRES: it gets at least one item.
  void beginDictionary();
  void endDictionary();
  // A container without items.
  void emptyDictionary();
  void key(std::string_view key);  // valid UTF-8
  void integer(std::int64_t value);
  Status value(const KvObject& object);
  // Whether enough has come together to be passed on. value() does that by itself.
  bool isLarge() const { return out_.size() >= piece_; }
  Status passOn();

  // Ends the document, and passes on the rest of it. The text is empty when there is a sink.
  Result<std::string> finish();
  // Of all that was written.
  std::size_t size() const { return passedOn_ + out_.size(); }

 private:
  void indent(std::size_t depth) { out_.append(depth, '\t'); }
  void text(std::string_view tag, std::string_view content);
  void number(const KvNumber& number);
  void data(std::span<const std::byte> bytes);
  Status array(const KvArray& array);
  Status dictionary(const KvDictionary& dictionary);

  std::size_t maximumBytes_;
  Sink sink_;
  std::size_t piece_;  // so much is passed on at a time
  std::string out_;
  std::size_t passedOn_ = 0, depth_ = 0;
};

// The whole document.
Result<std::string> writeXmlPlist(const KvObject& root, std::size_t maximumBytes);

Error plistTooLarge(std::size_t maximumBytes);

}  // namespace tally
