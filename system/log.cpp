#include "system/log.h"

#include <errno.h>
#include <stdarg.h>
#include <stdio.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <limits>
#include <new>
#include <string>
#include <system_error>

namespace maru {
namespace {

// Bytes of messages that may be written yet; below 0 once the end has been told.
std::atomic<long> room = std::numeric_limits<long>::max();

/// Cuts a message to what may be written of it; false when it is left out.
bool Limit(std::string& message) {
  const long size = static_cast<long>(message.size());
  const long left = room.fetch_sub(size);
  if (size <= left) return true;
  room = -1;
  if (left < 0) return false;
  message.resize(static_cast<std::size_t>(left));
  message += " (cut; further messages are left out)";
  return true;
}

// What OpenLog was told, for after a fork.
const char* log_program = nullptr;
int log_options = LOG_PID;

__attribute__((format(printf, 1, 0))) std::string Format(const char* format, va_list arguments) {
  va_list again;
  va_copy(again, arguments);
  const int size = vsnprintf(nullptr, 0, format, again);
  va_end(again);
  if (size < 0) return format;
  std::string text(static_cast<size_t>(size), '\0');
  vsnprintf(text.data(), text.size() + 1, format, arguments);
  return text;
}

std::string Printable(const std::string& text) {
  std::string result;
  result.reserve(text.size());
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte >= 0x20 && byte != 0x7f) {
      result += c;
      continue;
    }
    char escaped[5];
    snprintf(escaped, sizeof(escaped), "#%03o", byte);
    result += escaped;
  }
  return result;
}

}  // namespace

void LogLine(const char* file, int line, const char* function, const char* format, ...) noexcept {
  const int error = errno;
  va_list arguments;
  va_start(arguments, format);
  try {
    std::string message = Printable(Format(format, arguments));
    const std::string cause =
        error ? " [err: " + std::generic_category().message(error) + "]" : std::string();
    if (Limit(message)) {
      syslog(LOG_ERR, "%s:%d (%d, %u) (%s) %s%s", file, line, getpid(), geteuid(), function,
             message.c_str(), cause.c_str());
    }
  } catch (const std::bad_alloc&) {
    syslog(LOG_ERR, "%s:%d (%d, %u) (%s) %s", file, line, getpid(), geteuid(), function, format);
  }
  va_end(arguments);
  errno = 0;
}

void OpenLog(const char* program, bool foreground) {
  log_program = program;
  log_options = LOG_PID | (foreground ? LOG_PERROR : 0);
  ReopenLog();
}

void LimitLog(long bytes) {
  room = bytes;
}

void ReopenLog() {
  closelog();
  openlog(log_program, log_options, LOG_DAEMON);
}

}  // namespace maru
