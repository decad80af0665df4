#ifndef KOVA_SERVICE_COMMAND_READER_H
#define KOVA_SERVICE_COMMAND_READER_H

/// @file The reading end of a command's output: collects it, or hands it on in lines.

#include "base/unique_fd.h"
#include "service/command_private.h"

#include <string_view>
#include <vector>

namespace KOVA::Backup::Service {

class StreamReader {
public:
  /// Copies what the target says about the stream.
  explicit StreamReader(const StreamTarget &target);

  void open(Base::UniqueFd fd) noexcept { fd_ = std::move(fd); }

  /// The descriptor to poll; -1 once the stream has ended.
  int fd() const noexcept { return fd_.get(); }

  /// Reads what is in the pipe, at most the buffer once.
  /// Returns: errno of a failing read(2), after which the stream has ended; else 0.
  int readSome(std::vector<char> &buffer);

  /// Reads what is in the pipe now and ends the stream. What is written meanwhile is not read, so
  /// a process that writes without end does not keep us.
  int readRest(std::vector<char> &buffer);

  void close() noexcept { fd_.reset(); }

  Captured &captured() noexcept { return captured_; }

private:
  ssize_t readOnce(std::vector<char> &buffer, std::size_t most);
  void take(std::string_view text);
  void takeLines(std::string_view text);
  void endLine(std::string_view last);
  void extendLine(std::string_view part);
  void endStream();

  Base::UniqueFd fd_;
  std::size_t limit_;
  std::function<void(std::string_view)> line_; // empty if the stream is collected
  std::string partOfLine_;
  bool inLine_ = false; // bytes came after the last newline
  Captured captured_;
};

} // namespace KOVA::Backup::Service

#endif
