#include "indexer/extract/forker.h"

#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <exception>
#include <vector>

#include "indexer/extract/charset.h"
#include "indexer/extract/sandbox.h"
#include "indexer/extract/wire.h"
#include "system/log.h"

namespace maru::extract {
namespace {

constexpr std::size_t kMaxMemory = 1u << 30;

bool Answer(int socket, const Extracted& extracted) {
  std::string authors;
  for (const std::string& author : extracted.authors) authors += author + '\n';
  const Reply reply{1, static_cast<std::uint32_t>(extracted.title.size()),
                    static_cast<std::uint32_t>(authors.size()), extracted.text.size()};
  return SendAll(socket, &reply, sizeof reply, -1, kForever) &&
         SendAll(socket, extracted.title.data(), extracted.title.size(), -1, kForever) &&
         SendAll(socket, authors.data(), authors.size(), -1, kForever) &&
         SendAll(socket, extracted.text.data(), extracted.text.size(), -1, kForever);
}

bool Refuse(int socket) {
  const Reply reply{};
  return SendAll(socket, &reply, sizeof reply, -1, kForever);
}

bool Serve(int socket, const Request& request, int file, std::span<const Extractor> table) {
  try {
    const Source source{file, static_cast<std::size_t>(request.max_text)};
    return Answer(socket, table[request.row].extract(source));
  } catch (const std::exception&) {
    return Refuse(socket);
  }
}

[[noreturn]] void RunProcess(int socket, std::span<const Extractor> table) {
  prctl(PR_SET_NAME, "maruextract");
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (!EnterSandbox(kMaxMemory)) _exit(1);
  while (true) {
    Request request;
    UniqueFd file;
    if (!ReceiveAll(socket, &request, sizeof request, &file, kForever)) _exit(0);
    if (!file || request.row >= table.size()) _exit(1);
    if (!Serve(socket, request, file.Get(), table)) _exit(0);
  }
}

class Forker {
 public:
  Forker(int socket, unsigned slots, std::span<const Extractor> table)
      : socket_(socket), table_(table), processes_(slots, -1) {}

  void Run() {
    std::uint32_t slot = 0;
    while (ReceiveAll(socket_, &slot, sizeof slot, nullptr, kForever)) {
      if (slot >= processes_.size() || !Replace(slot)) break;
    }
    for (const pid_t process : processes_) End(process);
  }

 private:
  static void End(pid_t process) {
    if (process <= 0) return;
    kill(process, SIGKILL);
    while (waitpid(process, nullptr, 0) < 0 && errno == EINTR) continue;
  }

  bool Replace(std::uint32_t slot) {
    End(processes_[slot]);
    processes_[slot] = -1;
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return false;
    UniqueFd ours(ends[0]);
    UniqueFd theirs(ends[1]);
    const pid_t process = fork();
    if (process < 0) return false;
    if (process == 0) {
      close(socket_);
      close(ends[0]);
      RunProcess(ends[1], table_);
    }
    processes_[slot] = process;
    return SendAll(socket_, &slot, sizeof slot, ours.Get(), kForever);
  }

  int socket_;
  std::span<const Extractor> table_;
  std::vector<pid_t> processes_;
};

}  // namespace

void RunForker(int socket, unsigned slots, std::span<const Extractor> table) {
  prctl(PR_SET_NAME, "maruforker");
  if (!DropCapabilities()) _exit(1);
  // The indexer ends by closing the socket; signals from the terminal are its business.
  for (const int ignored : {SIGINT, SIGTERM, SIGHUP, SIGPIPE}) signal(ignored, SIG_IGN);
  for (int descriptor = 3; descriptor < socket; ++descriptor) close(descriptor);
  close_range(static_cast<unsigned>(socket) + 1, ~0u, 0);
  LoadCharsets();
  Forker(socket, slots, table).Run();
  _exit(0);
}

}  // namespace maru::extract
