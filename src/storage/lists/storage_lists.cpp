#include "storage/lists/storage_lists.h"

#include <cstdio>
#include <vector>

#include "base/byte_reader.h"
#include "platform/platform.h"
#include "storage/controller/driver_query.h"

namespace tally {

const ListKind kValidityList{&NandExporter::bandStatsSelectors,
                             "Validity list retrieval is not supported\n"};
const ListKind kTelemetryList{&NandExporter::telemetryListSelectors,
                              "Telemetry list retrieval is not supported\n"};
const ListKind kDefectsList{&NandExporter::defectsListSelectors,
                            "Defects list retrieval is not supported\n"};

namespace {

constexpr std::size_t kMostRequests = 5;
constexpr unsigned kRequestFlagBit = 1, kModeShift = 2;
constexpr std::uint32_t kModeMask = 0x3fc;

std::uint32_t requestFlags(bool requestFlag, std::uint32_t mode) {
  return (requestFlag ? 1u << kRequestFlagBit : 0u) | (mode << kModeShift & kModeMask);
}

// What becomes of the result of the lists before.
bool fetchList(ConnectionHandle connection, const NandExporter& exporter,
               const KvObject* characteristics, const ListRequest& wanted, std::size_t position,
               bool requestFlag) {
  const std::uint32_t* const selectors = (exporter.*wanted.kind.selectors)();
  if (selectors == nullptr || selectors[0] == kSelectorUnavailable) return false;

  const std::uint32_t flags = requestFlags(requestFlag, wanted.mode);
  FetchRequest request = fetchRequest(selectors[0], flags | kSizeQueryFlag);
  std::array<std::byte, sizeof(std::uint32_t)> sizeReply{};
  const std::uint32_t status = callStructMethod(connection, exporter.sizeMethod,
                                                std::as_bytes(std::span(request)), sizeReply)
                                   .status;
  if (status != 0) {
    std::fprintf(stderr, "HwConnectCallStructMethod failed with status 0x%x on selector index %d\n",
                 status, static_cast<int>(position));
    return true;
  }
  const std::size_t size = ByteReader(sizeReply).read<std::uint32_t>(0).value_or(0);
  if (size == 0) return true;
  const PageBuffer buffer(size);
  if (!buffer.allocated()) {
    std::fprintf(stderr, "Could not malloc %lld bytes", static_cast<long long>(size));
    return false;
  }
  request = fetchRequest(selectors[1], flags);
  const StructReply reply = callStructMethod(connection, exporter.dataMethod,
                                             std::as_bytes(std::span(request)), buffer.bytes());
  if (reply.status != 0) {
    std::fprintf(stderr, "Could not retrieve data from driver for selector %u\n", selectors[1]);
    return true;
  }
  return wanted.handler({buffer.bytes().first(reply.length), characteristics, exporter.className});
}

}  // namespace

bool fetchListsFrom(std::uint32_t connection, const NandExporter& exporter,
                    const KvObject* characteristics, std::span<const ListRequest> requests,
                    bool requestFlag) {
  if (requests.size() > kMostRequests) {
    std::fputs("Increase the size of the selectorFunctions Array", stderr);
    return false;
  }
  std::vector<const ListRequest*> supported;
  const ListKind* refused = nullptr;
  for (const ListRequest& request : requests) {
    if (exporter.*request.kind.selectors != nullptr) {
      supported.push_back(&request);
    } else if (refused != &request.kind) {  // said once for all modes of a list
      refused = &request.kind;
      std::fputs(request.kind.unsupported, stderr);
    }
  }
  bool result = true;
  for (std::size_t i = 0; i < supported.size(); ++i) {
    result =
        fetchList(connection, exporter, characteristics, *supported[i], i, requestFlag) && result;
  }
  return result;
}

bool fetchLists(std::span<const ListRequest> requests, bool requestFlag) {
  const NandExporter* exporter = nullptr;
  const RegistryHandle service = findNandExporter(&exporter);
  if (service == 0) {
    std::fputs("Could not get matching HwKit service for exporting classes\n", stderr);
    return false;
  }
  const QueryConnection connection(service);
  if (!connection.isOpen()) return false;
  const auto characteristics =
      platform().deviceRegistry->RegistrySearchProperty(service, exporter->characteristicsKey);
  if (!characteristics) {
    std::fputs("failed to create dictionary", stderr);
    return false;
  }
  return fetchListsFrom(connection.handle(), *exporter, characteristics.get(), requests,
                        requestFlag);
}

}  // namespace tally
