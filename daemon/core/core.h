#pragma once

#include <json/value.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "daemon/core/usage.h"
#include "index/search/library.h"
#include "system/client_address.h"
#include "system/indexed_shares.h"
#include "system/rights.h"
#include "system/share_table.h"

/// Everything a request needs, and nothing of sockets: a request goes in as a line of text, replies
/// come out through a callback.
namespace maru::daemon {

/// Where indices come from. Thread-safe.
class Indices {
 public:
  virtual ~Indices() = default;
  /// As index::Library::Open.
  virtual std::unique_ptr<index::View> Open(const std::vector<index::IndexFor>& wanted,
                                            index::IsCancelled cancelled) = 0;
  virtual bool Has(const std::string& id) const = 0;
  virtual std::vector<std::string> Ids() const = 0;
  /// As RecordedCrawlTerms of the index.
  virtual std::string CrawlTerms(const std::string&) const { return {}; }
  virtual index::Library::Kept Cached() const { return {}; }
};

/// Those on the disk.
class LibraryIndices : public Indices {
 public:
  explicit LibraryIndices(std::string path) : path_(path), library_(std::move(path)) {}
  std::unique_ptr<index::View> Open(const std::vector<index::IndexFor>& wanted,
                                    index::IsCancelled cancelled) override {
    return library_.Open(wanted, std::move(cancelled));
  }
  bool Has(const std::string& id) const override { return library_.Has(id); }
  std::vector<std::string> Ids() const override { return library_.IndexIds(); }
  std::string CrawlTerms(const std::string& id) const override {
    return RecordedCrawlTerms(path_ + "/" + id);
  }
  index::Library::Kept Cached() const override { return library_.Cached(); }

 private:
  const std::string path_;
  index::Library library_;
};

/// What all requests share; used from several threads at once.
struct Core {
  Indices& indices;
  UsageStore& usage;
  std::function<std::shared_ptr<const ShareTable>()> shares = ShareTable::Current;
  /// A user's own earlier searches, newest first. May throw.
  std::function<std::vector<std::string>(uid_t)> history = nullptr;
  /// Members that the server adds to the operators' status.
  std::function<void(Json::Value&)> server_status = nullptr;
  std::chrono::steady_clock::time_point started = std::chrono::steady_clock::now();
};

/// Takes one message, a line without its end; `last` is told with the one that has "success".
using Output = std::function<void(std::string_view message, bool last)>;
/// True when nobody waits for the answer any more, or it takes too long.
using CancelCheck = std::function<bool()>;

/// Who asks: whom the kernel names at the socket, and from where.
struct Caller {
  const Identity& identity;
  const ClientAddress& client;
};

/// One command being carried out.
struct Request {
  Core& core;
  /// Who is connected, as the kernel says.
  const Identity& caller;
  const ClientAddress& client;
  /// An object, null when empty; anything else its command refuses.
  const Json::Value& data;
  /// For replies of several messages.
  const Output& output;
  const CancelCheck& cancelled;
};

/// Carries out one line and gives every message of the reply to `output`; the last one has
/// "success". Whatever the line holds, this neither throws nor ends the process; only what `output`
/// throws on the last message comes out.
void Answer(Core& core, const Caller& caller, const std::string& line, const Output& output,
            const CancelCheck& cancelled);

/// {"success": false, "error": {"code", "msg"}}
Json::Value ErrorReply(int code, const std::string& message);

}  // namespace maru::daemon
