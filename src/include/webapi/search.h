#pragma once

#include <string>
#include <unordered_map>

#include "webapi/seeker_api.h"

namespace maruseeker::webapi {

/// "search": the hits of a query, a page at a time, enriched for the user who asks.
class SearchAPI : public SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override;
  /// Leaves the keyword to the user's history, in a child process, and searches.
  void Execute() override;
  /// Adds to each hit what only the file server knows.
  void FormOutput() override;
  /// Asks the daemon. One query runs per query id: a newer one kills an older one.
  virtual void Search();

 private:
  using OwnerNames = std::unordered_map<std::uint32_t, std::string>;

  void FillIndice(const Json::Value& share_names);
  bool Admits(const Json::Value& share_name) const;
  void RecordHistory() const;
  void AnswerNothing();
  bool TakeOver(const std::string& query_info_file) const;
  Json::Value RequestToDaemon() const;
  void FillOwners();
  void FillIsMountPoint();

  /// The page: hits before it, and hits on it.
  int from_ = 0;
  int size_ = 0;
  /// Counts the client's queries: the highest is the latest.
  int query_serial_ = 0;
  bool has_criteria_ = false;
  std::string keyword_;
  std::string file_type_;
  std::string agent_;
  /// The client's id for its queries; empty: none, and no query ends another.
  std::string query_id_;
  Json::Value criteria_list_;
  /// Index ids of the shares to search.
  Json::Value indice_;
  /// What of the daemon's request is known from the parameters: "fields", "filters".
  Json::Value data_;
  /// Null: no fragments asked for.
  Json::Value highlight_;
  Json::Value search_weight_list_;
};

bool CheckSearchParams(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
