#pragma once

#include <xapian.h>

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "index/compile.h"
#include "index/directories.h"
#include "index/gate.h"
#include "index/matches.h"
#include "index/reader.h"
#include "index/texts.h"

/// What is kept from request to request.
namespace maru::index {

/// One index: its newest directory table, whose eyes have looked at it, its stored texts.
/// Thread-safe.
class SharedIndex {
 public:
  explicit SharedIndex(const std::string& folder) : texts(folder), folder_(folder) {}

  const std::string& Folder() const { return folder_; }

  /// The directory table that belongs to the state `database` is at.
  std::shared_ptr<const DirectoryTable> Table(const Xapian::Database& database);
  /// What `who` sees by that table; the last few are kept.
  std::shared_ptr<const Eyes> EyesOf(const std::shared_ptr<const DirectoryTable>& table,
                                     const Identity& who, DocumentId last);

  /// Of the documents of the state that the table belongs to; those of the newest are kept.
  std::shared_ptr<const Decoded> DecodedOf(const std::shared_ptr<const DirectoryTable>& table,
                                           DocumentId last);

  TextReader texts;

 private:
  const std::string folder_;
  std::mutex mutex_;
  std::string engine_name_;
  std::shared_ptr<const DirectoryTable> table_;
  struct Known {
    std::shared_ptr<const DirectoryTable> table;
    Identity who;
    std::shared_ptr<const Eyes> eyes;
  };
  std::vector<Known> known_;
  std::shared_ptr<const DirectoryTable> decoded_table_;
  std::shared_ptr<const Decoded> decoded_;
};

/// Tells a file from the one that took its place.
struct FileIdentity {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::int64_t changed_ns = 0;

  static FileIdentity Of(const std::string& path);
  friend bool operator==(const FileIdentity&, const FileIdentity&) = default;
};

/// Handles on some indices, opened together; one thread at a time.
class OpenIndices {
 public:
  explicit OpenIndices(std::vector<std::shared_ptr<SharedIndex>> indices);

  /// Moves all handles to the newest state. Throws the engine's errors.
  void Refresh();

  std::size_t Count() const { return shares_.size(); }
  const Xapian::Database& All() const { return all_; }
  const DirectoryTable& Table(std::size_t share) const { return *shares_[share].table; }
  SharedIndex& Index(std::size_t share) const { return *shares_[share].index; }
  const Xapian::Database& Database(std::size_t share) const { return shares_[share].database; }
  std::shared_ptr<const Eyes> EyesOf(std::size_t share, const Identity& who) const {
    return shares_[share].index->EyesOf(shares_[share].table, who,
                                        shares_[share].database.get_lastdocid());
  }
  std::shared_ptr<const Decoded> DecodedOf(std::size_t share) const {
    return shares_[share].index->DecodedOf(shares_[share].table,
                                           shares_[share].database.get_lastdocid());
  }
  const std::shared_ptr<const ShareNumbers>& Numbers() const { return numbers_; }
  /// Of the state the handles are at.
  Expansions& Widened() { return widened_; }
  const Weighing& Weights() const { return *weighing_; }

  /// Ids in `All` and ids within a share.
  std::size_t ShareOf(Xapian::docid id) const { return (id - 1) % Count(); }
  DocumentId DocumentOf(Xapian::docid id) const {
    return static_cast<DocumentId>((id - 1) / Count() + 1);
  }

 private:
  struct Share {
    std::shared_ptr<SharedIndex> index;
    Xapian::Database database;
    std::shared_ptr<const DirectoryTable> table;
    FileIdentity folder;
    FileIdentity version;
  };
  std::vector<Share> shares_;
  Xapian::Database all_;
  std::shared_ptr<const ShareNumbers> numbers_;
  Expansions widened_;
  std::optional<Weighing> weighing_;
};

}  // namespace maru::index
