// Property lists part by part, for readers that need no tree of the whole.
#pragma once

#include <cstddef>
#include <functional>
#include <span>
#include <string_view>

#include "base/result.h"
#include "kv/value.h"

namespace tally {

// Fills the front of the buffer with what follows in a document, and returns how much. 0 means the
// end, or a failure that the source remembers.
using PlistSource = std::function<std::size_t(std::span<char> buffer)>;

// Receives the values of a document in its order. A document that turns out to be damaged ends the
// calls anywhere, so nothing received counts until the reader reports success.
class PlistReceiver {
 public:
  virtual ~PlistReceiver() = default;
  // Asked when a container begins: true to receive it through value() as one object, which must not
  // be changed, since a later element of the same text may be given as the same object.
  virtual bool wantsObject() = 0;
  virtual void beginContainer(KvType type) = 0;  // Array or Dictionary
  virtual void endContainer() = 0;
  // The key of the value that follows; may occur again in the same dictionary, whose last value
  // then counts. Not always well-formed UTF-8.
  virtual void key(std::string_view text) = 0;
  // A value that is not a container, or a container that was wanted as an object.
  virtual void value(KvRef<KvObject> value) = 0;
};

// Gives the receiver the parts of a value, as if they were read.
void replayPlist(const KvRef<KvObject>& value, PlistReceiver& receiver);

}  // namespace tally
