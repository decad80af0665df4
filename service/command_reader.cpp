#include "service/command_reader.h"

#include "base/retry_on_eintr.h"

#include <algorithm>
#include <cerrno>
#include <sys/ioctl.h>
#include <unistd.h>

namespace KOVA::Backup::Service {

StreamReader::StreamReader(const StreamTarget &target) : limit_(target.limit), line_(target.line) {}

ssize_t StreamReader::readOnce(std::vector<char> &buffer, std::size_t most) {
  const std::size_t size = std::min(buffer.size(), most);
  const ssize_t got = Base::retryOnEintr([&] { return ::read(fd_.get(), buffer.data(), size); });
  if (got > 0) {
    take({buffer.data(), static_cast<std::size_t>(got)});
  }
  return got;
}

int StreamReader::readSome(std::vector<char> &buffer) {
  const ssize_t got = readOnce(buffer, buffer.size());
  const int error = got < 0 && errno != EAGAIN ? errno : 0;
  if (got == 0 || error != 0) {
    endStream();
  }
  return error;
}

int StreamReader::readRest(std::vector<char> &buffer) {
  if (fd_.get() < 0) {
    return 0;
  }
  int left = 0;
  if (::ioctl(fd_.get(), FIONREAD, &left) != 0) {
    left = static_cast<int>(buffer.size());
  }
  int error = 0;
  while (left > 0 && error == 0) {
    const ssize_t got = readOnce(buffer, static_cast<std::size_t>(left));
    error = got < 0 && errno != EAGAIN ? errno : 0;
    left = got > 0 ? left - static_cast<int>(got) : 0;
  }
  endStream();
  return error;
}

void StreamReader::endStream() {
  fd_.reset();
  if (inLine_) {
    endLine({});
  }
}

void StreamReader::take(std::string_view text) {
  if (line_) {
    takeLines(text);
    return;
  }
  const std::size_t kept = std::min(text.size(), limit_ - captured_.text.size());
  captured_.text.append(text.substr(0, kept));
  captured_.dropped += text.size() - kept;
}

void StreamReader::takeLines(std::string_view text) {
  for (std::size_t newline = text.find('\n'); newline != std::string_view::npos;
       newline = text.find('\n')) {
    endLine(text.substr(0, newline));
    text.remove_prefix(newline + 1);
  }
  extendLine(text);
}

// A line that is in the buffer completely is not copied.
void StreamReader::endLine(std::string_view last) {
  if (!inLine_ && last.size() <= limit_) {
    line_(last);
    return;
  }
  extendLine(last);
  inLine_ = false;
  line_(partOfLine_);
  partOfLine_.clear();
}

void StreamReader::extendLine(std::string_view part) {
  const std::size_t kept = std::min(part.size(), limit_ - partOfLine_.size());
  partOfLine_.append(part.substr(0, kept));
  captured_.dropped += part.size() - kept;
  inLine_ = inLine_ || !part.empty();
}

} // namespace KOVA::Backup::Service
