#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <vector>

/// From a file to its text: one table, one extractor a source file.
namespace maru::extract {

struct Extracted {
  std::string title;
  std::vector<std::string> authors;
  /// Valid UTF-8, at most the asked-for length.
  std::string text;
};

/// An open regular file, and how much of its text is wanted.
struct Source {
  int file = -1;
  std::size_t max_text = 0;
};

struct Extractor {
  std::string_view name;
  /// Lower case, each between blanks.
  std::string_view extensions;
  /// By the first bytes; null: by extension only.
  bool (*recognises)(std::string_view head);
  /// Throws any std::exception when the file cannot be understood. Runs in a process without
  /// rights: it may read the file and nothing else.
  Extracted (*extract)(const Source& source);
};

/// Rows in order of precedence; plain text, which takes all that is not binary, is last.
std::span<const Extractor> Extractors();
/// The row of plain text.
std::size_t PlainTextRow();

/// Bytes of a file's start that decide about its extractor.
inline constexpr std::size_t kHeadBytes = 4096;
inline constexpr std::size_t kNoExtractor = static_cast<std::size_t>(-1);

/// False for names whose kind (audio, video, image, archive) has no text: those are not opened.
bool MayHoldText(std::string_view file_name);
/// The row for a file, or kNoExtractor: it is found by its name only.
std::size_t ChooseExtractor(std::string_view file_name, std::string_view head);

/// Up to `limit` bytes from the start of a file. Throws std::system_error.
std::string ReadStart(int file, std::size_t limit);

Extracted ExtractPlainText(const Source& source);
bool IsHtml(std::string_view head);
Extracted ExtractHtml(const Source& source);

}  // namespace maru::extract
