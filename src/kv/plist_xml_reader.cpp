// A reader of our own, in one pass without a tree in between, that needs only the element it reads
// and not the document in memory. The library takes quadratic time over
// references in a text and over large dictionaries, uses several times the document's size in
// memory, and silently accepts much damage: text in a number, impossible dates, a key without a
// value, a document that stops half-way.
#include "kv/plist_xml_reader.h"

#include <algorithm>
#include <bit>
#include <span>
#include <string>
#include <vector>

#include "base/utf8.h"
#include "kv/common_values.h"
#include "kv/nesting.h"
#include "kv/plist_codec.h"
#include "kv/plist_xml_leaf.h"
#include "kv/plist_xml_writer.h"
#include "kv/repeated_elements.h"

namespace tally {
namespace {

constexpr auto kNone = std::string_view::npos;
constexpr std::string_view kUtf8ByteOrderMark = "\xEF\xBB\xBF";
constexpr std::string_view kBigEndianMark = "\xFE\xFF", kLittleEndianMark = "\xFF\xFE";

bool isBlank(char character) {
  return character == ' ' || character == '\n' || character == '\t' || character == '\r';
}

bool endsName(char character) {
  return character == '<' || character == '>' || character == '/' || isBlank(character);
}

struct Tag {
  std::string_view name;
  bool closing = false;
  bool empty = false;
};

// A container that is still open.
struct Frame {
  KvType type = KvType::Array;
  // One of them is set, unless the receiver gets the items one by one.
  KvRef<KvArray> array;
  KvRef<KvDictionary> dictionary;
  KvRef<KvString> key;  // waits for its value in the dictionary
  bool hasKey = false;  // one waits for its value

  bool lacksKey() const { return type == KvType::Dictionary && !hasKey; }
};

// A problem in the line that so many line ends come before.
Error errorInLine(std::size_t lineEnds, const char* problem) {
  return Error{"line " + std::to_string(lineEnds + 1) + ": " + problem};
}

enum class PlistEncoding { Utf8, Utf16 };

class Reader {
 public:
  Reader(DocumentWindow& window, PlistEncoding encoding, PlistReceiver& receiver)
      : window_(window), text_(window.text()), encoding_(encoding), receiver_(receiver) {}

  Status read() {
    const bool hasZeroBytes = window_.endsDocument() && window_.hasZeroBytes();
    const bool isRead = !hasZeroBytes && wholeStep([this] { return prolog(); }) && body() &&
                        wholeStep([this] { return epilog(); });
    // Wherever they are, they are what is said of the document.
    if (window_.hasZeroBytes()) return errorInLine(0, "there are zero bytes in the document");
    if (isRead) return Done{};
    return errorInLine(window_.linesBefore() + countLines(text_.substr(0, position_)), problem_);
  }

 private:
  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }
  bool atEnd() const { return position_ >= text_.size(); }
  bool at(std::string_view prefix) const { return text_.substr(position_).starts_with(prefix); }

  bool take(std::string_view prefix) {
    if (!at(prefix)) return false;
    position_ += prefix.size();
    return true;
  }
  bool skipPast(std::string_view mark, const char* problem) {
    const std::size_t found = text_.find(mark, position_);
    if (found == kNone) return fail(problem);
    position_ = found + mark.size();
    return true;
  }
  void skipBlanks() {
    while (!atEnd() && isBlank(text_[position_])) ++position_;
  }

  // Blanks, comments and processing instructions, which may occur between any two elements.
  bool skipBetween() {
    for (;;) {
      skipBlanks();
      if (!at("<!") && !at("<?")) return true;
      if (take("<!--")) {
        if (!skipPast("-->", "a comment has no end")) return false;
      } else if (take("<?")) {
        if (!skipPast("?>", "a processing instruction has no end")) return false;
      } else {
        return true;
      }
    }
  }

  bool prolog() {
    wrapped_ = false;
    take(kUtf8ByteOrderMark);
    if (at("<?xml") && !checkEncoding()) return false;
    if (!skipBetween()) return false;
    if (take("<!DOCTYPE") && (!skipDocumentType() || !skipBetween())) return false;
    if (!at("<plist")) return true;
    Tag tag;
    wrapped_ = true;
    return readTag(tag) && (tag.name == "plist" || fail("unknown element")) &&
           (!tag.empty || fail("the property list is empty"));
  }

