#include "base/section_reader.h"

#include "base/retry_on_eintr.h"
#include "base/section_grammar.h"
#include "base/trim.h"

#include <cstring>
#include <unistd.h>

namespace KOVA::Base {

namespace Grammar = SectionGrammar;

namespace {

// The length of the complete lines that a text begins with. memrchr(3) is many times faster than
// rfind, which matters in a long line.
std::size_t lengthOfLines(std::string_view text) {
  const void *const lineFeed = ::memrchr(text.data(), '\n', text.size());
  return lineFeed == nullptr
             ? 0
             : static_cast<std::size_t>(static_cast<const char *>(lineFeed) - text.data()) + 1;
}

// Whether an incomplete line, without the white space in front of it, may become a header in which
// the name follows the '['.
bool mayBecomeHeader(std::string_view line, std::string_view name) {
  return line.empty() || (line.front() == '[' && line.size() <= name.size() &&
                          name.substr(0, line.size() - 1) == line.substr(1));
}

} // namespace

SectionReader::SectionReader(int fd, std::size_t blockBytes) : fd_(fd) {
  (void)resize(blockBytes);
}

// realloc reports by errno that memory ran out, like every other failure here, and mostly enlarges
// a long line without copying it.
bool SectionReader::resize(std::size_t size) {
  auto *const buffer = static_cast<char *>(std::realloc(buffer_.get(), size));
  if (buffer == nullptr) {
    return false;
  }
  (void)buffer_.release(); // realloc has taken it
  buffer_.reset(buffer);
  size_ = size;
  return true;
}

// Reads more behind the bytes that have not been passed. Line: there are some.
SectionReader::Read SectionReader::fill() {
  if (ended_) {
    return Read::End;
  }
  if (begin_ > 0) {
    std::memmove(buffer_.get(), buffer_.get() + begin_, end_ - begin_);
    end_ -= begin_;
    begin_ = 0;
  }
  if (end_ == size_ && !resize(size_ * 2)) {
    return Read::Error;
  }
  const ssize_t got = retryOnEintr([&] { return ::read(fd_, buffer_.get() + end_, size_ - end_); });
  if (got < 0) {
    return Read::Error;
  }
  end_ += static_cast<std::size_t>(got);
  ended_ = got == 0;
  return ended_ ? Read::End : Read::Line;
}

// Passes over the white space that the buffer begins with.
void SectionReader::dropBlank() {
  while (begin_ < end_ && isWhiteSpace(unread().front())) {
    ++begin_;
  }
}

// Passes over white space, line feeds included. Line: another character follows.
SectionReader::Read SectionReader::skipBlank() {
  Read read = Read::Line;
  while (read == Read::Line) {
    dropBlank();
    if (begin_ < end_) {
      return Read::Line;
    }
    read = fill();
  }
  return read;
}

// Passes over the rest of the line.
SectionReader::Read SectionReader::skipLine() {
  Read read = Read::Line;
  while (read == Read::Line) {
    const std::size_t lineFeed = unread().find('\n');
    if (lineFeed != std::string_view::npos) {
      begin_ += lineFeed + 1;
      return Read::Line;
    }
    begin_ = end_;
    read = fill();
  }
  return read;
}

// From the beginning of a line on, passes over everything in front of the next '[' that begins a
// line and is followed by the name.
SectionReader::Read SectionReader::seekHeader(std::string_view name) {
  Read read = Read::Line;
  while (read == Read::Line) {
    const std::string_view text = unread();
    const std::size_t header = Grammar::findHeader(text, name);
    if (header != std::string_view::npos) {
      begin_ += header;
      return Read::Line;
    }
    begin_ += lengthOfLines(text);
    dropBlank();
    read = mayBecomeHeader(unread(), name) ? fill() : skipLine();
  }
  return read;
}

// Takes a line with its line feed, if it has one. A line that is longer than `longest` bytes
// without its trailing white space is passed over, and an empty one is returned in its place.
SectionReader::Read SectionReader::takeLine(std::string_view &line, std::size_t longest) {
  std::size_t searched = 0;
  for (;;) {
    const std::size_t lineFeed = unread().find('\n', searched);
    const bool isComplete = lineFeed != std::string_view::npos || ended_;
    if (isComplete) {
      line = unread().substr(0, lineFeed == std::string_view::npos ? lineFeed : lineFeed + 1);
      begin_ += line.size();
      return Read::Line;
    }
    if (unread().size() > longest) {
      if (trim(unread()).size() > longest) {
        line = {};
        return skipLine();
      }
      end_ = begin_ + longest; // what follows is white space so far; text after it is too far off
    }
    searched = unread().size();
    if (fill() == Read::Error) {
      return Read::Error;
    }
  }
}

SectionReader::Read SectionReader::nextHeader(std::string_view &line) {
  const Read read = seekHeader({});
  return read == Read::Line ? takeLine(line, std::string_view::npos) : read;
}

SectionReader::Read SectionReader::findSection(std::string_view name) {
  std::string_view line;
  Read read = Read::Line;
  do {
    read = seekHeader(name);
    if (read == Read::Line) {
      read = takeLine(line, name.size() + 2);
    }
  } while (read == Read::Line && !Grammar::isTakenForHeaderOf(Grammar::parse(line), name));
  return read;
}

SectionReader::Read SectionReader::nextInSection(std::string_view &line) {
  Read read = skipBlank();
  if (read != Read::Line) {
    return read;
  }
  if (unread().front() != '[') {
    return takeLine(line, std::string_view::npos);
  }
  read = skipLine();
  return read == Read::Error ? read : Read::End;
}

SectionReader::Read SectionReader::takeRest(std::string_view &text) {
  Read read = Read::Line;
  while (read == Read::Line) {
    read = fill();
  }
  text = unread();
  begin_ = end_;
  return read == Read::Error ? read : Read::Line;
}

} // namespace KOVA::Base
