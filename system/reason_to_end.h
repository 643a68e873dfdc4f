#pragma once

namespace maru {

/// A reason why this process has to end with the request that it serves: something that outlasts
/// the request names it by its process id, or would not stand another request beside it. The reason
/// is gone when the object is. One thread.
class ReasonToEnd {
 public:
  ReasonToEnd();
  ~ReasonToEnd();
  ReasonToEnd(const ReasonToEnd&) = delete;
  ReasonToEnd& operator=(const ReasonToEnd&) = delete;

  /// Whether there is one.
  static bool Exists();
};

}  // namespace maru
