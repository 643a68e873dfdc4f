// A plug-in whose methods misbehave in every way the web server must outlive.

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <new>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/account.h"
#include "platform/process.h"
#include "platform/webapi.h"

namespace {

using MARU::APIRequest;
using MARU::APIResponse;

int IntOf(APIRequest* request, const char* name) {
  return request->GetAndCheckInt(name, APIRequest::OPTIONAL, nullptr).Get();
}

std::string StringOf(APIRequest* request, const char* name) {
  return request->GetAndCheckString(name, APIRequest::OPTIONAL, nullptr).Get();
}

bool Accept(APIRequest*, APIResponse*) {
  return true;
}

bool RefuseWithoutText(APIRequest* request, APIResponse* response) {
  const auto text = request->GetAndCheckString("text", APIRequest::REQUIRED, nullptr);
  if (!text.IsInvalid()) return true;
  Json::Value data;
  data["name"] = "text";
  data["reason"] = text.IsSet() ? "type" : "required";
  response->SetError(120, data);
  return false;
}

/// The text, as it came and as numbers, and who is asking.
void Echo(APIRequest* request, APIResponse* response) {
  Json::Value data;
  data["text"] = StringOf(request, "text");
  for (const unsigned char byte : StringOf(request, "text")) data["bytes"].append(byte);
  data["user"] = request->GetLoginUserName();
  data["uid"] = request->GetLoginUID();
  data["is_admin"] = request->IsAdmin();
  data["session_id"] = request->GetSessionID();
  response->SetSuccess(data);
}

/// What the process of a request looks like from within; with "last", it is to end with it.
void Inspect(APIRequest* request, APIResponse* response) {
  Json::Value data;
  if (!StringOf(request, "last").empty()) {
    static const maru::ReasonToEnd last;
  }
  data["pid"] = getpid();
  data["euid_before"] = geteuid();
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd"))
    data["descriptors"].append(entry.path().filename().string());
  for (const auto& entry : std::filesystem::directory_iterator("/tmp"))
    data["tmp"].append(entry.path().filename().string());
  for (const auto& entry : std::filesystem::directory_iterator("/volume1"))
    data["shares"].append(entry.path().filename().string());
  const mode_t mask = umask(0);
  umask(mask);
  data["umask"] = mask;
  data["becomes_user"] = ResetCredentialsByName(request->GetLoginUserName(), true);
  data["euid"] = geteuid();
  data["reads_shadow"] = access("/etc/shadow", R_OK) == 0;
  response->SetSuccess(data);
}

/// Sleeps `ms` milliseconds as the user.
void Slow(APIRequest* request, APIResponse* response) {
  if (!ResetCredentialsByName(request->GetLoginUserName(), true)) return;
  usleep(static_cast<useconds_t>(IntOf(request, "ms")) * 1000);
  response->SetSuccess(IntOf(request, "ms"));
}

void Kill(APIRequest* request, APIResponse* response) {
  const int pid = IntOf(request, "pid");
  if (!ResetCredentialsByName(request->GetLoginUserName(), true)) return;
  const int result = kill(pid ? pid : getpid(), SIGKILL);
  response->SetSuccess(result == 0 ? 0 : errno);
}

void Crash(APIRequest*, APIResponse*) {
  abort();
}

void Exit(APIRequest* request, APIResponse*) {
  exit(IntOf(request, "status"));
}

void Throw(APIRequest*, APIResponse*) {
  throw std::runtime_error("nobody caught me");
}

void Silent(APIRequest*, APIResponse*) {}

void Error(APIRequest* request, APIResponse* response) {
  response->SetError(IntOf(request, "code"), Json::Value());
}

/// Leaves a process behind that lives `ms` milliseconds; "all" lets it keep every descriptor.
void Fork(APIRequest* request, APIResponse* response) {
  const bool keep = !StringOf(request, "all").empty();
  if (MLIBCProcForkEx(keep ? 0 : 1) == 0) {
    usleep(static_cast<useconds_t>(IntOf(request, "ms")) * 1000);
    _exit(0);
  }
  response->SetSuccess("forked");
}

/// Answers, and after `ms` milliseconds leaves a file behind and thinks better of it. Without `ms`:
/// whether there is the file.
void Follow(APIRequest* request, APIResponse* response) {
  constexpr const char* kFile = "/tmp/followed";
  const int milliseconds = IntOf(request, "ms");
  response->SetSuccess(milliseconds > 0 || access(kFile, F_OK) == 0);
  if (milliseconds <= 0) return;
  usleep(static_cast<useconds_t>(milliseconds) * 1000);
  close(creat(kFile, 0600));
  response->SetError(120, Json::Value());
}

void Huge(APIRequest* request, APIResponse* response) {
  response->SetSuccess(std::string(static_cast<std::size_t>(IntOf(request, "size")), 'x'));
}

/// Takes memory until there is none; at most 8 GiB, should nobody stop it.
void Hungry(APIRequest*, APIResponse* response) {
#ifdef __SANITIZE_ADDRESS__
  throw std::bad_alloc();  // an instrumented program has no limit
#endif
  std::vector<std::string> all;
  while (all.size() < 128) all.emplace_back(std::size_t{64} << 20, 'x');
  response->SetSuccess(Json::Value());
}

constexpr const char* kApi = "Test.Server";

MARU::APIRow api_table[] = {
    {kApi, 1, "echo", Echo},     {kApi, 1, "inspect", Inspect}, {kApi, 1, "slow", Slow},
    {kApi, 1, "kill", Kill},     {kApi, 1, "crash", Crash},     {kApi, 1, "exit", Exit},
    {kApi, 1, "throw", Throw},   {kApi, 1, "silent", Silent},   {kApi, 1, "error", Error},
    {kApi, 1, "fork", Fork},     {kApi, 1, "huge", Huge},       {kApi, 1, "hungry", Hungry},
    {kApi, 1, "follow", Follow}, {nullptr, 0, nullptr, nullptr}};

MARU::APICheckRow check_table[] = {{kApi, 1, "echo", RefuseWithoutText, {}},
                                   {kApi, 1, "inspect", Accept, {}},
                                   {kApi, 1, "slow", Accept, {}},
                                   {kApi, 1, "kill", Accept, {}},
                                   {kApi, 1, "crash", Accept, {}},
                                   {kApi, 1, "exit", Accept, {}},
                                   {kApi, 1, "throw", Accept, {}},
                                   {kApi, 1, "silent", Accept, {}},
                                   {kApi, 1, "error", Accept, {}},
                                   {kApi, 1, "fork", Accept, {}},
                                   {kApi, 1, "huge", Accept, {}},
                                   {kApi, 1, "hungry", Accept, {}},
                                   {kApi, 1, "follow", Accept, {}},
                                   {nullptr, 0, nullptr, nullptr, {}}};

}  // namespace

extern "C" MARU::APIRow* GetAPITable() {
  return api_table;
}
extern "C" MARU::APICheckRow* GetAPICheckTable() {
  return check_table;
}
