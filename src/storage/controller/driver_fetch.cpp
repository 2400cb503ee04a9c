#include "storage/controller/driver_fetch.h"

#include <array>

#include "base/byte_reader.h"
#include "platform/protocol/fetch_request.h"
#include "storage/controller/connection.h"

namespace tally {

bool PageBuffer::allocate(std::size_t size) noexcept {
  // A driver may announce all that 32 bits can express. Where addresses have no more bits, rounding
  // that up to whole pages would give a small buffer.
  constexpr std::size_t kLargest = PTRDIFF_MAX - std::size_t(kPage);
  size_ = size;
  if (size <= kLargest) memory_ = ::operator new(size, kPage, std::nothrow);
  return memory_ != nullptr;
}

std::size_t DriverFetch::call(const Call& call, std::span<std::byte> output,
                              RegistryResult* status) {
  FetchRequestBytes request;
  std::span<const std::byte> input;
  if (selectors_ != nullptr) {
    request = encodeFetchRequest({call.selector, call.flags});
    input = request;
  }
  const StructReply reply = callStructMethod(connection_, call.method, input, output);
  *status = reply.status;
  return reply.length;
}

RegistryResult DriverFetch::querySize() {
  const std::uint32_t selector = selectors_ != nullptr ? selectors_[0] : 0;
  std::array<std::byte, sizeof(std::uint32_t)> reply{};
  RegistryResult status = kRegistrySuccess;
  call({exporter_.sizeMethod, selector, flags_ | FetchRequest::kSizeQueryFlag}, reply, &status);
  size_ = ByteReader(reply).read<std::uint32_t>(0).value_or(0);
  return status;
}

RegistryResult DriverFetch::readData() {
  const std::uint32_t selector = selectors_ != nullptr ? selectors_[1] : 0;
  RegistryResult status = kRegistrySuccess;
  length_ = call({exporter_.dataMethod, selector, flags_}, buffer_.bytes(), &status);
  return status;
}

}  // namespace tally
