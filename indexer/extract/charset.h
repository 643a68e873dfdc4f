#pragma once

#include <string>
#include <string_view>

/// Bytes of any charset to UTF-8.
namespace maru::extract {

/// Whether a file that begins like this holds no text: a NUL byte (unless it is marked as UTF-16 or
/// UTF-32), or too many control characters.
bool IsBinary(std::string_view head);

/// The bytes up to the first NUL, behind which comes no text (archives that begin as a script, for
/// one); all of them when they are marked as UTF-16 or UTF-32.
std::string_view TextPart(std::string_view bytes);

/// How many bytes of the start are valid UTF-8; a last character that the end of `bytes` cuts off
/// does not count.
std::size_t Utf8Length(std::string_view bytes);

/// Whether it is UTF-8 all through but for a last character that the end cuts off.
bool IsUtf8(std::string_view bytes);

/// Cuts to at most `limit` bytes of whole UTF-8 characters.
void CutUtf8(std::string& text, std::size_t limit);

/// Opens every converter, so that ToUtf8 needs no files afterwards. Before the sandbox closes.
void LoadCharsets();

/// By byte order mark, else UTF-8 when it is, else `declared` (what the file says of itself; may be
/// empty or nonsense), else by statistics, else Windows-1252. What cannot be converted becomes
/// U+FFFD; the result is valid UTF-8 without byte order mark. One thread.
std::string ToUtf8(std::string_view bytes, std::string_view declared);

}  // namespace maru::extract
