#pragma once

#include "webapi/seeker_api.h"

namespace maruseeker::webapi {

/// "suggest": terms that go on from what was typed so far.
class TermSuggestAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  void Execute() override;

 private:
  Json::Value request_to_daemon_;
};

/// "list_avail_db": what suggestions can be drawn from.
class TermSuggestListDBAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  void Execute() override;

 private:
  Json::Value request_to_daemon_;
};

bool CheckTermSuggestParams(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
