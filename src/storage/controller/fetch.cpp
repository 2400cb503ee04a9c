// The two-call fetch of the statistics, and the content-deletion query.
#include <array>
#include <cstdio>

#include "base/byte_reader.h"
#include "platform/platform.h"
#include "storage/controller/driver_query.h"
#include "storage/exporter.h"

namespace tally {
namespace {

bool fetchAndParse(ConnectionHandle connection, const NandExporter& exporter,
                   SPXParseContext* context) {
  FetchRequest request{};
  std::span<const std::byte> input;  // without a selector the driver is asked with no input
  const std::uint32_t* selectors = nullptr;
  if (exporter.statsSelectors != nullptr) {
    selectors = exporter.statsSelectors();
    if (selectors == nullptr || selectors[0] == kSelectorUnavailable) return false;
    request = fetchRequest(selectors[0], kSizeQueryFlag);
    input = std::as_bytes(std::span(request));
  }
  std::array<std::byte, sizeof(std::uint32_t)> sizeReply{};
  const std::uint32_t status =
      callStructMethod(connection, exporter.sizeMethod, input, sizeReply).status;
  if (status != 0) {
    std::fprintf(stderr, "HwConnectCallStructMethod: %d", static_cast<std::int32_t>(status));
    return false;
  }
  const std::size_t size = ByteReader(sizeReply).read<std::uint32_t>(0).value_or(0);
  const PageBuffer buffer(size);
  if (!buffer.allocated()) {
    std::fprintf(stderr, "Could not valloc %lld bytes", static_cast<long long>(size));
    return false;
  }
  if (selectors != nullptr) request = fetchRequest(selectors[1], 0);
  const StructReply reply =
      callStructMethod(connection, exporter.dataMethod, input, buffer.bytes());
  if (reply.status != 0) {
    std::fprintf(stderr, "Could not retrieve data from driver for selector %x\n", request[0]);
    return false;
  }
  if (exporter.parseBuffer(context, buffer.bytes().data(), reply.length) != 0) return true;
  // What stands before a fault is no statistics: the caller gets its context back empty.
  SPXReleaseContext(context);
  return false;
}

bool recommendsContentDeletion() {
  const NandExporter* exporter = nullptr;
  const RegistryHandle service = findNandExporter(&exporter);
  if (exporter->contentDeletionMethod == -1) {
    if (service != 0) platform().deviceRegistry->HandleRelease(service);
    return false;
  }
  if (service == 0) {
    std::fputs("_load_nand_infoCould not get matching HwKit service for exporting classes\n",
               stderr);
    return false;
  }
  const QueryConnection connection(service);
  if (!connection.isOpen()) return false;
  std::array<std::byte, sizeof(std::uint32_t)> answer{};
  const StructReply reply = callStructMethod(
      connection.handle(), static_cast<std::uint32_t>(exporter->contentDeletionMethod), {}, answer);
  if (reply.status != 0 || reply.length < answer.size()) return false;
  return ByteReader(answer).read<std::uint32_t>(0) != 0u;
}

}  // namespace

KvRef<KvBoolean> loadNandStatistics(const NandExporter** exporterOut, SPXParseContext* context) {
  const RegistryHandle service = findNandExporter(exporterOut);
  if (service == 0) {
    std::fputs("Could not get matching HwKit service for exporting classes\n", stderr);
    return KvBoolean::of(false);
  }
  const QueryConnection connection(service);
  return KvBoolean::of(connection.isOpen() &&
                       fetchAndParse(connection.handle(), **exporterOut, context));
}

KvRef<KvBoolean> NandRecommendsContentDeletion() {
  return KvBoolean::of(recommendsContentDeletion());
}

}  // namespace tally
