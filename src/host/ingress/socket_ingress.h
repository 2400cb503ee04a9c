// The recorder's sockets and its loop.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "base/files/device_root.h"
#include "base/result.h"
#include "platform/recording/ingress.h"
#include "platform/system_log.h"

namespace tally {

struct IngressOptions {
  std::vector<std::string> udpAddresses;  // "127.0.0.1:8125", "[::1]:8125"; of own sockets alone
};

// Serves the sockets that systemd passed in; without them its own ones below the device root, which
// are removed with the object. Borrows the log. To be called before the program starts threads: it
// changes the environment and keeps SIGTERM, SIGINT and SIGHUP for run(), as long as the object
// lives. A descriptor limit below the system's maximum is raised to it.
Result<std::unique_ptr<Ingress>> openIngress(const DeviceRoot& root, const IngressOptions& options,
                                             SystemLog& log);

}  // namespace tally
