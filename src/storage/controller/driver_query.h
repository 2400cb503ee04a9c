// What every two-call query of the driver is made of: the request, a buffer for the answer, and a
// connection for the length of the query.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <new>
#include <span>

#include "platform/device_registry.h"
#include "storage/controller/driver_call.h"

namespace tally {

constexpr std::uint32_t kSizeQueryFlag = 1;

// The input of both calls, as the driver reads it: selector, flags, and 16 bytes of zero.
using FetchRequest = std::array<std::uint32_t, 6>;
static_assert(sizeof(FetchRequest) == 24 && std::endian::native == std::endian::little);

constexpr FetchRequest fetchRequest(std::uint32_t selector, std::uint32_t flags) {
  return {selector, flags, 0, 0, 0, 0};
}

// A buffer that drivers can map: page-aligned, of the size asked for.
class PageBuffer {
 public:
  explicit PageBuffer(std::size_t size) noexcept
      : size_(size),
        memory_(size <= kLargest ? ::operator new(size, kPage, std::nothrow) : nullptr) {}
  ~PageBuffer() { ::operator delete(memory_, kPage); }
  PageBuffer(const PageBuffer&) = delete;
  PageBuffer& operator=(const PageBuffer&) = delete;
  bool allocated() const noexcept { return memory_ != nullptr; }
  std::span<std::byte> bytes() const noexcept { return {static_cast<std::byte*>(memory_), size_}; }

 private:
  // The largest page of the machines this runs on, and so aligned to the pages of all of them.
  static constexpr std::align_val_t kPage{65536};
  // A driver may announce all that 32 bits can say; where addresses have no more, rounding up to
  // whole pages would end in a small buffer.
  static constexpr std::size_t kLargest = PTRDIFF_MAX - std::size_t(kPage);
  std::size_t size_;
  void* memory_;
};

// Takes over a service's handle and opens a connection to it: it is open, or the reason why not was
// printed. Both are given back at the end.
class QueryConnection {
 public:
  explicit QueryConnection(RegistryHandle service);
  ~QueryConnection();
  QueryConnection(const QueryConnection&) = delete;
  QueryConnection& operator=(const QueryConnection&) = delete;
  bool isOpen() const { return open_; }
  ConnectionHandle handle() const { return connection_; }

 private:
  RegistryHandle service_;
  ConnectionHandle connection_ = 0;
  bool open_ = false;
};

}  // namespace tally
