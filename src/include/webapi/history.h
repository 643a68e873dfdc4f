#pragma once

#include <string>

#include "webapi/seeker_api.h"

/// The user's own search history. Both methods work as the service's account, to which the database
/// belongs, and touch rows of the login user only.
namespace maruseeker::webapi {

/// "get": a page of the history, {"historys": [{"id", "keyword", "create_time"}], "total"}.
class HistoryGetAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  void Execute() override;

 private:
  std::string substr_;
  std::string sort_by_;
  bool asc_ = true;
  int offset_ = 0;
  int limit_ = 0;
};

/// "delete": removes rows by their ids; unknown ones and those of others are skipped.
class HistoryDeleteAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  void Execute() override;

 private:
  Json::Value id_;
};

bool CheckHistoryGetParams(MARU::APIRequest* request, MARU::APIResponse* response);
bool CheckHistoryDeleteParams(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
