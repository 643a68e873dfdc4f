#pragma once

#include "webapi/seeker_api.h"

namespace maruseeker::webapi {

/// "indicate": how many hits each file type would have.
class IndicateAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  /// Prefills the answer with 0 for each file type.
  void ParseParams() override;
  void Execute() override;

 private:
  void FindIndice();
  void AddQueries(const Json::Value& file_types);

  Json::Value request_to_daemon_;
  /// Index ids of what the user may search.
  Json::Value indice_ = Json::Value(Json::arrayValue);
};

bool CheckIndicateParams(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
