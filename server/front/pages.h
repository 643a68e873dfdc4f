#pragma once

#include <map>
#include <string>

namespace maru::server {

/// One file of the search page.
struct Page {
  std::string type;
  /// With its quotes.
  std::string etag;
  std::string body;
};

/// The search page's files, held in memory: what is not here cannot be asked for, whatever the
/// path.
class Pages {
 public:
  /// Reads all regular files below `folder`, without following symbolic links; names that begin
  /// with a dot are left out. What cannot be read, or is beyond the limits, is logged and left out.
  static Pages Load(const std::string& folder);

  /// The file at an URL path ("/" is index.html), or null.
  const Page* Find(const std::string& path) const;

  static constexpr std::size_t kMaxFile = 4u << 20;
  static constexpr std::size_t kMaxFiles = 500;

 private:
  std::map<std::string, Page> pages_;
};

}  // namespace maru::server
