#include "webapi/seeker_api.h"

#include "common/sdk/task.h"

namespace maruseeker::webapi {

SeekerAPI::SeekerAPI(MARU::APIRequest* request, MARU::APIResponse* response)
    : request_(request),
      response_(response),
      login_uid_(request->GetLoginUID()),
      session_id_(request->GetSessionID()),
      credentials_(request->GetLoginUserName()) {}

void SeekerAPI::Run() {
  ParseParams();
  Execute();
  FormOutput();
  if (set_success_) response_->SetSuccess(output_);
  sdk::ForkTask().DoTask([this] { PostActions(); });
}

}  // namespace maruseeker::webapi