  bool checkEncoding() {
    const std::string_view declaration = text_.substr(position_, text_.find("?>", position_));
    const std::size_t found = declaration.find("encoding");
    if (found == kNone) return true;
    const std::size_t open = declaration.find_first_of("\"'", found);
    if (open == kNone) return fail("the encoding is not readable");
    const std::size_t close = declaration.find(declaration[open], open + 1);
    if (close == kNone) return fail("the encoding is not readable");
    std::string name(declaration.substr(open + 1, close - open - 1));
    for (char& letter : name) {
      if (letter >= 'A' && letter <= 'Z') letter = static_cast<char>(letter - 'A' + 'a');
    }
    if (encoding_ == PlistEncoding::Utf16) {
      return name == "utf-16" || fail("the encoding is not the declared one");
    }
    return name == "utf-8" || name == "utf8" || name == "us-ascii" ||
           fail("the encoding is not UTF-8");
  }

  // An internal subset could define entities, which no property list needs: refused.
  bool skipDocumentType() {
    for (; !atEnd(); ++position_) {
      const char character = text_[position_];
      if (character == '[' || character == '<') {
        return fail("a document type with definitions of its own is not accepted");
      }
      if (character == '"' || character == '\'') {
        const std::size_t close = text_.find(character, position_ + 1);
        if (close == kNone) break;
        position_ = close;
      } else if (character == '>') {
        ++position_;
        return true;
      }
    }
    return fail("the document type has no end");
  }

  // Expects a '<' at the position. Attributes carry nothing in a property list and are skipped.
  bool readTag(Tag& tag) {
    ++position_;
    tag.closing = take("/");
    const std::size_t start = position_;
    while (!atEnd() && !endsName(text_[position_])) ++position_;
    tag.name = text_.substr(start, position_ - start);
    for (; !atEnd(); ++position_) {
      const char character = text_[position_];
      if (character == '>') {
        tag.empty = text_[position_ - 1] == '/';
        ++position_;
        if (tag.empty && tag.closing) return fail("a closing tag is not well formed");
        return true;
      }
      if (character == '<') break;
      if (tag.closing && !isBlank(character)) return fail("a closing tag is not well formed");
      if (character == '"' || character == '\'') {
        const std::size_t close = text_.find(character, position_ + 1);
        if (close == kNone) break;
        position_ = close;
      }
    }
    return fail("a tag has no end");
  }

  // Goes on at a position of the text, with more of the document.
  void more(std::size_t from) {
    window_.more(from);
    text_ = window_.text();
    position_ = 0;
    objectStart_ = kNone;
  }

  // Where the window ends, a mark may be cut and a fault may be none: the step is then repeated
  // with more of the document. It must change nothing but the position before it succeeds.
  template <class Step>
  bool wholeStep(Step step) {
    constexpr std::size_t kLongestMark = 16;
    for (;;) {
      const std::size_t start = position_;
      const bool isDone = step();
      const bool isCut = !isDone || text_.size() - position_ < kLongestMark;
      if (window_.endsDocument() || !isCut) return isDone;
      more(start);
    }
  }

  bool body() {
    do {
      std::size_t start = position_;
      const std::size_t objects = objects_;
      while (!part()) {
        if (window_.endsDocument()) return false;
        objects_ = objects;
        more(std::exchange(start, 0));
      }
    } while (!stack_.empty());
    return true;
  }

  // An element, or a tag of a container. What fails has changed nothing but the position and the
  // number of objects.
  bool part() {
    if (!skipBetween()) return false;
    if (atEnd()) return fail("the document ends too early");
    if (text_[position_] != '<') return fail("there is text outside of a value");
    if (takeRepeated()) return true;
    tagStart_ = position_;
    Tag tag;
    if (!readTag(tag)) return false;
    return tag.closing ? closeContainer(tag.name) : openElement(tag);
  }

  bool takeRepeated() {
    if (stack_.empty() || !stack_.back().hasKey || isBuilding() || !receiver_.wantsObject()) {
      return false;
    }
    const auto* const known = repeated_.find(text_.substr(position_), stack_.size());
    if (known == nullptr || objects_ + known->objects > kPlistMaximumObjects) return false;
    position_ += known->text.size();
    objects_ += known->objects;
    return addValue(known->value);
  }

