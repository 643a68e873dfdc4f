#pragma once

#include "webapi/seeker_api.h"

namespace maruseeker::webapi {

/// "boost": tells the daemon that the user opened a file of the results. The daemon's answer is
/// read and dropped; no right on the file is asked for.
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
