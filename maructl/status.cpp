#include <netdb.h>
#include <sys/socket.h>

#include <fcntl.h>

#include <cerrno>
#include <cstdio>
#include <memory>
#include <stdexcept>
#include <string>

#include "maructl/commands.h"
#include "maructl/daemon.h"
#include "maructl/print.h"
#include "system/config.h"
#include "system/indexed_shares.h"
#include "system/json.h"
#include "system/unique_fd.h"

namespace maru::control {
namespace {

std::string Number(const Json::Value& value) {
  return value.isIntegral() ? std::to_string(value.asUInt64()) : "?";
}

std::string Documents(const Json::Value& index) {
  const std::string error = json::StringMember(index, "error");
  return error.empty() ? Number(json::Member(index, "documents")) : "unreadable: " + error;
}

void PrintIndices(const Json::Value& indices) {
  std::vector<std::vector<std::string>> rows{{"SHARE", "INDEX", "DOCUMENTS"}};
  for (const Json::Value& index : indices) {
    const std::string share = json::StringMember(index, "share", "(none)");
    rows.push_back({share, json::StringMember(index, "id"), Documents(index)});
  }
  PrintTable(rows);
}

bool ShowDaemon() {
  try {
    Daemon daemon;
    daemon.Ask("status", Json::Value(Json::objectValue));
    const Json::Value status = daemon.Reply();
    std::printf("Search daemon  answers, version %s, up %s s\n",
                json::StringMember(status, "version", "?").c_str(),
                Number(json::Member(status, "uptime")).c_str());
    const Json::Value& indices = json::Member(status, "indices");
    if (indices.isArray()) PrintIndices(indices);
    return true;
  } catch (const std::runtime_error& error) {
    std::printf("Search daemon  %s\n", error.what());
    return false;
  }
}

bool AnswersAt(const std::string& address, int port) {
  addrinfo hints{};
  hints.ai_flags = AI_NUMERICHOST | AI_NUMERICSERV;
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* list = nullptr;
  const std::string service = std::to_string(port);
  if (getaddrinfo(address.c_str(), service.c_str(), &hints, &list) != 0) return false;
  const std::unique_ptr<addrinfo, void (*)(addrinfo*)> found(list, freeaddrinfo);
  const UniqueFd connection(socket(list->ai_family, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return connection && connect(connection.Get(), list->ai_addr, list->ai_addrlen) == 0;
}

bool ShowServer() {
  const Config& config = Config::Get();
  const bool answers = AnswersAt(config.listen_address, config.listen_port);
  std::printf("Web server     %s at %s port %d\n", answers ? "listens" : "does not listen",
              config.listen_address.c_str(), config.listen_port);
  return answers;
}

/// The indexer holds its lock as long as it runs. Who may not look at that learns nothing.
bool ShowIndexer() {
  const std::string path = IndexHome() + "/.lock";
  const UniqueFd lock(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  if (!lock && errno == EACCES) {
    std::printf("Indexer        (not for this user to see)\n");
    return true;
  }
  struct flock whole {};
  whole.l_type = F_WRLCK;
  const bool runs = lock && fcntl(lock.Get(), F_OFD_GETLK, &whole) == 0 && whole.l_type != F_UNLCK;
  std::printf("Indexer        %s\n", runs ? "runs" : "does not run");
  return runs;
}

}  // namespace

int ShowStatus() {
  const bool server = ShowServer();
  const bool indexer = ShowIndexer();
  const bool daemon = ShowDaemon();
  return server && indexer && daemon ? kGood : kNo;
}

}  // namespace maru::control
