#include "server/listener.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <cstring>
#include <stdexcept>
#include <string>

#include "system/throw_errno.h"

namespace maru::server {
namespace {

constexpr int kBacklog = 1024;

struct Address {
  sockaddr_storage storage{};
  socklen_t size = 0;
  bool loopback = false;
};

Address Parse(const Config& config) {
  Address result;
  const auto port = htons(static_cast<in_port_t>(config.listen_port));
  const char* text = config.listen_address.c_str();
  sockaddr_in v4{};
  sockaddr_in6 v6{};
  if (inet_pton(AF_INET, text, &v4.sin_addr) == 1) {
    v4.sin_family = AF_INET;
    v4.sin_port = port;
    result.size = sizeof(v4);
    result.loopback = (ntohl(v4.sin_addr.s_addr) >> 24) == 127;
    memcpy(&result.storage, &v4, sizeof(v4));
  } else if (inet_pton(AF_INET6, text, &v6.sin6_addr) == 1) {
    v6.sin6_family = AF_INET6;
    v6.sin6_port = port;
    result.size = sizeof(v6);
    result.loopback = IN6_IS_ADDR_LOOPBACK(&v6.sin6_addr);
    memcpy(&result.storage, &v6, sizeof(v6));
  } else {
    throw std::runtime_error("listen_address is no IP address: " + config.listen_address);
  }
  return result;
}

}  // namespace

UniqueFd OpenListener(const Config& config) {
  if (config.tls_certificate.empty() != config.tls_key.empty())
    throw std::runtime_error("tls_certificate and tls_key belong together");
  const Address address = Parse(config);
  if (!address.loopback && config.tls_certificate.empty() && !config.behind_proxy)
    throw std::runtime_error("beyond loopback (" + config.listen_address +
                             ") a certificate (tls_certificate, tls_key) is needed, or "
                             "behind_proxy = yes when a proxy holds it");
  UniqueFd listener(socket(address.storage.ss_family, SOCK_STREAM | SOCK_CLOEXEC, 0));
  CheckErrno(listener.Get() >= 0, "socket");
  const int yes = 1;
  setsockopt(listener.Get(), SOL_SOCKET, SO_REUSEADDR, &yes, sizeof(yes));
  CheckErrno(
      bind(listener.Get(), reinterpret_cast<const sockaddr*>(&address.storage), address.size) == 0,
      "bind");
  CheckErrno(listen(listener.Get(), kBacklog) == 0, "listen");
  return listener;
}

}  // namespace maru::server
