#include "daemon/socket/connection.h"

#include <poll.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>

namespace maru::daemon {
namespace {

constexpr std::size_t kChunk = 64u << 10;
/// Chunks taken before others have their turn.
constexpr int kChunksAtOnce = 16;

bool IsBlankLine(const std::string& line) {
  return line.find_first_not_of(" \t\r") == std::string::npos;
}

}  // namespace

bool Connection::Receive() {
  char chunk[kChunk];
  for (int i = 0; i < kChunksAtOnce && !line_too_long_ && input_.size() <= kMaxRequest; ++i) {
    uid_t sender;
    const ssize_t count = ReceiveFrom(Socket(), chunk, sizeof chunk, MSG_DONTWAIT, sender);
    if (count < 0) return errno == EAGAIN || errno == EINTR;
    if (count == 0) {
      ended_ = true;
      return true;
    }
    std::string_view bytes(chunk, static_cast<std::size_t>(count));
    if (!TakeIntroduction(bytes, sender)) return false;
    Append(bytes);
    if (!bytes.empty() && static_cast<std::size_t>(count) < sizeof chunk) break;
  }
  return true;
}

void Connection::Append(std::string_view bytes) {
  if (!WithinLine()) since = std::chrono::steady_clock::now();
  if (discarded_ > 0) {
    Discard(bytes.data(), bytes.size());
  } else {
    input_.append(bytes);
  }
}

/// Takes the line in which root says for whom it, or who was root, asks; it comes in one piece.
/// False when it is not root's, not in its place, or no such line.
bool Connection::TakeIntroduction(std::string_view& bytes, uid_t sender) {
  constexpr std::string_view kBeginning = kIntroduction;
  if (!bytes.starts_with(kBeginning[0])) return true;
  const std::size_t end = bytes.find('\n');
  if (WithinLine() || sender != 0 || !bytes.starts_with(kBeginning) || end == bytes.npos)
    return false;
  client_ = ClientAddress(std::string(bytes.substr(kBeginning.size(), end - kBeginning.size())));
  bytes.remove_prefix(end + 1);
  return true;
}

void Connection::Discard(const char* bytes, std::size_t count) {
  discarded_ += count;
  line_too_long_ = std::memchr(bytes, '\n', count) != nullptr || discarded_ > kMaxDiscarded;
}

Connection::Input Connection::Take(std::string& line) {
  for (;;) {
    const std::size_t end = input_.find('\n', searched_);
    const bool whole = end != std::string::npos;
    if ((whole ? end : input_.size()) - begin_ > kMaxRequest) {
      discarded_ = input_.size() - begin_;
      line_too_long_ = whole;
      input_ = {};
    }
    if (line_too_long_ || (discarded_ > 0 && ended_)) return Input::kTooLong;
    if (discarded_ > 0) return Input::kNone;
    if (!whole) break;
    line.assign(input_, begin_, end - begin_);
    begin_ = searched_ = end + 1;
    if (!IsBlankLine(line)) return Input::kLine;
  }
  input_.erase(0, begin_);
  if (input_.empty()) input_ = {};
  begin_ = 0;
  searched_ = input_.size();
  if (!ended_) return Input::kNone;
  return IsBlankLine(input_) ? Input::kEnd : Input::kUnframed;
}

void Connection::SetReply(std::string reply) {
  output_ = std::move(reply);
  sent_ = 0;
}

bool Connection::Flush() {
  while (!AllSent()) {
    const ssize_t count =
        send(Socket(), output_.data() + sent_, output_.size() - sent_, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno == EAGAIN;
    sent_ += static_cast<std::size_t>(count);
  }
  output_ = {};
  sent_ = 0;
  return true;
}

bool Connection::HasInput() const {
  pollfd now{Socket(), POLLIN, 0};
  return poll(&now, 1, 0) > 0;
}

bool Connection::HasHungUp() const {
  pollfd now{Socket(), 0, 0};
  return poll(&now, 1, 0) > 0;
}

}  // namespace maru::daemon
