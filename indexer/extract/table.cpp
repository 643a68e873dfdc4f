#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "index/store/fields.h"
#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"

namespace maru::extract {
namespace {

constexpr std::array kExtractors = {
    Extractor{"html", " htm html xhtml shtml ", IsHtml, ExtractHtml},
    Extractor{"text", "", nullptr, ExtractPlainText},
};

/// Starts of formats that would pass for text but read as noise.
constexpr std::array<std::string_view, 5> kNotText = {"%PDF-", "%!PS", "{\\rtf", "PK\003\004",
                                                      "\320\317\021\340"};

}  // namespace

std::span<const Extractor> Extractors() {
  return kExtractors;
}

std::size_t PlainTextRow() {
  return kExtractors.size() - 1;
}

bool MayHoldText(std::string_view file_name) {
  const std::string_view kind = index::KindOfExtension(index::ExtensionOf(file_name));
  return kind != "audio" && kind != "video" && kind != "image" && kind != "archive";
}

std::size_t ChooseExtractor(std::string_view file_name, std::string_view head) {
  for (const std::string_view start : kNotText) {
    if (head.starts_with(start)) return kNoExtractor;
  }
  if (IsBinary(head)) return kNoExtractor;
  const std::string extension = " " + index::ExtensionOf(file_name) + " ";
  for (std::size_t row = 0; row < PlainTextRow(); ++row) {
    const Extractor& extractor = kExtractors[row];
    if (extractor.extensions.find(extension) != std::string_view::npos) return row;
    if (extractor.recognises && extractor.recognises(head)) return row;
  }
  return PlainTextRow();
}

std::string ReadStart(int file, std::size_t limit) {
  constexpr std::size_t kStep = 256u << 10;
  std::string bytes;
  while (bytes.size() < limit) {
    const std::size_t before = bytes.size();
    bytes.resize(std::min(limit, before + kStep));
    const ssize_t got =
        pread(file, bytes.data() + before, bytes.size() - before, static_cast<off_t>(before));
    if (got < 0 && errno != EINTR) {
      throw std::system_error(errno, std::generic_category(), "cannot read");
    }
    bytes.resize(before + static_cast<std::size_t>(std::max<ssize_t>(got, 0)));
    if (got == 0) break;
  }
  return bytes;
}

}  // namespace maru::extract
