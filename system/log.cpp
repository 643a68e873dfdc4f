#include "system/log.h"

#include <errno.h>
#include <stdarg.h>
#include <stdio.h>
#include <syslog.h>
#include <unistd.h>

#include <new>
#include <string>
#include <system_error>

namespace maru {
namespace {

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
    const std::string message = Printable(Format(format, arguments));
    const std::string cause =
        error ? " [err: " + std::generic_category().message(error) + "]" : std::string();
    syslog(LOG_ERR, "%s:%d (%d, %u) (%s) %s%s", file, line, getpid(), geteuid(), function,
           message.c_str(), cause.c_str());
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

void ReopenLog() {
  closelog();
  openlog(log_program, log_options, LOG_DAEMON);
}

}  // namespace maru
