#include "system/host_rules.h"

#include <arpa/inet.h>

#include <algorithm>
#include <charconv>
#include <optional>
#include <span>
#include <stdexcept>
#include <string_view>

#include "system/text.h"

namespace maru {
namespace {

using List = std::span<const std::string>;
using Bytes = std::vector<unsigned char>;

bool IsExcept(const std::string& entry) {
  return SameWord(entry, "EXCEPT");
}

bool IsAll(const std::string& entry) {
  return SameWord(entry, "ALL");
}

/// 4 bytes or 16; none for what is no address.
Bytes BytesOf(const std::string& address) {
  Bytes bytes(16);
  if (inet_pton(AF_INET6, address.c_str(), bytes.data()) == 1) return bytes;
  bytes.resize(4);
  if (inet_pton(AF_INET, address.c_str(), bytes.data()) != 1) bytes.clear();
  return bytes;
}

/// Of a number of bits in one or two digits, or an address in more; none for any other.
Bytes MaskOf(const std::string& text, std::size_t size) {
  if (text.size() > 2) return BytesOf(text);
  unsigned int bits = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), bits);
  const bool is_octal = text.size() > 1 && text[0] == '0';
  // Of IPv6 Samba compares whole bytes only.
  const bool is_kept = bits <= 8 * size && (size == 4 || bits % 8 == 0);
  if (error != std::errc() || end != text.data() + text.size() || is_octal || !is_kept) return {};
  Bytes mask(size);
  for (unsigned int bit = 0; bit < bits; ++bit) mask[bit / 8] |= 0x80 >> bit % 8;
  return mask;
}

struct Network {
  Bytes address, mask;

  bool Has(const Bytes& client) const {
    if (client.size() != address.size()) return false;
    for (std::size_t i = 0; i < client.size(); ++i) {
      if ((client[i] ^ address[i]) & mask[i]) return false;
    }
    return true;
  }
};

/// IPv4 in IPv6 is IPv4 here.
std::string Unmapped(const std::string& entry) {
  constexpr std::string_view kMapped = "::ffff:";
  return SameWord(entry.substr(0, kMapped.size()), kMapped) ? entry.substr(kMapped.size()) : entry;
}

/// Of IPv4 in IPv6 Samba makes a network of each.
std::optional<Network> NetworkOf(const std::string& entry) {
  const std::size_t slash = entry.find('/');
  if (slash == entry.npos || Unmapped(entry) != entry) return std::nullopt;
  Network network{BytesOf(entry.substr(0, slash)), {}};
  network.mask = MaskOf(entry.substr(slash + 1), network.address.size());
  if (network.address.empty() || network.mask.size() != network.address.size()) return std::nullopt;
  return network;
}

/// "192.168."
bool IsPrefix(std::string_view entry) {
  return !entry.starts_with('.') && entry.ends_with('.') &&
         entry.find_first_not_of("0123456789.") == entry.npos;
}

/// "localhost" is a name, too, and no client's address; but everybody's lists have it.
bool IsJudged(const std::string& entry) {
  const std::string plain = Unmapped(entry);
  return IsAll(entry) || IsExcept(entry) || SameWord(entry, "localhost") || IsPrefix(plain) ||
         !BytesOf(plain).empty() || NetworkOf(entry);
}

bool Matches(const std::string& entry, const ClientAddress& client) {
  const std::string plain = Unmapped(entry);
  if (IsAll(plain) || SameWord(plain, client.Text())) return true;
  if (IsPrefix(plain)) return client.Text().starts_with(plain);
  const std::optional<Network> network = NetworkOf(entry);
  return network && network->Has(BytesOf(client.Text()));
}

/// What stands behind the first EXCEPT, further ones included, are exceptions.
bool IsOn(List list, const ClientAddress& client) {
  const auto matches = [&](const std::string& entry) { return Matches(entry, client); };
  const auto except = std::ranges::find_if(list, IsExcept);
  return std::any_of(list.begin(), except, matches) && std::none_of(except, list.end(), matches);
}

}  // namespace

bool HostRules::AdmitAll() const {
  if (allow.empty()) return deny.empty();
  return std::ranges::any_of(allow, IsAll) && std::ranges::none_of(allow, IsExcept);
}

void HostRules::Check() const {
  if (AdmitAll()) return;
  for (const auto* list : {&allow, &deny}) {
    for (const std::string& entry : *list) {
      if (IsJudged(entry)) continue;
      throw std::runtime_error("\"hosts allow\" or \"hosts deny\" name " + entry.substr(0, 200) +
                               ", which no address tells");
    }
  }
}

bool HostRules::Admit(const ClientAddress& client) const {
  if (AdmitAll()) return true;
  if (client.Text().empty()) return false;
  if (IsOn(allow, client)) return true;
  const bool is_loopback = client.Text() == "127.0.0.1" || client.Text() == "::1";
  if (deny.empty() && !is_loopback) return false;
  return !IsOn(deny, client);
}

}  // namespace maru
