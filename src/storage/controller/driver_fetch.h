// Fetches data from the storage driver: a call for the size, and a call for the data.
#pragma once

#include <cstddef>
#include <cstdint>
#include <new>
#include <span>

#include "platform/registry_results.h"
#include "storage/exporter.h"

namespace tally {

// A buffer that drivers can map: page-aligned, of exactly the size that was asked for.
class PageBuffer {
 public:
  PageBuffer() = default;
  ~PageBuffer() { ::operator delete(memory_, kPage); }
  PageBuffer(const PageBuffer&) = delete;
  PageBuffer& operator=(const PageBuffer&) = delete;
  // At most once. False when there is no memory.
  bool allocate(std::size_t size) noexcept;
  std::span<std::byte> bytes() const noexcept { return {static_cast<std::byte*>(memory_), size_}; }

 private:
  // The largest page size of the machines this runs on, which is aligned to all others.
  static constexpr std::align_val_t kPage{65536};
  std::size_t size_ = 0;
  void* memory_ = nullptr;
};

// One fetch, step by step, since each caller reports the steps' failures in its own words.
class DriverFetch {
 public:
  // Without selectors the driver is called without input.
  DriverFetch(ConnectionHandle connection, const NandExporter& exporter,
              const std::uint32_t* selectors, std::uint32_t flags)
      : connection_(connection), exporter_(exporter), selectors_(selectors), flags_(flags) {}

  // Both return the driver's status.
  RegistryResult querySize();
  RegistryResult readData();

  bool allocate() { return buffer_.allocate(size_); }
  std::size_t size() const { return size_; }  // as the driver announced it
  std::span<const std::byte> data() const { return buffer_.bytes().first(length_); }

 private:
  struct Call {
    std::uint32_t method, selector, flags;
  };
  std::size_t call(const Call& call, std::span<std::byte> output, RegistryResult* status);

  ConnectionHandle connection_;
  const NandExporter& exporter_;
  const std::uint32_t* selectors_;
  std::uint32_t flags_;
  std::size_t size_ = 0;
  std::size_t length_ = 0;
  PageBuffer buffer_;
};

}  // namespace tally
