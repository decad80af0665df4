#include "tools/kovabackup/frame/input.h"

#include "base/retry_on_eintr.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sstream>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

using KOVA::Base::retryOnEintr;
using KOVA::Base::UniqueFd;

constexpr std::size_t kChunkBytes = std::size_t{16} * 1024; // larger ones are not read faster

std::string shownName(const std::string &file) {
  return file == "-" ? "standard input" : shownFile(file);
}

// "Not found" is an answer that scripts distinguish from a failure.
[[noreturn]] void fail(const std::string &file, int error) {
  throw Failure(error == ENOENT || error == ENOTDIR ? kNegative : kFailed,
                fmt::format("cannot read {}: {}", shownName(file), reason(error)));
}

// Disks and devices such as /dev/zero, which may have no end. A terminal has one, and so has
// /dev/null.
bool isEndlessDevice(int fd) {
  const dev_t null = ::makedev(1, 3);
  struct stat info = {};
  return ::fstat(fd, &info) == 0 &&
         (S_ISBLK(info.st_mode) ||
          (S_ISCHR(info.st_mode) && info.st_rdev != null && ::isatty(fd) == 0));
}

// Returns an empty owner for standard input, which must stay open.
UniqueFd openInput(const std::string &file) {
  if (file == "-") {
    return UniqueFd();
  }
  UniqueFd fd(::open(file.c_str(), O_RDONLY | O_NOCTTY | O_CLOEXEC));
  if (!fd) {
    fail(file, errno);
  }
  if (isEndlessDevice(fd.get())) {
    throw Failure(kFailed, fmt::format("cannot read {}: it is a device", shownName(file)));
  }
  return fd;
}

// Appends the result of one read. Returns: false at the end of the input.
bool readChunk(const std::string &file, const UniqueFd &fd, std::string &text) {
  const std::size_t held = text.size();
  text.resize(held + kChunkBytes);
  const ssize_t got =
      retryOnEintr([&] { return ::read(fd ? fd.get() : STDIN_FILENO, &text[held], kChunkBytes); });
  if (got < 0) {
    fail(file, errno);
  }
  text.resize(held + static_cast<std::size_t>(got));
  return got > 0;
}

// The JSON library lays its errors out in lines: "* Line 1, Column 6\n  Syntax error: ...\n". A
// message of the command is one sentence.
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

bool RecordReader::next(std::string &record) {
  std::size_t searched = begin_; // a long record is searched once, not again after every read
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

// Moves the unread rest to the front and appends to it. Returns: false at the end of the input.
bool RecordReader::fill() {
  buffer_.erase(0, begin_);
  begin_ = 0;
  atEnd_ = atEnd_ || !readChunk(file_, fd_, buffer_);
  return !atEnd_;
}

std::string readAll(const std::string &file) {
  const UniqueFd fd = openInput(file);
  std::string text;
  while (readChunk(file, fd, text)) {
  }
  return text;
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
  } catch (const Json::Exception &exception) { // nested too deeply for the reader
    errors = exception.what();
  }
  if (!parsed || !value.isObject()) {
    throw Failure(kFailed, fmt::format("{} does not contain a JSON object{}{}", shownName(file),
                                       errors.empty() ? "" : ": ", onOneLine(errors)));
  }
  return value;
}

} // namespace KOVA::Backup::Tool
