#include <errno.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <mutex>

#include "system/accounts.h"
#include "system/config.h"
#include "system/keep_errno.h"
#include "system/log.h"
#include "system/samba.h"
#include "system/share_acls.h"
#include "system/share_table.h"
#include "system/throw_errno.h"
#include "system/whole_file.h"

namespace maru {
namespace {

constexpr std::size_t kMaxFile = 64u << 20;
constexpr std::chrono::minutes kReadAgain{1};

/// What tells one state of a file from another.
struct Stamp {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  std::int64_t modified = 0;
  std::int64_t changed = 0;

  friend bool operator==(const Stamp&, const Stamp&) = default;
};

std::int64_t Nanoseconds(const timespec& time) {
  return std::int64_t{time.tv_sec} * 1'000'000'000 + time.tv_nsec;
}

Stamp StampOf(const std::string& path) {
  struct stat status;
  if (stat(path.c_str(), &status) != 0) return {};
  return {status.st_dev, status.st_ino, status.st_size, Nanoseconds(status.st_mtim),
          Nanoseconds(status.st_ctim)};
}

std::string ReadSettings(const Config& config) {
  if (!config.samba_config_canonical) return CanonicalSamba(config.samba_config);
  std::string text;
  if (!ReadWholeFile(config.samba_config, kMaxFile, text, Link::kFollow)) {
    ThrowErrno(config.samba_config);
  }
  return text;
}

std::string CopyPath(const Config& config) {
  return config.state_dir + "/shares.conf";
}

/// Keeps the last good settings for a start with bad ones. Only root and the service keep a copy;
/// a root without the right to write into the service's folder leaves it to the service.
void KeepCopy(const Config& config, const std::string& text) {
  const std::optional<Account> service = AccountByName(kServiceAccount);
  if (!service || (geteuid() != 0 && geteuid() != service->uid)) return;
  std::string kept;
  const std::string path = CopyPath(config);
  if (ReadWholeFile(path, kMaxFile, kept) && kept == text) return;
  if (!WriteWholeFile(path, text, 0600, service->uid) && errno != EACCES && errno != ENOENT) {
    MARU_LOG("Cannot keep a copy of the shares in %s", path.c_str());
  }
}

}  // namespace

/// The table of this process, and when to read it anew.
class ShareTableSource {
 public:
  std::shared_ptr<const ShareTable> Current() {
    const KeepErrno keep;
    const Config& config = Config::Get();
    Stamp stamp;
    if (auto table = Known(config, stamp)) return table;
    const std::lock_guard reading(reading_);
    if (auto table = Known(config, stamp)) return table;
    {
      // Other threads go on with the table there is, if any.
      const std::lock_guard lock(mutex_);
      stamp_ = stamp;
      read_again_ = std::chrono::steady_clock::now() + kReadAgain;
    }
    Read(config);
    const std::lock_guard lock(mutex_);
    return table_;
  }

  void Freeze() {
    const std::lock_guard lock(mutex_);
    frozen_ = true;
  }

 private:
  /// Null when the settings are to be read; `stamp` is then what they are now.
  std::shared_ptr<const ShareTable> Known(const Config& config, Stamp& stamp) {
    const std::lock_guard lock(mutex_);
    if (table_ && frozen_) return table_;
    stamp = StampOf(config.samba_config);
    const bool fresh = stamp == stamp_ && std::chrono::steady_clock::now() < read_again_;
    return fresh ? table_ : nullptr;
  }

  void Read(const Config& config) {
    try {
      std::string text = ReadSettings(config);
      auto table = std::make_shared<ShareTable>(ShareTable::Parse(text));
      WithholdByACL(*table);
      const bool is_same = table_ && table_->Error().empty() && text == text_ &&
                           table_->Withheld() == table->Withheld();
      if (is_same) return;
      LogWithheld(*table);
      Take(std::move(table));
      text_ = std::move(text);
      KeepCopy(config, text_);
    } catch (const std::exception& error) {
      Stay(config, error.what());
    }
  }

  static void WithholdByACL(ShareTable& table) {
    const ShareACLs acls(table.samba_state_);
    for (const ShareSettings& share : std::vector(table.shares_)) {
      const std::string reason = acls.ReasonAgainst(share.name);
      if (!reason.empty()) table.Withhold(share.name, reason);
    }
  }

  /// What was not so in the table before.
  void LogWithheld(const ShareTable& table) const {
    errno = 0;
    for (const WithheldShare& share : table.Withheld()) {
      const auto* known = table_ ? &table_->Withheld() : nullptr;
      if (known && std::ranges::count(*known, share) > 0) continue;
      MARU_LOG("Share %s is withheld from search: %s", share.name.c_str(), share.reason.c_str());
    }
  }

  void Take(std::shared_ptr<const ShareTable> table) {
    const std::lock_guard lock(mutex_);
    table_ = std::move(table);
  }

  /// Goes on with the last good table, or its copy, or none.
  void Stay(const Config& config, const std::string& why) {
    if (table_ && table_->Error() == why) return;
    errno = 0;
    MARU_LOG("The settings of the shares are not in force: %s", why.c_str());
    auto stale = std::make_shared<ShareTable>(table_ ? *table_ : Copy(config));
    stale->error_ = why;
    Take(std::move(stale));
  }

  static ShareTable Copy(const Config& config) {
    std::string text;
    if (!ReadWholeFile(CopyPath(config), kMaxFile, text)) return {};
    try {
      ShareTable table = ShareTable::Parse(text);
      WithholdByACL(table);
      return table;
    } catch (const std::exception& error) {
      errno = 0;
      MARU_LOG("%s: %s", CopyPath(config).c_str(), error.what());
      return {};
    }
  }

  /// Held by the one thread that reads, which alone changes the table and its text.
  std::mutex reading_;
  std::string text_;
  /// Guards what follows.
  std::mutex mutex_;
  bool frozen_ = false;
  std::shared_ptr<const ShareTable> table_;
  Stamp stamp_;
  std::chrono::steady_clock::time_point read_again_;
};

namespace {

ShareTableSource& Source() {
  static ShareTableSource source;
  return source;
}

}  // namespace

std::shared_ptr<const ShareTable> ShareTable::Current() {
  return Source().Current();
}

void ShareTable::Freeze() {
  Source().Freeze();
}

}  // namespace maru
