// Messages of the bus: values written into one and read again, messages of any types read, and the
// list of applications that one may bring.
#include <systemd/sd-bus.h>

#include <sys/socket.h>

#include <memory>
#include <string>

#include "driver/app_info_listener.h"
#include "fakes/fake_platform.h"
#include "fuzz_values.h"
#include "host/bus/bus_message.h"

using namespace tally;
using fuzz::require;

namespace {

struct MessageDeleter {
  void operator()(sd_bus_message* message) const { ::sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, MessageDeleter>;

// A bus without anybody on it: messages are made but never sent.
sd_bus* lonelyBus() {
  static sd_bus* const bus = [] {
    int ends[2];
    sd_bus* made = nullptr;
    require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK, 0, ends) == 0 &&
                ::sd_bus_new(&made) >= 0 && ::sd_bus_set_fd(made, ends[0], ends[0]) >= 0 &&
                ::sd_bus_start(made) >= 0,
            "a bus can be made");
    return made;
  }();
  return bus;
}

Message newMessage() {
  sd_bus_message* made = nullptr;
  require(::sd_bus_message_new_method_call(lonelyBus(), &made, "a.b", "/a", "a.b", "C") >= 0,
          "a message can be made");
  return Message(made);
}

Result<KvRef<KvDictionary>> readBack(sd_bus_message* message) {
  if (::sd_bus_message_seal(message, 1, 0) < 0) return Error{"not a message"};
  ::sd_bus_message_rewind(message, 1);
  return readBusDictionary(message);
}

// Values out of a message are written and read without a change.
void checkRoundTrip(const KvDictionary& values) {
  const Message message = newMessage();
  if (!appendBusDictionary(message.get(), values)) return;
  const auto read = readBack(message.get());
  if (!read) return;  // above the limits
  const Message second = newMessage();
  require(static_cast<bool>(appendBusDictionary(second.get(), **read)), "what was read is written");
  const auto again = readBack(second.get());
  require(
      again && (kvEqual(read->get(), again->get()) || kvText(read->get()) == kvText(again->get())),
      "writing and reading changes nothing");
}

void takeApplications(const KvDictionary& message) {
  const auto* const list = message.getAs<KvArray>("app_data");
  if (list == nullptr) return;
  const auto applications = makeAppInformation(*list);
  require(applications->size() <= list->size(), "no application is made up");
  for (const auto& application : *applications) {
    require(kvCast<KvDictionary>(application.get())->size() == 5, "an application is whole");
  }
}

// Appends a value of any type whatever: also of those that have no counterpart here.
class AnyMessage {
 public:
  AnyMessage(sd_bus_message* message, fuzz::Input& input) : message_(message), input_(input) {}

  void appendDictionary() {
    ::sd_bus_message_open_container(message_, 'a', "{sv}");
    for (int left = input_.take<std::uint8_t>() % 16; left > 0 && !input_.empty(); --left) {
      ::sd_bus_message_open_container(message_, 'e', "sv");
      const std::string key(input_.takeText(input_.take<std::uint8_t>() % 16));
      ::sd_bus_message_append_basic(message_, 's', key.c_str());
      appendVariant(0);
      ::sd_bus_message_close_container(message_);
    }
    ::sd_bus_message_close_container(message_);
  }

 private:
  void appendVariant(int depth) {
    constexpr const char* kTypes[] = {"y",  "b",  "n",   "q",      "i",     "u",     "x",
                                      "t",  "d",  "s",   "o",      "g",     "h",     "v",
                                      "av", "ay", "aay", "a{sv}",  "a{yv}", "(sv)",  "a(iv)",
                                      "as", "ax", "aax", "aa{sv}", "a{ss}", "a{sas}"};
    constexpr int kDeepest = 24;  // more than the reader follows
    const auto number = depth < kDeepest ? input_.take<std::uint8_t>() : 0;
    const char* const type = kTypes[number % std::size(kTypes)];
    ::sd_bus_message_open_container(message_, 'v', type);
    appendTypes(type, depth + 1);
    ::sd_bus_message_close_container(message_);
  }

  // The values of complete types in a row.
  void appendTypes(std::string_view types, int depth) {
    while (!types.empty()) {
      const std::size_t length = lengthOfFirst(types);
      appendOne(std::string(types.substr(0, length)), depth);
      types.remove_prefix(length);
    }
  }

  static std::size_t lengthOfFirst(std::string_view types) {
    if (types[0] == 'a') return 1 + lengthOfFirst(types.substr(1));
    if (types[0] != '(' && types[0] != '{') return 1;
    return types.find(types[0] == '(' ? ')' : '}') + 1;  // none of the table nests them
  }

  void appendOne(const std::string& type, int depth) {
    switch (type[0]) {
      case 'v':
        return appendVariant(depth);
      case 'a': {
        const std::string element = type.substr(1);
        ::sd_bus_message_open_container(message_, 'a', element.c_str());
        for (int left = input_.take<std::uint8_t>() % 8; left > 0 && !input_.empty(); --left) {
          appendOne(element, depth + 1);
        }
        ::sd_bus_message_close_container(message_);
        return;
      }
      case '(':
      case '{': {
        const std::string inner = type.substr(1, type.size() - 2);
        ::sd_bus_message_open_container(message_, type[0] == '(' ? 'r' : 'e', inner.c_str());
        appendTypes(inner, depth);
        ::sd_bus_message_close_container(message_);
        return;
      }
      case 's':
      case 'o':
      case 'g':
        return appendText(type[0]);
      case 'h': {
        const int descriptor = STDIN_FILENO;
        ::sd_bus_message_append_basic(message_, 'h', &descriptor);
        return;
      }
      case 'b': {
        const int flag = input_.takeFlag() ? 1 : 0;
        ::sd_bus_message_append_basic(message_, 'b', &flag);
        return;
      }
      default: {
        const auto bits = input_.take<std::uint64_t>();
        ::sd_bus_message_append_basic(message_, type[0], &bits);
      }
    }
  }

  void appendText(char type) {
    const std::string text(input_.takeText(input_.take<std::uint8_t>()));
    const char* const fallback = type == 'o' ? "/o" : "s";
    if (::sd_bus_message_append_basic(message_, type, text.c_str()) < 0) {
      ::sd_bus_message_append_basic(message_, type, fallback);
    }
  }

  sd_bus_message* message_;
  fuzz::Input& input_;
};

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const fakes::FakePlatform fake = fakes::makeFakePlatform();
  const auto scope = fake.install();
  if (fuzz::isDocument(input.rest()) || input.takeFlag()) {
    const auto value = fuzz::valueOf(input);
    if (const auto* values = kvCast<KvDictionary>(value.get())) {
      checkRoundTrip(*values);
      takeApplications(*values);
    }
    return 0;
  }
  const Message message = newMessage();
  AnyMessage(message.get(), input).appendDictionary();
  const auto read = readBack(message.get());
  if (!read) return 0;
  checkRoundTrip(**read);
  takeApplications(**read);
  return 0;
}
