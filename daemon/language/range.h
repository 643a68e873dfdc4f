#pragma once

#include <optional>
#include <string_view>

namespace maru::daemon {

/// Both ends belong to it; infinities where it is open.
struct Range {
  double low;
  double high;
};

/// "10", "10..20", "1.5MB..", ">100k", "<=2GiB". Units k, M, G, T (with or without B or iB, either
/// case) are powers of 1024. None when it is not of this form, or its ends are the wrong way round.
std::optional<Range> ParseSizeRange(std::string_view text);

/// "2026", "2026-03", "2026-03-01", "2026-03-01T12:30", "2026-03-01 12:30:15Z", "@1700000000":
/// each names all seconds of its year, month, day, minute or second, and may be an end of "a..b" or
/// stand behind > >= < <=. Without Z or an offset (+02:00) the server's own time zone holds.
std::optional<Range> ParseTimeRange(std::string_view text);

}  // namespace maru::daemon
