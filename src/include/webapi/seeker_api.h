#pragma once

#include <cxxabi.h>
#include <json/value.h>

#include <cstdint>
#include <string>

#include "common/common.h"
#include "common/sdk/credentials.h"
#include "platform/webapi.h"

namespace maruseeker::webapi {

/// One request of one method, from its parameters to its answer. Made on the stack of SeekerAPIRun
/// and used by one thread; acts as the login user from construction to destruction.
class SeekerAPI {
 public:
  /// Borrows both. Throws Error 503 when the process cannot act as the login user.
  SeekerAPI(MARU::APIRequest* request, MARU::APIResponse* response);
  virtual ~SeekerAPI() = default;

  /// Parses, executes, forms the output and answers it; then runs PostActions in a child process.
  /// What the first three throw ends the request: no success, no PostActions.
  virtual void Run();
  virtual void ParseParams() {}
  virtual void Execute() {}
  virtual void FormOutput() {}
  /// In the child, as the same user, with the handler as it was when the answer was given.
  virtual void PostActions() {}

 protected:
  MARU::APIRequest* request_;
  MARU::APIResponse* response_;
  /// Cleared by a handler that answers for itself.
  bool set_success_ = true;
  std::uint32_t login_uid_;
  /// The web session's.
  std::string session_id_;
  sdk::SDKCredentials credentials_;
  /// What a success answers with.
  Json::Value output_;
};

/// The entry function of a method. Nothing that a handler throws gets past it but the unwinding of
/// a cancelled thread; everything else becomes the answer, over a success already given.
template <class Handler>
void SeekerAPIRun(MARU::APIRequest* request, MARU::APIResponse* response) {
  try {
    Handler handler(request, response);
    handler.Run();
  } catch (abi::__forced_unwind&) {
    throw;
  } catch (const Error& error) {
    MARU_LOG("Error: %s", error.what());
    response->SetError(error.Code(), Json::Value());
  } catch (const std::exception& error) {
    MARU_LOG("Unknown error: %s", error.what());
    response->SetError(kErrorUnknown, Json::Value());
  } catch (...) {
    MARU_LOG("Unknown error");
    response->SetError(kErrorUnknown, Json::Value());
  }
}

}  // namespace maruseeker::webapi
