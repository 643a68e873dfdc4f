#include <array>

#include "daemon/commands/commands.h"
#include "daemon/core/commands.h"

namespace maru::daemon {

std::span<const Command> Commands() {
  static constexpr std::array kTable = {
      Command{"explain", ExplainCommand},
      Command{"highlight", HighlightCommand},
      Command{"indicate", IndicateCommand},
      Command{"list_term_sugg_db", ListSuggestersCommand},
      Command{"record_spotlight_open", RecordOpenCommand},
      Command{"search", SearchCommand},
      Command{"status", StatusCommand},
      Command{"term_suggest", TermSuggestCommand},
  };
  return kTable;
}

}  // namespace maru::daemon
