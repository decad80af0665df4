#include "base/log_line.h"

#include "base/errno_guard.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <syslog.h>
#include <unistd.h>

namespace KOVA::Base::Log {
namespace {

// Most lines fit; a longer one costs an allocation. Signal handlers and forked children write short
// lines only, so that they never allocate here.
constexpr std::size_t kInlineBytes = 1024;

enum class Form { Error, Debug, Bare };

void write(int priority, Form form, const char *module, int number, const char *text) {
  switch (form) {
  case Form::Error:
    ::syslog(priority, "(%d) [err] %s:%d %s", ::getpid(), module, number, text);
    return;
  case Form::Debug:
    ::syslog(priority, "(%d) [debug] %s:%d %s", ::getpid(), module, number, text);
    return;
  case Form::Bare:
    ::syslog(priority, "%s:%d %s", module, number, text);
    return;
  }
}

__attribute__((format(printf, 5, 0))) void vwrite(int priority, Form form, const char *module,
                                                  int number, const char *format, va_list args) {
  const ErrnoGuard guard;
  char inlineText[kInlineBytes] = "";
  va_list again;
  va_copy(again, args);
  const int length = std::vsnprintf(inlineText, sizeof inlineText, format, args);
  const char *text = inlineText;
  std::unique_ptr<char, decltype(&std::free)> longText(nullptr, &std::free);
  if (length >= static_cast<int>(sizeof inlineText)) {
    const std::size_t bytes = static_cast<std::size_t>(length) + 1;
    longText.reset(static_cast<char *>(std::malloc(bytes)));
    guard.restore(); // for %m
    if (longText && std::vsnprintf(longText.get(), bytes, format, again) >= 0) {
      text = longText.get();
    }
  }
  va_end(again);
  write(priority, form, module, number, text);
}

} // namespace

void error(const char *module, int number, const char *format, ...) {
  va_list args;
  va_start(args, format);
  vwrite(LOG_ERR, Form::Error, module, number, format, args);
  va_end(args);
}

void debug(const char *module, int number, const char *format, ...) {
  va_list args;
  va_start(args, format);
  vwrite(LOG_DEBUG, Form::Debug, module, number, format, args);
  va_end(args);
}

void bare(int priority, const char *module, int number, const char *format, ...) {
  va_list args;
  va_start(args, format);
  vwrite(priority, Form::Bare, module, number, format, args);
  va_end(args);
}

} // namespace KOVA::Base::Log
