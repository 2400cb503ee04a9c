#include "host/ingress/datagram_receiver.h"

#include <fmt/core.h>
#include <linux/sock_diag.h>
#include <sys/mman.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <optional>
#include <string_view>
#include <utility>

namespace tally {
namespace {

constexpr std::size_t kPage = 4096;
// Slots that began at multiples of a large power of two would share few sets of the caches. A
// common datagram (up to 2 KiB) stays within the first page of its slot.
constexpr std::size_t kStride = DatagramReceiver::kLongestDatagram + kPage;
constexpr std::size_t kStagger = 64, kStaggers = 32;
constexpr std::size_t kCommonDatagram = kPage - kStagger * kStaggers;
static_assert(kStagger * kStaggers <= kPage);

// What the kernel dropped so far; 0 if it does not say.
std::uint32_t droppedSoFar(int socket) {
  std::uint32_t values[SK_MEMINFO_VARS] = {};
  socklen_t size = sizeof values;
  if (::getsockopt(socket, SOL_SOCKET, SO_MEMINFO, values, &size) != 0) return 0;
  return values[SK_MEMINFO_DROPS];
}

template <class Value>
std::optional<Value> controlValue(const msghdr& header, int type) {
  const cmsghdr* const first = CMSG_FIRSTHDR(&header);
  if (first == nullptr || first->cmsg_level != SOL_SOCKET || first->cmsg_type != type ||
      first->cmsg_len != CMSG_LEN(sizeof(Value))) {
    return std::nullopt;
  }
  Value value;
  std::memcpy(&value, CMSG_DATA(first), sizeof value);
  return value;
}

// Whether the socket's queue holds so many datagrams as DrainPace asks for.
bool isDeep(const ListeningSocket& socket) {
  // Of small UDP datagrams, each of which takes 768 bytes in the kernel; large ones come slower.
  constexpr int kDeepBuffer = 768 * DrainPace::kDeepQueue;
  int size = 0;
  socklen_t length = sizeof size;
  if (!socket.hasCredentials) {
    return ::getsockopt(socket.descriptor.get(), SOL_SOCKET, SO_RCVBUF, &size, &length) == 0 &&
           size >= kDeepBuffer;
  }
  // What the socket got when it was made; systemd raises it before it makes any.
  const auto text = readFile("/proc/sys/net/unix/max_dgram_qlen", 64);
  int queue = 0;
  if (text) (void)std::from_chars(text->data(), text->data() + text->size(), queue);
  return queue >= DrainPace::kDeepQueue;
}

// A datagram that was queued before credentials were asked for has neither process nor user.
bool isKnown(const ucred& credentials) {
  constexpr uid_t kOverflowUser = 65534;
  return credentials.pid != 0 || credentials.uid != kOverflowUser;
}

}  // namespace

Result<DatagramReceiver> DatagramReceiver::create(PollSet& poll) {
  void* const slab = ::mmap(nullptr, kSlots * kStride, PROT_READ | PROT_WRITE,
                            MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
  if (slab == MAP_FAILED) return systemError("cannot map", "memory for datagrams");
  // A large page for each slot would make all of the slab memory in use.
  (void)::madvise(slab, kSlots * kStride, MADV_NOHUGEPAGE);
  return DatagramReceiver(poll, static_cast<std::byte*>(slab));
}

DatagramReceiver::DatagramReceiver(PollSet& poll, std::byte* slab)
    : poll_(poll), headers_(std::make_unique<Headers>()), slab_(slab) {
  for (std::size_t i = 0; i < kSlots; ++i) {
    headers_->buffers[i] = {slab_ + i * kStride + i % kStaggers * kStagger, kLongestDatagram};
    msghdr& header = headers_->messages[i].msg_hdr;
    header.msg_iov = &headers_->buffers[i];
    header.msg_iovlen = 1;
    header.msg_control = headers_->controls[i].bytes;
    header.msg_controllen = kControlSize;
  }
}

DatagramReceiver::DatagramReceiver(DatagramReceiver&& other) noexcept
    : poll_(other.poll_),
      sockets_(std::move(other.sockets_)),
      headers_(std::move(other.headers_)),
      slab_(std::exchange(other.slab_, nullptr)),
      holdsMemory_(other.holdsMemory_) {}

DatagramReceiver::~DatagramReceiver() {
  if (slab_ != nullptr) ::munmap(slab_, kSlots * kStride);
}

bool DatagramReceiver::add(const ListeningSocket& socket) {
  const int descriptor = socket.descriptor.get();
  const auto index = static_cast<std::uint32_t>(sockets_.size());
  sockets_.push_back({descriptor, socket.hasCredentials, droppedSoFar(descriptor), isDeep(socket)});
  return poll_.add(descriptor, {PollTag::Kind::Datagrams, index});
}

void DatagramReceiver::releaseMemory() {
  (void)::madvise(slab_, kSlots * kStride, MADV_DONTNEED);
  holdsMemory_ = false;
}

// Fills slots until the socket is empty, or there is enough work for once.
Result<std::size_t> DatagramReceiver::receive(const Socket& socket) {
  constexpr unsigned kBatch = 64;
  constexpr std::size_t kEnoughBytes = 1u << 20;
  constexpr std::size_t kFewSlots = 16;
  static_assert(kSlots % kBatch == 0);
  std::size_t count = 0, bytes = 0;
  while (count < kSlots && bytes < kEnoughBytes) {
    mmsghdr* const batch = &headers_->messages[count];
    const int received = retried(
        [&] { return ::recvmmsg(socket.descriptor, batch, kBatch, MSG_DONTWAIT, nullptr); });
    if (received < 0 && (errno == EAGAIN || errno == ENOMEM || errno == ENOBUFS)) break;
    if (received < 0) return systemError("cannot read from", "a datagram socket");
    for (int i = 0; i < received; ++i) {
      bytes += batch[i].msg_len;
      if (batch[i].msg_len > kCommonDatagram) holdsMemory_ = true;
    }
    count += static_cast<std::size_t>(received);
    if (static_cast<unsigned>(received) < kBatch) break;
  }
  if (count > kFewSlots) holdsMemory_ = true;
  return count;
}

void DatagramReceiver::handOver(Socket& socket, mmsghdr& message, IngressHandler& handler) {
  msghdr& header = message.msg_hdr;
  Sender sender;
  bool known = true;
  if (socket.hasCredentials) {
    const auto credentials = controlValue<ucred>(header, SCM_CREDENTIALS);
    known = credentials && isKnown(*credentials);
    if (known) sender.user = credentials->uid;
  } else if (const auto dropped = controlValue<std::uint32_t>(header, SO_RXQ_OVFL)) {
    const std::uint32_t more = *dropped - std::exchange(socket.dropped, *dropped);
    if (more != 0) handler.onLoss(IngressLoss::SocketOverflow, sender, more);
  }
  std::string_view lines(static_cast<const char*>(header.msg_iov->iov_base), message.msg_len);
  const bool truncated = (header.msg_flags & MSG_TRUNC) != 0;
  header.msg_controllen = kControlSize;
  header.msg_flags = 0;
  if (!known) return handler.onLoss(IngressLoss::NoCredentials, sender, 1);
  if (truncated) {
    handler.onLoss(IngressLoss::Truncated, sender, 1);
    lines = lines.substr(0, lines.rfind('\n') + 1);  // none: nothing
  }
  if (!lines.empty()) handler.onLines(sender, lines);
}

Result<std::size_t> DatagramReceiver::drain(Socket& socket, IngressHandler& handler) {
  const auto count = receive(socket);
  if (!count) return count;
  for (std::size_t i = 0; i < *count; ++i) handOver(socket, headers_->messages[i], handler);
  return count;
}

Status DatagramReceiver::serve(std::uint32_t index, std::int64_t now, IngressHandler& handler) {
  Socket& socket = sockets_[index];
  const auto count = drain(socket, handler);
  if (!count) return count.error();
  const std::int64_t pause = socket.isDeep ? socket.pace.pauseAfter(*count, now) : 0;
  const PollTag tag{PollTag::Kind::Datagrams, index};
  if (pause > 0) {
    if (!socket.pausedUntil && !poll_.change(socket.descriptor, tag, 0)) return Done{};
    // If slots ran out, the rest is read without a pause.
    socket.pausedUntil = *count == kSlots ? now : now + pause;
  } else if (std::exchange(socket.pausedUntil, std::nullopt)) {
    if (!poll_.change(socket.descriptor, tag, EPOLLIN)) socket.pausedUntil = now;
  }
  return Done{};
}

Status DatagramReceiver::servePaused(std::int64_t now, IngressHandler& handler) {
  for (std::uint32_t i = 0; i < sockets_.size(); ++i) {
    if (!sockets_[i].pausedUntil || *sockets_[i].pausedUntil > now) continue;
    if (auto served = serve(i, now, handler); !served) return served;
  }
  return Done{};
}

std::optional<std::int64_t> DatagramReceiver::due() const {
  std::optional<std::int64_t> first;
  for (const Socket& socket : sockets_) {
    if (socket.pausedUntil)
      first = std::min(first.value_or(*socket.pausedUntil), *socket.pausedUntil);
  }
  return first;
}

Status DatagramReceiver::serveAll(IngressHandler& handler) {
  for (Socket& socket : sockets_) {
    if (auto drained = drain(socket, handler); !drained) return drained.error();
  }
  return Done{};
}

}  // namespace tally
