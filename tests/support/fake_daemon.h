#pragma once

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <deque>
#include <map>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

/// A search daemon that follows a script: for each command, what it does to the connection. It
/// works in a thread of the test, serves one connection at a time, and remembers what it was asked
/// and by whom.
class FakeDaemon {
 public:
  /// One step of an answer.
  struct Step {
    enum Kind { kSend, kStall, kHangUp } kind;
    std::string bytes;
  };
  using Script = std::vector<Step>;

  /// A whole message; bytes as they are (a message cut short, say); silence until the peer goes
  /// away or the daemon ends; an end without a word. Every script ends with hanging up.
  static Step Message(std::string text) { return {Step::kSend, std::move(text) + "\n"}; }
  static Step Bytes(std::string bytes) { return {Step::kSend, std::move(bytes)}; }
  static Step Stall() { return {Step::kStall, {}}; }
  static Step HangUp() { return {Step::kHangUp, {}}; }

  struct Request {
    std::string text;
    ucred peer;
  };

  explicit FakeDaemon(std::string path = "/var/run/maruelasticd.sock") : path_(std::move(path)) {
    listener_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path_.copy(address.sun_path, sizeof(address.sun_path) - 1);
    unlink(path_.c_str());
    if (bind(listener_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0 ||
        chmod(path_.c_str(), 0666) != 0 || listen(listener_, 64) != 0 || pipe2(end_, O_CLOEXEC)) {
      throw std::runtime_error("cannot listen on " + path_);
    }
    thread_ = std::thread([this] { Serve(); });
  }

  ~FakeDaemon() {
    close(end_[1]);
    thread_.join();
    close(end_[0]);
    close(listener_);
    unlink(path_.c_str());
  }
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  /// What to do for the next request with this command (the text that stands in "command"). Scripts
  /// for one command are used up in turn; the last one stays. Without one the daemon hangs up.
  void On(const std::string& command, Script script) {
    const std::lock_guard lock(mutex_);
    scripts_[command].push_back(std::move(script));
  }

  /// Hangs up on the next connection before it has read anything.
  void RefuseNext() {
    const std::lock_guard lock(mutex_);
    refuse_ = true;
  }

  std::vector<Request> Requests() const {
    const std::lock_guard lock(mutex_);
    return requests_;
  }

  /// Waits until that many requests came. False after ten seconds.
  bool WaitForRequests(std::size_t count) const {
    std::unique_lock lock(mutex_);
    return came_.wait_for(lock, std::chrono::seconds(10),
                          [&] { return requests_.size() >= count; });
  }

 private:
  void Serve() {
    while (Readable(listener_)) {
      const int peer = accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
      if (peer < 0) continue;
      Converse(peer);
      close(peer);
    }
  }

  /// False when the daemon ends.
  bool Readable(int descriptor) const {
    pollfd ready[] = {{descriptor, POLLIN, 0}, {end_[0], POLLIN, 0}};
    while (poll(ready, 2, -1) < 0) {
    }
    return ready[1].revents == 0;
  }

  void Converse(int peer) {
    {
      const std::lock_guard lock(mutex_);
      if (std::exchange(refuse_, false)) return;
    }
    Request request;
    socklen_t size = sizeof(request.peer);
    getsockopt(peer, SOL_SOCKET, SO_PEERCRED, &request.peer, &size);
    if (!ReadLine(peer, request.text)) return;
    const Script script = Note(std::move(request));
    for (const Step& step : script) {
      if (step.kind == Step::kHangUp || !Play(peer, step)) return;
    }
  }

  bool ReadLine(int peer, std::string& line) const {
    char buffer[4096];
    while (line.empty() || line.back() != '\n') {
      if (!Readable(peer)) return false;
      const ssize_t count = read(peer, buffer, sizeof(buffer));
      if (count <= 0) return false;
      line.append(buffer, static_cast<std::size_t>(count));
    }
    line.pop_back();
    return true;
  }

  Script Note(Request request) {
    const std::lock_guard lock(mutex_);
    Script script;
    for (auto& [command, scripts] : scripts_) {
      if (request.text.find("\"command\":\"" + command + "\"") == std::string::npos) continue;
      script = scripts.front();
      if (scripts.size() > 1) scripts.pop_front();
    }
    requests_.push_back(std::move(request));
    came_.notify_all();
    return script;
  }

  bool Play(int peer, const Step& step) const {
    if (step.kind == Step::kStall) {
      char byte;
      return Readable(peer) && read(peer, &byte, 1) > 0;
    }
    std::size_t sent = 0;
    while (sent < step.bytes.size()) {
      const ssize_t count =
          send(peer, step.bytes.data() + sent, step.bytes.size() - sent, MSG_NOSIGNAL);
      if (count <= 0) return false;
      sent += static_cast<std::size_t>(count);
    }
    return true;
  }

  std::string path_;
  int listener_ = -1;
  int end_[2] = {-1, -1};
  std::thread thread_;
  mutable std::mutex mutex_;
  mutable std::condition_variable came_;
  std::map<std::string, std::deque<Script>> scripts_;
  bool refuse_ = false;
  std::vector<Request> requests_;
};
