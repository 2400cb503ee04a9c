#include "host/ingress/udp_address.h"

#include <arpa/inet.h>
#include <fmt/core.h>
#include <netinet/in.h>

#include <charconv>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string_view>

#include "base/printable.h"

namespace tally {
namespace {

template <class Address>
Address as(const sockaddr_storage& storage) {
  Address address{};
  std::memcpy(&address, &storage, sizeof address);
  return address;
}

std::optional<in_port_t> parsePort(std::string_view text) {
  std::uint16_t port = 0;
  const auto [end, code] = std::from_chars(text.data(), text.data() + text.size(), port);
  if (code != std::errc{} || end != text.data() + text.size() || port == 0) return std::nullopt;
  return htons(port);
}

std::optional<UdpAddress> parseAddress(const std::string& text) {
  const std::size_t colon = text.rfind(':');
  if (colon == std::string::npos) return std::nullopt;
  const auto port = parsePort(std::string_view(text).substr(colon + 1));
  if (!port) return std::nullopt;
  const std::string host = text.substr(0, colon);
  UdpAddress parsed;
  if (host.size() > 2 && host.front() == '[' && host.back() == ']') {
    sockaddr_in6 address{};
    address.sin6_family = AF_INET6;
    address.sin6_port = *port;
    const std::string inner = host.substr(1, host.size() - 2);
    if (::inet_pton(AF_INET6, inner.c_str(), &address.sin6_addr) != 1) return std::nullopt;
    std::memcpy(&parsed.storage, &address, sizeof address);
    parsed.size = sizeof address;
  } else {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = *port;
    if (::inet_pton(AF_INET, host.c_str(), &address.sin_addr) != 1) return std::nullopt;
    std::memcpy(&parsed.storage, &address, sizeof address);
    parsed.size = sizeof address;
  }
  return parsed;
}

}  // namespace

Result<UdpAddress> parseLoopback(const std::string& text) {
  const auto parsed = text.find('\0') == std::string::npos ? parseAddress(text) : std::nullopt;
  if (!parsed) {
    return Error{fmt::format("{} is not a UDP address; write 127.0.0.1:8125 or [::1]:8125",
                             printable(text))};
  }
  if (!isLoopback(parsed->storage)) {
    return Error{
        fmt::format("UDP address {}: only loopback addresses are served, 127.0.0.0/8 and "
                    "::1",
                    addressText(parsed->storage))};
  }
  return *parsed;
}

bool isLoopback(const sockaddr_storage& address) {
  if (address.ss_family == AF_INET) {
    return (ntohl(as<sockaddr_in>(address).sin_addr.s_addr) >> 24) == 127;
  }
  if (address.ss_family != AF_INET6) return false;
  const in6_addr host = as<sockaddr_in6>(address).sin6_addr;
  return std::memcmp(&host, &in6addr_loopback, sizeof host) == 0;
}

std::string addressText(const sockaddr_storage& address) {
  char text[INET6_ADDRSTRLEN] = "?";
  if (address.ss_family == AF_INET6) {
    const auto six = as<sockaddr_in6>(address);
    ::inet_ntop(AF_INET6, &six.sin6_addr, text, sizeof text);
    return fmt::format("[{}]:{}", text, ntohs(six.sin6_port));
  }
  const auto four = as<sockaddr_in>(address);
  ::inet_ntop(AF_INET, &four.sin_addr, text, sizeof text);
  return fmt::format("{}:{}", text, ntohs(four.sin_port));
}

}  // namespace tally
