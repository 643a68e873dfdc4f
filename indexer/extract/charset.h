#pragma once

#include <optional>
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

/// Without a byte order mark, and without a last character that the end cuts off; none when that is
/// not UTF-8. Nothing but comparisons of bytes: it and TextPart are also for processes with rights.
std::optional<std::string_view> UTF8Text(std::string_view bytes);

/// Valid UTF-8, with U+FFFD for each run of other bytes. Knows no other charset.
std::string RepairUTF8(std::string_view bytes);

/// Opens every converter, so that ToUTF8 needs no files afterwards. Before the sandbox closes.
void LoadCharsets();

/// By byte order mark, else UTF-8 when it is, else `declared` (what the file says of itself; may be
/// empty or nonsense), else by statistics, else Windows-1252. What cannot be converted becomes
/// U+FFFD; the result is valid UTF-8 without byte order mark. One thread.
std::string ToUTF8(std::string_view bytes, std::string_view declared);

}  // namespace maru::extract
