#pragma once

#include "platform/marudbquery.h"

namespace maruseeker::db {

/// A row of a table whose rows belong to somebody and say something at some time.
class BaseRecord : public marudbquery::Updatable, public marudbquery::Insertable {
 public:
  ~BaseRecord() override = default;

  /// This record's row and those of an earlier time, whosever they are; of one time, the lower id
  /// is the earlier.
  virtual marudbquery::Condition NotNewer() const = 0;
  /// Rows of the same owner.
  virtual marudbquery::Condition SameOwner() const = 0;
  /// Takes every field from a fetched row. Throws what SOCI throws when a column is missing.
  virtual void FromValues(const soci::values& values) = 0;
  /// Rows of the same owner that say the same.
  virtual marudbquery::Condition SameContent() const = 0;
};

}  // namespace maruseeker::db
