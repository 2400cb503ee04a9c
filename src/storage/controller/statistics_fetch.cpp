// The statistics fetch, and the content-deletion query.
#include "storage/controller/statistics_fetch.h"

#include <array>
#include <cstdio>

#include "base/byte_reader.h"
#include "platform/platform.h"
#include "storage/controller/connection.h"
#include "storage/controller/driver_fetch.h"

namespace tally {
namespace {

bool fetchAndParse(ConnectionHandle connection, const NandExporter& exporter,
                   SPXParseContext* context) {
  const std::uint32_t* selectors = nullptr;
  if (exporter.statsSelectors != nullptr) {
    selectors = exporter.statsSelectors();
    if (selectors == nullptr || selectors[0] == kSelectorUnavailable) return false;
  }
  DriverFetch fetch(connection, exporter, selectors, 0);
  if (const RegistryResult status = fetch.querySize()) {
    std::fprintf(stderr, "HwConnectCallStructMethod: %d", static_cast<std::int32_t>(status));
    return false;
  }
  if (!fetch.allocate()) {
    std::fprintf(stderr, "Could not valloc %lld bytes", static_cast<long long>(fetch.size()));
    return false;
  }
  if (fetch.readData() != kRegistrySuccess) {
    std::fprintf(stderr, "Could not retrieve data from driver for selector %x\n",
                 selectors != nullptr ? selectors[1] : 0);
    return false;
  }
  if (exporter.parseBuffer(context, fetch.data().data(), fetch.data().size()) != 0) return true;
  // The records before a fault are discarded: the caller's context is empty again.
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
