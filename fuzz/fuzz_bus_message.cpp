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
  fakes::FakeSystemLog log;
  const auto applications = makeAppInformation(log, *list);
  require(applications->size() <= list->size(), "no application is made up");
  for (const auto& application : *applications) {
    require(kvCast<KvDictionary>(application.get())->size() == 5, "an application is whole");
  }
}

// Appends values of any types, also of those that have no counterpart here.
class AnyMessage {
 public:
  AnyMessage(sd_bus_message* message, fuzz::Input& input) : message_(message), input_(input) {}

  void appendDictionary() { appendArray("{sv}", 0); }

 private:
  void appendVariant(int depth) {
    constexpr const char* kTypes[] = {"y", "b",  "n",  "q",   "i",     "u",    "x",   "t",
                                      "d", "s",  "o",  "g",   "{yv}",  "(sv)", "v",   "av",
                                      "h", "ay", "as", "aay", "a{sv}", "ax",   "aax", "aa{sv}"};
    constexpr int kDeepest = 24;  // more than the reader follows
    const std::string type =
        kTypes[depth < kDeepest ? input_.take<std::uint8_t>() % std::size(kTypes) : 0];
    if (type == "{yv}") {
      ::sd_bus_message_append(message_, "v", "a{yv}", 1, 7, "s", "of no text");
    } else if (type == "(sv)") {
      ::sd_bus_message_append(message_, "v", "a(sv)", 1, "a", "i", 7);
    } else if (type == "h") {
      ::sd_bus_message_append(message_, "v", "h", STDIN_FILENO);
    } else {
      ::sd_bus_message_open_container(message_, 'v', type.c_str());
      appendOne(type, depth + 1);
      ::sd_bus_message_close_container(message_);
    }
  }

  void appendOne(const std::string& type, int depth) {
    if (type == "v") return appendVariant(depth);
    if (type[0] == 'a') return appendArray(type.substr(1), depth);
    if (type == "s" || type == "o" || type == "g") return appendText(type[0]);
    const auto bits = type == "b" ? input_.take<std::uint8_t>() % 2 : input_.take<std::uint64_t>();
    ::sd_bus_message_append_basic(message_, type[0], &bits);
  }

  void appendArray(const std::string& element, int depth) {
    ::sd_bus_message_open_container(message_, 'a', element.c_str());
    for (int left = input_.take<std::uint8_t>() % 16; left > 0 && !input_.empty(); --left) {
      if (element != "{sv}") {
        appendOne(element, depth + 1);
        continue;
      }
      ::sd_bus_message_open_container(message_, 'e', "sv");
      appendText('s');
      appendVariant(depth + 1);
      ::sd_bus_message_close_container(message_);
    }
    ::sd_bus_message_close_container(message_);
  }

  void appendText(char type) {
    const std::string text(input_.takeText(input_.take<std::uint8_t>() % 64));
    const char* const fallback = type == 'o' ? "/o" : "s";
    if (::sd_bus_message_append_basic(message_, type, text.c_str()) < 0) {
      ::sd_bus_message_append_basic(message_, type, fallback);
    }
  }

  sd_bus_message* message_;
  fuzz::Input& input_;
};

}  // namespace

FUZZ_TARGET(bus_message)(const std::uint8_t* data, std::size_t size) {
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
