#pragma once

#include <string>
#include <vector>

#include "system/client_address.h"

namespace maru {

/// Samba's "hosts allow" and "hosts deny" of one section.
struct HostRules {
  std::vector<std::string> allow, deny;

  /// As Samba decides; a client of whom nothing is known only where every client is admitted.
  bool Admit(const ClientAddress& client) const;
  /// Whether no client is refused, whatever its address.
  bool AdmitAll() const;
  /// Throws std::runtime_error with the first entry that takes more than an address to judge: a
  /// name, or one that Samba reads in a way of its own.
  void Check() const;
};

}  // namespace maru
