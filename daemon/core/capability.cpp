#include "daemon/core/capability.h"

#include <cap-ng.h>
#include <unistd.h>

#include "system/log.h"
#include "system/service_identity.h"

namespace maru::daemon {
namespace {

bool holds_capability = false;

void SetEffective(bool on) {
  thread_local const bool loaded = capng_get_caps_process() == 0;
  if (!loaded) return;
  capng_update(on ? CAPNG_ADD : CAPNG_DROP, CAPNG_EFFECTIVE, CAP_DAC_READ_SEARCH);
  if (capng_apply(CAPNG_SELECT_CAPS) != 0) MARU_LOG("Failed [capng_apply]");
}

}  // namespace

void BecomeDaemon(const std::string& account) {
  DropPrivileges(account, Keep::kReadSearch);
  capng_get_caps_process();
  holds_capability = capng_have_capability(CAPNG_PERMITTED, CAP_DAC_READ_SEARCH) == 1;
  if (holds_capability) SetEffective(false);
}

bool HoldsReadSearch() {
  return holds_capability || geteuid() == 0;
}

RaisedReadSearch::RaisedReadSearch() {
  if (holds_capability) SetEffective(true);
}

RaisedReadSearch::~RaisedReadSearch() {
  if (holds_capability) SetEffective(false);
}

}  // namespace maru::daemon
