#include "plugin/plugin.h"

#include <dlfcn.h>
#include <pwd.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "server/mounts.h"
#include "system/config.h"
#include "system/json.h"
#include "system/log.h"
#include "system/share_table.h"

namespace {

constexpr unsigned kService = 60000;
constexpr unsigned kAlice = 60001;
constexpr unsigned kBob = 60002;
constexpr unsigned kCarol = 60003;

constexpr const char* kShares = R"([global]
[homes]
	path = /mnt/homes/%S
	valid users = bob
	read only = No
[photo]
	path = /mnt/photo
	read only = No
[docs]
	path = /mnt/our docs
	valid users = alice
[private]
	path = /mnt/private
	valid users = bob
[deny]
	path = /mnt/deny
	maruseeker:deny = read
[unlisted]
	path = /mnt/unlisted
	maruseeker:deny = list
[hidden]
	path = /mnt/hidden
	hide unreadable = Yes
	vfs objects = recycle
)";

void* Symbol(const char* name) {
  static void* plugin = dlopen(MARU_PLUGIN, RTLD_NOW | RTLD_LOCAL);
  if (!plugin) throw std::runtime_error(dlerror());
  return dlsym(plugin, name);
}

template <class Row>
const Row& FindRow(const Row* rows, const std::string& method) {
  while (rows->api && method != rows->method) ++rows;
  if (!rows->api) throw std::invalid_argument("no method " + method);
  return *rows;
}

Json::Value Told(const MARU::APIResponse& response) {
  Json::Value told;
  told["success"] = response.IsSuccess();
  told["code"] = response.ErrorCode();
  told["data"] = response.Data();
  return told;
}

std::string ReadAll(int descriptor) {
  std::string text;
  char buffer[4096];
  ssize_t count;
  while ((count = read(descriptor, buffer, sizeof(buffer))) > 0) {
    text.append(buffer, static_cast<std::size_t>(count));
  }
  close(descriptor);
  return text;
}

void MakeFolder(const std::string& path, unsigned mode, unsigned owner) {
  mkdir(path.c_str(), mode);
  chmod(path.c_str(), mode);
  if (chown(path.c_str(), owner, owner) != 0) throw std::runtime_error(path);
}

bool EmptyFolder(const char* path) {
  mkdir(path, 0755);
  return mount("plugin_test", path, "tmpfs", 0, "mode=1777") == 0;
}

void MakeShares() {
  for (const std::string name :
       {"photo", "docs", "private", "deny", "unlisted", "hidden", "homes"}) {
    MakeFolder(name == "docs" ? "/mnt/our docs" : "/mnt/" + name, 0755, 0);
    if (name == "unlisted" || name == "hidden") continue;
    MakeFolder("/var/lib/maruseeker/index/fileindex_" + name, 0755, kService);
  }
  MakeFolder("/mnt/homes/alice", 0700, kAlice);
  MakeFolder("/mnt/homes/bob", 0700, kBob);
  MakeFolder("/mnt/photo/trip", 0755, 0);
  WriteFile("/mnt/photo/trip/a.jpg", "a");
  WriteFile("/mnt/photo/secret.txt", "s", 0600, kBob);
  WriteFile("/mnt/deny/d.txt", "d");
  WriteFile("/mnt/unlisted/u.txt", "u");
  WriteFile("/mnt/homes/alice/x.txt", "x", 0600, kAlice);
  WriteFile("/mnt/homes/bob/x.txt", "x", 0600, kBob);
}

/// As the web server does it. What is mounted on the disk later appears in the shares too, like the
/// machine's own mounts among those of the web server.
void MountShares() {
  static maru::server::ShareMounts mounts;
  if (mount(nullptr, "/mnt", nullptr, MS_SHARED, nullptr) != 0) throw std::runtime_error("/mnt");
  mounts.Apply(*maru::ShareTable::Current());
}

/// Empty, or why there can be no such world.
std::string MakeWorld() {
  const passwd* alice = getpwnam("alice");
  if (geteuid() != 0 || !alice || alice->pw_uid != kAlice) return "needs root and the sandbox";
  Symbol("gTable");  // loaded while the build can be seen: it may lie below /tmp
  if (unshare(CLONE_NEWNS) != 0 || mount("", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
      !EmptyFolder("/tmp") || !EmptyFolder("/run") || !EmptyFolder("/var/lib/maruseeker") ||
      !EmptyFolder("/mnt")) {
    return "needs the right to mount";
  }
  MakeFolder("/var/lib/maruseeker", 0755, kService);
  MakeFolder("/var/lib/maruseeker/index", 0755, kService);
  MakeShares();
  WriteFile("/run/shares.conf", kShares);
  WriteFile("/run/maruseeker.conf",
            "samba_config = /run/shares.conf\nsamba_config_canonical = yes\n");
  maru::Config::Load("/run/maruseeker.conf");
  MountShares();
  return {};
}

}  // namespace

