#pragma once

#include "daemon/core/core.h"

/// The commands of the table, one function each.
namespace maru::daemon {

Json::Value SearchCommand(const Request& request);
Json::Value ExplainCommand(const Request& request);
Json::Value HighlightCommand(const Request& request);
Json::Value TermSuggestCommand(const Request& request);
Json::Value ListSuggestersCommand(const Request& request);
Json::Value IndicateCommand(const Request& request);
Json::Value RecordOpenCommand(const Request& request);
Json::Value StatusCommand(const Request& request);

}  // namespace maru::daemon
