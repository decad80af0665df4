#ifndef KOVA_BASE_SECTION_READER_H
#define KOVA_BASE_SECTION_READER_H

/// @file Reads a section file in blocks. Lines that no caller needs are passed over without looking
/// at their bytes one by one and without holding them: a file may have many sections, and a line
/// may have any length.
///
///     SectionReader file(fd.get());
///     if (!file) return false;                       // memory ran out
///     std::string_view text;
///     SectionReader::Read read = file.findSection("task12");
///     while (read == SectionReader::Read::Line) {
///       read = file.nextInSection(text);             // the lines of the section, one by one
///       ...
///     }
///
/// Lines and sections are those of base/section_grammar.h. The file is read from its current
/// position on, and no further than the caller's questions require.
///
/// Failure: Read::Error with the errno of read(2), which is never EINTR, or with ENOMEM when memory
///          runs out for a line. Nothing more can be read then.
/// Memory:  one block, and in addition the line that is returned.
/// Cost:    linear in the bytes of the file, whatever they are.
/// Owns:    its buffer, not the descriptor. Views are valid until the next call.

#include <cstddef>
#include <cstdlib>
#include <memory>
#include <string_view>

namespace KOVA::Base {

class SectionReader {
public:
  enum class Read {
    Line, ///< what was asked for has been read
    End,  ///< the file, or the section, holds nothing more of it
    Error ///< errno says why
  };

  /// Larger blocks are not read faster.
  static constexpr std::size_t kBlockBytes = 65536;

  /// blockBytes must not be 0.
  explicit SectionReader(int fd, std::size_t blockBytes = kBlockBytes);

  /// Whether there was memory for the first block. If not, no other function may be called.
  explicit operator bool() const { return buffer_ != nullptr; }

  /// Reads up to and including the next line whose first character after white space is '['. It is
  /// a header or a broken one. line begins at the '['.
  Read nextHeader(std::string_view &line);

  /// Reads up to and including the first line that a loader takes for the header of this section
  /// (SectionGrammar::isTakenForHeaderOf). Of longer lines only the beginning is held.
  Read findSection(std::string_view name);

  /// Reads the next line of the section. Blank lines are passed over, and so is white space in
  /// front of the line. End: the line that ends the section has been passed, or the file has ended.
  Read nextInSection(std::string_view &line);

  /// Reads everything that is left: Line, or Error.
  Read takeRest(std::string_view &text);

private:
  struct Free {
    void operator()(char *memory) const { std::free(memory); }
  };

  std::string_view unread() const { return {buffer_.get() + begin_, end_ - begin_}; }
  bool resize(std::size_t size);
  Read fill();
  void dropBlank();
  Read skipBlank();
  Read skipLine();
  Read seekHeader(std::string_view name);
  Read takeLine(std::string_view &line, std::size_t longest);

  int fd_;
  std::size_t size_ = 0; // of the buffer
  std::unique_ptr<char, Free> buffer_;
  std::size_t begin_ = 0; // of the bytes in the buffer that have not been passed yet
  std::size_t end_ = 0;
  bool ended_ = false;
};

} // namespace KOVA::Base

#endif
