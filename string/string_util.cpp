// Formatting. replace_mustache.cpp has the templates.

#include "kovabackup/string_util.h"

#include <cstdio>

namespace KOVA::Backup {
namespace {

constexpr std::size_t kShortBytes = 128; // with the NUL

// The arguments for a second pass, because the first one consumes its own.
class ArgumentCopy {
public:
  explicit ArgumentCopy(va_list args) { va_copy(args_, args); }
  ~ArgumentCopy() { va_end(args_); }
  ArgumentCopy(const ArgumentCopy &) = delete;
  ArgumentCopy &operator=(const ArgumentCopy &) = delete;

  __attribute__((format(printf, 3, 0))) std::string formatLong(std::size_t bytes,
                                                               const char *format) {
    std::string text(bytes + 1, '\0');
    const int length = std::vsnprintf(text.data(), text.size(), format, args_);
    // When an argument has changed meanwhile, the second pass can fail although the first did not.
    // Its -1 means a text that cannot be formatted; taken as a size, it would request all memory.
    text.resize(length < 0 ? 0 : static_cast<std::size_t>(length));
    return text;
  }

private:
  va_list args_;
};

// What both exported functions do. A call from one to the other would go through the table of the
// dynamic linker.
__attribute__((format(printf, 1, 0))) inline std::string formatAny(const char *format,
                                                                   va_list args) {
  char buffer[kShortBytes] = "";
  ArgumentCopy again(args);
  const int length = std::vsnprintf(buffer, sizeof buffer, format, args);
  if (length < 0) {
    return {};
  }
  const auto bytes = static_cast<std::size_t>(length);
  return bytes < sizeof buffer ? std::string(buffer, bytes) : again.formatLong(bytes, format);
}

} // namespace

std::string stringf(const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::string text = formatAny(format, args);
  va_end(args);
  return text;
}

std::string vstringf(const char *format, va_list args) {
  return formatAny(format, args);
}

} // namespace KOVA::Backup
