#include "platform/webapi.h"
#include "webapi/highlight.h"
#include "webapi/history.h"
#include "webapi/indicate.h"
#include "webapi/param_check.h"
#include "webapi/search.h"
#include "webapi/seeker_api.h"
#include "webapi/spotlight.h"
#include "webapi/term.h"

/// All that the web server sees of the plug-in.
#define MARU_EXPORT extern "C" __attribute__((visibility("default")))

namespace webapi = maruseeker::webapi;
using webapi::SeekerAPIRun;

namespace {

constexpr const char* kSearch = "MARU.Seeker.Elastic.Search";
constexpr const char* kHighlight = "MARU.Seeker.Elastic.Highlight";
constexpr const char* kTerm = "MARU.Seeker.Elastic.Term";
constexpr const char* kSpotlight = "MARU.Seeker.Elastic.Spotlight";
constexpr const char* kIndicate = "MARU.Seeker.Elastic.Indicate";
constexpr const char* kHistory = "MARU.Seeker.Elastic.SearchHistory";

}  // namespace

MARU_EXPORT MARU::APIRow gTable[];
MARU_EXPORT MARU::APICheckRow gCheckTable[];

MARU::APIRow gTable[] = {
    {kSearch, 1, "search", SeekerAPIRun<webapi::SearchAPI>},
    {kHighlight, 1, "highlight", SeekerAPIRun<webapi::HighlightAPI>},
    {kTerm, 1, "suggest", SeekerAPIRun<webapi::TermSuggestAPI>},
    {kTerm, 1, "list_avail_db", SeekerAPIRun<webapi::TermSuggestListDBAPI>},
    {kSpotlight, 1, "boost", SeekerAPIRun<webapi::SpotlightBoostAPI>},
    {kIndicate, 1, "indicate", SeekerAPIRun<webapi::IndicateAPI>},
    {kHistory, 1, "get", SeekerAPIRun<webapi::HistoryGetAPI>},
    {kHistory, 1, "delete", SeekerAPIRun<webapi::HistoryDeleteAPI>},
    {},
};

/// The rows of gTable from the last to the first, but for the pairs of one API, which keep their
/// order.
MARU::APICheckRow gCheckTable[] = {
    {kHistory, 1, "get", webapi::CheckHistoryGetParams, {}},
    {kHistory, 1, "delete", webapi::CheckHistoryDeleteParams, {}},
    {kIndicate, 1, "indicate", webapi::CheckIndicateParams, {}},
    {kSpotlight, 1, "boost", webapi::CheckSpotlightBoostParams, {}},
    {kTerm, 1, "suggest", webapi::CheckTermSuggestParams, {}},
    {kTerm, 1, "list_avail_db", webapi::AcceptAll, {}},
    {kHighlight, 1, "highlight", webapi::CheckHighlightParams, {}},
    {kSearch, 1, "search", webapi::CheckSearchParams, {}},
    {},
};

MARU_EXPORT MARU::APIRow* GetAPITable() {
  return gTable;
}
MARU_EXPORT MARU::APICheckRow* GetAPICheckTable() {
  return gCheckTable;
}
