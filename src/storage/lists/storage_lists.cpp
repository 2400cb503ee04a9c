#include "storage/lists/storage_lists.h"

#include <cstdio>
#include <vector>

#include "platform/platform.h"
#include "storage/controller/connection.h"
#include "storage/controller/driver_fetch.h"

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

// False counts as a failure of the whole dump; a list that the driver refuses does not.
bool fetchList(ConnectionHandle connection, const NandExporter& exporter,
               const KvObject* characteristics, const ListRequest& wanted, std::size_t position,
               bool requestFlag) {
  const std::uint32_t* const selectors = (exporter.*wanted.kind.selectors)();
  if (selectors == nullptr || selectors[0] == kSelectorUnavailable) return false;

  DriverFetch fetch(connection, exporter, selectors, requestFlags(requestFlag, wanted.mode));
  if (const RegistryResult status = fetch.querySize()) {
    std::fprintf(stderr, "HwConnectCallStructMethod failed with status 0x%x on selector index %d\n",
                 status, static_cast<int>(position));
    return true;
  }
  if (fetch.size() == 0) return true;
  if (!fetch.allocate()) {
    std::fprintf(stderr, "Could not malloc %lld bytes", static_cast<long long>(fetch.size()));
    return false;
  }
  if (fetch.readData() != kRegistrySuccess) {
    std::fprintf(stderr, "Could not retrieve data from driver for selector %u\n", selectors[1]);
    return true;
  }
  return wanted.handler({fetch.data(), characteristics, exporter.className});
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
    } else if (refused != &request.kind) {  // once for all modes of a list
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