  bool epilog() {
    if (!skipBetween()) return false;
    if (wrapped_) {
      if (atEnd()) return fail("the document ends too early");
      Tag tag;
      if (text_[position_] != '<') return fail("there is text outside of a value");
      if (!readTag(tag)) return false;
      if (!tag.closing || tag.name != "plist") return fail("there is more than one root value");
      if (!skipBetween()) return false;
    }
    return atEnd() || fail("there is something after the end of the property list");
  }

  bool openElement(const Tag& tag) {
    if (++objects_ > kPlistMaximumObjects) return fail("there are more than 4000000 values");
    if (tag.name == "dict") return openContainer(tag, KvType::Dictionary);
    if (tag.name == "array") return openContainer(tag, KvType::Array);

    std::string_view content;
    if (!tag.empty && !readContent(tag.name, content)) return false;
    if (tag.name == "key") return addKey(content);
    if (tag.name == "string") return addValue(common_.string(content));
    if (tag.name == "integer") return addParsed(integerOf(content), "not an integer");
    if (tag.name == "true" || tag.name == "false") {
      if (!content.empty()) return fail("there is text in a boolean");
      return addValue(KvBoolean::of(tag.name == "true"));
    }
    if (tag.name == "real") return addParsed(realFromText(content), "not a real number");
    if (tag.name == "date") return addParsed(dateFromText(content), "not a date");
    if (tag.name == "data") return addParsed(dataFromText(content), "not base64 data");
    return fail("unknown element");
  }

  // Whether the innermost container is a part of an object, or one itself.
  bool isBuilding() const {
    return !stack_.empty() && (stack_.back().array || stack_.back().dictionary);
  }

  bool openContainer(const Tag& tag, KvType type) {
    if (stack_.size() == static_cast<std::size_t>(kMaximumDepth)) {
      return fail(kTooDeep);
    }
    // Refused now, although the value is added at the closing tag.
    if (!stack_.empty() && stack_.back().lacksKey()) {
      return fail("a value in a dictionary has no key");
    }
    Frame frame{type, nullptr, nullptr, nullptr};
    const bool isBuilding = this->isBuilding();
    if (!isBuilding && !receiver_.wantsObject()) {
      receiver_.beginContainer(type);
    } else {
      if (!isBuilding) {
        objectStart_ = tagStart_;
        objectsBefore_ = objects_ - 1;
      }
      if (type == KvType::Array) {
        frame.array = KvArray::create();
      } else {
        frame.dictionary = KvDictionary::create();
      }
    }
    stack_.push_back(std::move(frame));
    return !tag.empty || closeContainer(tag.name);
  }

  bool closeContainer(std::string_view name) {
    if (stack_.empty() || name != (stack_.back().type == KvType::Array ? "array" : "dict")) {
      return fail("a closing tag does not match");
    }
    if (stack_.back().hasKey) return fail("a key in a dictionary has no value");
    Frame frame = std::move(stack_.back());
    stack_.pop_back();
    if (frame.array) return addValue(std::move(frame.array));
    if (frame.dictionary) {
      if (!stack_.empty() && !isBuilding() && objectStart_ != kNone) {
        repeated_.remember(text_.substr(objectStart_, position_ - objectStart_), frame.dictionary,
                           objects_ - objectsBefore_, stack_.size());
      }
      return addValue(std::move(frame.dictionary));
    }
    if (!stack_.empty()) stack_.back().hasKey = false;
    receiver_.endContainer();
    return true;
  }

  // Reads to the closing tag. The content lies in the document, or in content_ when it differs.
  bool readContent(std::string_view name, std::string_view& content) {
    bool plain = true;
    content_.clear();
    for (;;) {
      const std::size_t end = text_.find('<', position_);
      if (end == kNone) return fail("the document ends too early");
      const std::string_view piece = text_.substr(position_, end - position_);
      const bool raw = piece.find('&') == kNone && piece.find('\r') == kNone;
      const bool last = text_.substr(end).starts_with("</");
      if (plain && raw && last) {
        content = piece;
      } else {
        plain = false;
        const auto unescaped = unescapeXml(piece);
        if (!unescaped) return fail("a reference is unknown or not well formed");
        content_ += *unescaped;
        content = content_;
      }
      position_ = end;
      if (last) break;
      if (!skipInsideContent()) return false;
    }
    Tag tag;
    if (!readTag(tag)) return false;
    return tag.name == name || fail("a closing tag does not match");
  }

