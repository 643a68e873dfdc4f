#pragma once

#include "webapi/seeker_api.h"

namespace maruseeker::webapi {

/// "highlight": fragments of one document around the keywords, for a user who may read it.
class HighlightAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  void Execute() override;

 private:
  Json::Value request_to_daemon_;
};

bool CheckHighlightParams(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
