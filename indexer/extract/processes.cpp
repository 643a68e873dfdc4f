#include "indexer/extract/processes.h"

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "indexer/extract/charset.h"
#include "indexer/extract/forker.h"
#include "indexer/extract/wire.h"
#include "system/log.h"
#include "system/throw_errno.h"
#include "system/utf8.h"

namespace maru::extract {
namespace {

bool Receive(int socket, std::string& into, std::size_t size, Deadline deadline) {
  // Grows with what really comes: the announced size is the other side's claim.
  constexpr std::size_t kStep = 1u << 20;
  into.clear();
  while (into.size() < size) {
    const std::size_t before = into.size();
    into.resize(std::min(size, before + kStep));
    if (!ReceiveAll(socket, into.data() + before, into.size() - before, nullptr, deadline)) {
      return false;
    }
  }
  return true;
}

/// What came from the other side is bytes to be checked, like any file, and no converter is for
/// this process.
std::string Clean(std::string text, std::size_t limit) {
  if (!IsUTF8(text)) text = RepairUTF8(text);
  CutUTF8(text, limit);
  return text;
}

std::vector<std::string> Lines(const std::string& text) {
  std::vector<std::string> lines;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t end = std::min(text.find('\n', at), text.size());
    lines.push_back(Clean(text.substr(at, end - at), kMaxReplyHead));
    at = end + 1;
  }
  return lines;
}

}  // namespace

Processes::Processes(unsigned slots, std::span<const Extractor> table,
                     std::chrono::milliseconds timeout)
    : timeout_(timeout) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    ThrowErrno("cannot make a socket pair");
  }
  forker_ = UniqueFd(ends[0]);
  UniqueFd theirs(ends[1]);
  forker_pid_ = fork();
  if (forker_pid_ < 0) ThrowErrno("cannot fork");
  if (forker_pid_ == 0) RunForker(ends[1], slots, table);
  for (unsigned slot = 0; slot < slots; ++slot) processes_.push_back(NewProcess(slot));
}

Processes::~Processes() {
  forker_ = UniqueFd();
  while (waitpid(forker_pid_, nullptr, 0) < 0 && errno == EINTR) continue;
}

UniqueFd Processes::NewProcess(unsigned slot) {
  const std::lock_guard lock(forker_mutex_);
  std::uint32_t number = slot;
  UniqueFd process;
  if (!SendAll(forker_.Get(), &number, sizeof number, -1, kForever) ||
      !ReceiveAll(forker_.Get(), &number, sizeof number, &process, kForever) || !process) {
    MARU_LOG("No process to extract text with");
    return UniqueFd();
  }
  return process;
}

std::optional<Extracted> Processes::Extract(unsigned slot, std::size_t row, int file,
                                            std::size_t max_text) {
  UniqueFd& process = processes_[slot];
  if (!process) process = NewProcess(slot);
  if (!process) return std::nullopt;
  return Ask(process, row, file, max_text);
}

std::optional<Extracted> Processes::Ask(UniqueFd& process, std::size_t row, int file,
                                        std::size_t max_text) {
  const Deadline deadline = std::chrono::steady_clock::now() + timeout_;
  const Request request{static_cast<std::uint32_t>(row), max_text};
  Reply reply{};
  Extracted extracted;
  std::string authors;
  const int socket = process.Get();
  const bool answered = SendAll(socket, &request, sizeof request, file, deadline) &&
                        ReceiveAll(socket, &reply, sizeof reply, nullptr, deadline);
  if (answered && reply.good == 0) return std::nullopt;
  if (answered && reply.title <= kMaxReplyHead && reply.authors <= kMaxReplyHead &&
      reply.text <= max_text && Receive(socket, extracted.title, reply.title, deadline) &&
      Receive(socket, authors, reply.authors, deadline) &&
      Receive(socket, extracted.text, reply.text, deadline)) {
    extracted.title = Clean(std::move(extracted.title), kMaxReplyHead);
    extracted.authors = Lines(authors);
    extracted.text = Clean(std::move(extracted.text), max_text);
    return extracted;
  }
  MARU_LOG("A process that extracts text failed and is replaced");
  process = UniqueFd();
  return std::nullopt;
}

}  // namespace maru::extract
