#pragma once

#include "daemon/core.h"

/// The commands, one function each: what it returns is the reply's "data" (null: none). They throw
/// maruseeker::Error and index::Cancelled.
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
