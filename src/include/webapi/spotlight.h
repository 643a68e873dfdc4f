#pragma once

#include "webapi/seeker_api.h"

namespace maruseeker::webapi {

/// "boost": a file of the results was opened, which the daemon is told. What it says to that does
/// not matter; no right on the file is asked for.
class SpotlightBoostAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  void Execute() override;

 private:
  Json::Value request_to_daemon_;
};

bool CheckSpotlightBoostParams(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