  bool skipInsideContent() {
    if (take("<!--")) return skipPast("-->", "a comment has no end");
    if (!take("<![CDATA[")) return fail("there is an element inside a plain value");
    const std::size_t start = position_;
    if (!skipPast("]]>", "a character-data section has no end")) return false;
    const std::string_view section = text_.substr(start, position_ - 3 - start);
    for (std::size_t i = 0; i < section.size(); ++i) {
      const bool lineEnd = section[i] == '\r';  // alone or with a newline: one newline
      if (lineEnd && section.substr(i + 1).starts_with('\n')) continue;
      content_ += lineEnd ? '\n' : section[i];
    }
    return true;
  }

  KvRef<KvNumber> integerOf(std::string_view content) {
    std::size_t value = 0;
    for (const char character : content) {
      if (character < '0' || character > '9' || content.size() > 2) return integerFromText(content);
      value = value * 10 + static_cast<std::size_t>(character - '0');
    }
    if (content.empty()) return nullptr;
    return common_.smallInteger(value);
  }

  bool addKey(std::string_view content) {
    if (stack_.empty() || stack_.back().type != KvType::Dictionary) {
      return fail("a key outside of a dictionary");
    }
    Frame& frame = stack_.back();
    if (frame.hasKey) return fail("a key in a dictionary has no value");
    frame.hasKey = true;
    if (frame.dictionary) {
      frame.key = common_.string(content);
    } else {
      receiver_.key(content);
    }
    return true;
  }

  template <class T>
  bool addParsed(KvRef<T> value, const char* problem) {
    if (!value) return fail(problem);
    return addValue(std::move(value));
  }

  bool addValue(KvRef<KvObject> value) {
    if (stack_.empty()) {
      receiver_.value(std::move(value));
      return true;
    }
    Frame& frame = stack_.back();
    if (frame.lacksKey()) return fail("a value in a dictionary has no key");
    frame.hasKey = false;
    if (frame.array) {
      frame.array->append(std::move(value));
    } else if (frame.dictionary) {
      frame.dictionary->set(std::exchange(frame.key, nullptr), std::move(value));
    } else {
      receiver_.value(std::move(value));
    }
    return true;
  }

  DocumentWindow& window_;
  std::string_view text_;         // what the window shows
  const PlistEncoding encoding_;  // of the document; the text is UTF-8
  PlistReceiver& receiver_;
  std::size_t position_ = 0;  // in the text
  const char* problem_ = "";
  bool wrapped_ = false;  // in a plist element
  std::size_t objects_ = 0;
  std::string content_;
  std::vector<Frame> stack_;
  std::size_t tagStart_ = 0;
  // Of the object that is built for the receiver; none once the window has moved.
  std::size_t objectStart_ = kNone;
  std::size_t objectsBefore_ = 0;
  RepeatedElements repeated_;
  CommonValues common_;
};

}  // namespace

bool isUtf16Plist(std::string_view document) {
  return document.starts_with(kBigEndianMark) || document.starts_with(kLittleEndianMark);
}

Status readXmlPlist(DocumentWindow& window, PlistReceiver& receiver) {
  return Reader(window, PlistEncoding::Utf8, receiver).read();
}

Status readUtf16Plist(std::string_view document, std::size_t maximumBytes,
                      PlistReceiver& receiver) {
  const auto order = document.starts_with(kBigEndianMark) ? std::endian::big : std::endian::little;
  document.remove_prefix(kBigEndianMark.size());
  std::string text;
  text.reserve(document.size() / 2);
  if (!appendUtf16(text, std::as_bytes(std::span(document)), order)) {
    return errorInLine(countLines(text), "half of a UTF-16 character is missing");
  }
  if (text.size() > maximumBytes) return plistTooLarge(maximumBytes);
  DocumentWindow window(text);
  return Reader(window, PlistEncoding::Utf16, receiver).read();
}

}  // namespace tally
