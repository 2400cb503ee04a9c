// Connections to the storage driver: for the length of one query, and to keep open.
#include "storage/controller/connection.h"

#include <algorithm>
#include <cstdio>

#include "platform/platform.h"
#include "storage/exporter.h"

namespace tally {

StructReply callStructMethod(std::uint32_t connection, std::uint32_t method,
                             std::span<const std::byte> input, std::span<std::byte> output) {
  MethodCall call;
  call.structInput = input;
  call.structOutput = output;
  StructReply reply;
  reply.status = platform().deviceRegistry->ConnectionCallMethod(connection, method, call);
  reply.length = std::min(call.structOutputSize, output.size());
  return reply;
}

QueryConnection::QueryConnection(RegistryHandle service) : service_(service) {
  if (platform().deviceRegistry->ServiceOpenConnection(service, 0, &connection_) != 0) {
    std::fputs("Could not get connection to service\n", stderr);
    return;
  }
  open_ = true;
}

QueryConnection::~QueryConnection() {
  DeviceRegistry& registry = *platform().deviceRegistry;
  if (open_ && registry.ServiceCloseConnection(connection_) != 0) {
    std::fputs("Could not close connection to service\n", stderr);
  }
  registry.HandleRelease(service_);
}

std::uint32_t FNDConnect(const NandExporter** exporterOut) {
  DeviceRegistry& registry = *platform().deviceRegistry;
  const RegistryHandle service = findNandExporter(exporterOut);
  if (service == 0) {
    std::fputs("No class found", stderr);
    return 0;
  }
  ConnectionHandle connection = 0;
  const RegistryResult status = registry.ServiceOpenConnection(service, 0, &connection);
  registry.HandleRelease(service);
  if (status != 0) {
    std::fprintf(stderr, "HwServiceOpen failed for class '%s', result 0x%x\n",
                 (*exporterOut)->className, status);
    return 0;
  }
  return connection;
}

void FNDDisconnect(std::uint32_t connection) {
  if (platform().deviceRegistry->ServiceCloseConnection(connection) != 0) {
    std::fputs("closing connection to service failed\n", stderr);
  }
}

int openSPXConnection(SPXConnection* connection) {
  *connection = {};
  connection->service = findNandExporter(&connection->exporter);
  if (connection->service == 0) {
    std::fputs("Can't get SPX Connection, no matching service!\n", stderr);
    return 0;
  }
  connection->connection = FNDConnect(&connection->exporter);
  if (connection->connection != 0 && connection->exporter->statsSelectors != nullptr) return 1;
  std::fputs("Can't get SPX Connection!\n", stderr);
  closeSPXConnection(connection);
  return 0;
}

void closeSPXConnection(SPXConnection* connection) {
  if (connection->connection != 0) {
    FNDDisconnect(connection->connection);
    connection->connection = 0;
  }
  if (connection->service != 0) {
    platform().deviceRegistry->HandleRelease(connection->service);
    connection->service = 0;
  }
}

}  // namespace tally
