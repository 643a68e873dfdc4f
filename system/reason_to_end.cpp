#include "system/reason_to_end.h"

namespace maru {
namespace {

/// Of the whole process, whichever library the objects are in.
int reasons = 0;

}  // namespace

ReasonToEnd::ReasonToEnd() {
  ++reasons;
}

ReasonToEnd::~ReasonToEnd() {
  --reasons;
}

bool ReasonToEnd::Exists() {
  return reasons > 0;
}

}  // namespace maru
