#pragma once

#include <sys/socket.h>

#include <optional>

#include "server/wire/packets.h"

/// Every word of one letter that the processes say to each other, each kind on a way of its own.
namespace maru::server {

/// Front to host to child: what is asked for.
enum class AskKind : char {
  kCall = 'C',     // a method of the plug-in
  kWho = 'W',      // whose session is it
  kSignIn = 'I',   // a new session
  kSignOut = 'O',  // the end of one
  kStatus = 'S',   // the host's numbers; needs no session
};
constexpr AskKind kAskKinds[] = {AskKind::kCall, AskKind::kWho, AskKind::kSignIn, AskKind::kSignOut,
                                 AskKind::kStatus};

/// Child or host to front: what a packet of an answer holds.
enum class AnswerPart : char {
  kHead = 'A',    // the answer's status and size, and the beginning of its body, maybe empty
  kMore = 'R',    // the next part of the body
  kKilled = 'K',  // by the host, behind whatever the child has sent: the child was killed
  kFailed = 'X',  // likewise: the child has ended otherwise
};

/// Child to host, in this order.
enum class ChildWord : char {
  kEndsOwnOnly = 'o',  // unless it may act as root: it can end processes of its user only
  kAnswered = 'a',     // the answer is about to go to the front
  kRequestOver = 'd',  // only if it stays for its user's next request
};

/// The exit status of a child instead of a word: the session's account is gone, expired, or has
/// another password, so that the session is over.
constexpr int kExitSessionOver = 77;

/// Front or host to supervisor.
enum class PartWord : char { kReady = '1' };

/// Without waiting; false when there is no room or nobody to hear it.
template <class Word>
bool Say(int socket, Word word) {
  const char letter = static_cast<char>(word);
  return SendPacket(socket, {&letter, 1}, Wait::kNo) == SendResult::kDone;
}

/// The word that has come, or nothing. With MSG_PEEK as `flags` it stays to be heard.
template <class Word>
std::optional<Word> HeardWord(int socket, int flags = 0) {
  char letter;
  if (recv(socket, &letter, 1, flags | MSG_DONTWAIT) != 1) return std::nullopt;
  return static_cast<Word>(letter);
}

}  // namespace maru::server