Login Alice() {
  return {kAlice, "alice", "session-of-alice", false};
}
Login Bob() {
  return {kBob, "bob", "session-of-bob", false};
}
Login Carol() {
  return {kCarol, "carol", "session-of-carol", true};
}

Ran InChild(const std::function<Json::Value()>& work) {
  int log[2];
  const int result = memfd_create("result", MFD_CLOEXEC);
  if (result < 0 || pipe(log) != 0) throw std::runtime_error("no pipe");
  const pid_t child = fork();
  if (child == 0) {
    dup2(log[1], STDERR_FILENO);
    close(log[0]);
    close(log[1]);
    maru::OpenLog("maruseeker", true);
    umask(077);
    const std::string text = maru::json::ToString(work());
    _exit(write(result, text.data(), text.size()) < 0 ? 1 : 0);
  }
  close(log[1]);
  Ran ran;
  ran.log = ReadAll(log[0]);
  waitpid(child, &ran.status, 0);
  lseek(result, 0, SEEK_SET);
  maru::json::FromString(ReadAll(result), ran.value);
  return ran;
}

MARU::APIRow* Rows() {
  return reinterpret_cast<MARU::APIRow* (*)()>(Symbol("GetAPITable"))();
}

MARU::APICheckRow* CheckRows() {
  return reinterpret_cast<MARU::APICheckRow* (*)()>(Symbol("GetAPICheckTable"))();
}

Json::Value Enter(const Login& login, const std::string& method, const Json::Value& params) {
  MARU::APIRequest request(login, params);
  MARU::APIResponse response;
  FindRow(Rows(), method).entry(&request, &response);
  return Told(response);
}

Answer Ask(const Login& login, const std::string& method, const Json::Value& params) {
  const Ran ran = InChild([&] {
    MARU::APIRequest request(login, params);
    MARU::APIResponse response;
    const bool accepted = FindRow(CheckRows(), method).check(&request, &response);
    Json::Value told = accepted ? Enter(login, method, params) : Told(response);
    told["accepted"] = accepted;
    return told;
  });
  EXPECT_EQ(ran.status, 0);
  return {ran.value["accepted"].asBool(), ran.value["success"].asBool(), ran.value["code"].asInt(),
          ran.value["data"], ran.log};
}

std::string Check(const std::string& method, const Json::Value& params) {
  MARU::APIRequest request(Alice(), params);
  MARU::APIResponse response;
  const bool accepted = FindRow(CheckRows(), method).check(&request, &response);
  EXPECT_EQ(accepted, !response.IsSet());
  if (accepted) return "accepted";
  EXPECT_EQ(response.ErrorCode(), 120);
  EXPECT_EQ(response.Data().size(), 2u);
  return response.Data()["name"].asString() + " " + response.Data()["reason"].asString();
}

Json::Value FromText(std::string text) {
  std::replace(text.begin(), text.end(), '\'', '"');
  Json::Value value;
  maru::json::FromString(text, value);
  return value;
}

std::string ToText(const Json::Value& value) {
  std::string text = maru::json::ToString(value);
  std::replace(text.begin(), text.end(), '"', '\'');
  return text;
}

void PluginTest::SetUp() {
  static const std::string fault = MakeWorld();
  if (!fault.empty()) GTEST_SKIP() << fault;
}

void MakeDeadSocket() {
  const int listener = socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::string(kSocket).copy(address.sun_path, sizeof(address.sun_path) - 1);
  unlink(kSocket);
  if (bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0) {
    throw std::runtime_error("cannot bind");
  }
  chmod(kSocket, 0666);
  close(listener);
}

void WriteFile(const std::string& path, const std::string& text, unsigned mode, unsigned owner) {
  std::ofstream(path) << text;
  if (chmod(path.c_str(), mode) != 0 || chown(path.c_str(), owner, owner) != 0) {
    throw std::runtime_error("cannot write " + path);
  }
}
