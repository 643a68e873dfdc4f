#include "server/front/pages.h"

#include <errno.h>
#include <sodium.h>

#include <filesystem>
#include <string_view>
#include <utility>

#include "system/log.h"
#include "system/whole_file.h"

namespace maru::server {
namespace {

namespace fs = std::filesystem;

constexpr std::pair<std::string_view, std::string_view> kTypes[] = {
    {".css", "text/css; charset=utf-8"},
    {".html", "text/html; charset=utf-8"},
    {".ico", "image/x-icon"},
    {".js", "text/javascript; charset=utf-8"},
    {".json", "application/json"},
    {".mjs", "text/javascript; charset=utf-8"},
    {".png", "image/png"},
    {".svg", "image/svg+xml"},
    {".txt", "text/plain; charset=utf-8"},
    {".webmanifest", "application/manifest+json"},
    {".woff2", "font/woff2"},
};

std::string TypeOf(const std::string& extension) {
  for (const auto& [known, type] : kTypes)
    if (known == extension) return std::string(type);
  return "application/octet-stream";
}

std::string TagOf(const std::string& body) {
  unsigned char digest[crypto_generichash_BYTES_MIN];
  crypto_generichash(digest, sizeof(digest), reinterpret_cast<const unsigned char*>(body.data()),
                     body.size(), nullptr, 0);
  char text[2 * sizeof(digest) + 1];
  sodium_bin2hex(text, sizeof(text), digest, sizeof(digest));
  return std::string("\"") + text + "\"";
}

bool IsHidden(const fs::path& relative) {
  for (const fs::path& part : relative)
    if (part.native().starts_with('.')) return true;
  return false;
}

}  // namespace

Pages Pages::Load(const std::string& folder) {
  Pages result;
  std::error_code error;
  for (fs::recursive_directory_iterator it(folder, error), end; !error && it != end;
       it.increment(error)) {
    std::error_code ignored;
    if (it->symlink_status(ignored).type() != fs::file_type::regular) continue;
    const fs::path relative = it->path().lexically_relative(folder);
    if (IsHidden(relative)) continue;
    Page page;
    errno = 0;
    if (result.pages_.size() >= kMaxFiles || !ReadWholeFile(it->path(), kMaxFile, page.body)) {
      MARU_LOG("The page's file %s is left out", it->path().c_str());
      continue;
    }
    page.type = TypeOf(relative.extension());
    page.etag = TagOf(page.body);
    result.pages_.emplace("/" + relative.generic_string(), std::move(page));
  }
  if (error) MARU_LOG("Cannot read the page's folder %s", folder.c_str());
  return result;
}

const Page* Pages::Find(const std::string& path) const {
  const auto found = pages_.find(path == "/" ? "/index.html" : path);
  return found == pages_.end() ? nullptr : &found->second;
}

}  // namespace maru::server
