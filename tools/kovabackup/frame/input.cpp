#include "tools/kovabackup/frame/input.h"

#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sstream>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::size_t kChunkBytes = std::size_t{1024} * 1024;

std::string shownName(const std::string &file) {
  return file == "-" ? "standard input" : shownFile(file);
}

[[noreturn]] void fail(const std::string &file, int error) {
  throw Failure(error == ENOENT || error == ENOTDIR ? kNegative : kFailed,
                fmt::format("cannot read {}: {}", shownName(file), reason(error)));
}

int openInput(const std::string &file) {
  if (file == "-") {
    return STDIN_FILENO;
  }
  const int fd = ::open(file.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) {
    fail(file, errno);
  }
  return fd;
}

// "* Line 1, Column 6\n  Syntax error: ...\n" as one sentence.
std::string onOneLine(const std::string &errors) {
  std::istringstream words(errors);
  std::string text;
  for (std::string word; words >> word;) {
    if (word != "*") {
      text += (text.empty() ? "" : " ") + word;
    }
  }
  return text;
}

} // namespace

RecordReader::RecordReader(const std::string &file, bool null)
    : file_(file), fd_(openInput(file)), end_(null ? '\0' : '\n') {}

RecordReader::~RecordReader() {
  if (fd_ != STDIN_FILENO) {
    (void)::close(fd_); // it was only read
  }
}

bool RecordReader::next(std::string &record) {
  std::size_t searched = begin_;
  for (;;) {
    const std::size_t end = buffer_.find(end_, searched);
    if (end != std::string::npos) {
      record.assign(buffer_, begin_, end - begin_);
      begin_ = end + 1;
      return true;
    }
    searched = buffer_.size() - begin_; // fill moves what is left to the front
    if (!fill()) {
      break;
    }
  }
  if (buffer_.empty()) {
    return false;
  }
  record.swap(buffer_);
  buffer_.clear();
  return true;
}

// Moves the unread rest to the front and adds what comes next. False at the end of the input.
bool RecordReader::fill() {
  buffer_.erase(0, begin_);
  begin_ = 0;
  if (atEnd_) {
    return false;
  }
  const std::size_t held = buffer_.size();
  buffer_.resize(held + kChunkBytes);
  ssize_t got = -1;
  do {
    got = ::read(fd_, &buffer_[held], kChunkBytes);
  } while (got < 0 && errno == EINTR);
  if (got < 0) {
    fail(file_, errno);
  }
  buffer_.resize(held + static_cast<std::size_t>(got));
  atEnd_ = got == 0;
  return !atEnd_;
}

std::string readAll(const std::string &file) {
  const int fd = openInput(file);
  const struct Closer {
    int fd;
    ~Closer() {
      if (fd != STDIN_FILENO) {
        (void)::close(fd); // it was only read
      }
    }
  } closer{fd};
  std::string text;
  for (;;) {
    const std::size_t held = text.size();
    text.resize(held + kChunkBytes);
    const ssize_t got = ::read(fd, &text[held], kChunkBytes);
    if (got < 0 && errno != EINTR) {
      fail(file, errno);
    }
    text.resize(held + (got < 0 ? 0 : static_cast<std::size_t>(got)));
    if (got == 0) {
      return text;
    }
  }
}

Json::Value readJsonObject(const std::string &file) {
  const std::string text = readAll(file);
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  bool parsed = false;
  try {
    parsed = reader->parse(text.data(), text.data() + text.size(), &value, &errors);
  } catch (const Json::Exception &exception) { // nested deeper than the reader goes
    errors = exception.what();
  }
  if (!parsed || !value.isObject()) {
    throw Failure(kFailed, fmt::format("{} holds no JSON object{}{}", shownName(file),
                                       errors.empty() ? "" : ": ", onOneLine(errors)));
  }
  return value;
}

} // namespace KOVA::Backup::Tool
