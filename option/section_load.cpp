// Loads a section: reads the lines of a section file and the JSON text of each option.

#include "base/json_text.h"
#include "base/open_file.h"
#include "base/section_grammar.h"
#include "common/log.h"
#include "kovabackup/option_map.h"
#include "option/option_map_private.h"

#include <cstdio>
#include <cstdlib>
#include <string_view>

namespace KOVA::Backup {
namespace {

namespace Grammar = Base::SectionGrammar;

// A FIFO without a writer reads as an empty file.
FilePtr openForReading(const std::string &path) {
  Base::UniqueFd fd = Base::openFile(path.c_str(), O_RDONLY);
  if (!fd) {
    return nullptr;
  }
  FilePtr file(::fdopen(fd.get(), "r"));
  if (file) {
    (void)fd.release();
  }
  return file;
}

enum class Read { Line, End, Error };

// The lines of a file, of any length. All of them use the same buffer.
class LineReader {
public:
  explicit LineReader(std::FILE *file) : file_(file) {}
  ~LineReader() { ::free(buffer_); }
  LineReader(const LineReader &) = delete;
  LineReader &operator=(const LineReader &) = delete;

  // line is valid until the next call. errno is set on Error.
  Read next(std::string_view &line) {
    const ssize_t length = ::getline(&buffer_, &size_, file_);
    if (length < 0) {
      return std::feof(file_) != 0 ? Read::End : Read::Error;
    }
    if (std::ferror(file_) != 0) {
      return Read::Error; // the beginning of a line whose rest could not be read
    }
    line = std::string_view(buffer_, static_cast<std::size_t>(length));
    return Read::Line;
  }

private:
  std::FILE *file_;
  char *buffer_ = nullptr;
  std::size_t size_ = 0;
};

void logReadError(int number, const std::string &path) {
  Log::error(kOptionModule, number, "getline [%s]: %m", path.c_str());
}

// Reads up to the header. Returns: whether the file has one and the section's lines come next.
bool findSection(LineReader &lines, const SectionInfo &section) {
  std::string_view text;
  Read read = lines.next(text);
  while (read == Read::Line && !Grammar::isTakenForHeaderOf(Grammar::parse(text), section.name)) {
    read = lines.next(text);
  }
  if (read == Read::Error) {
    logReadError(476, section.path);
  }
  return read == Read::Line;
}

// A list may be nested so deeply that it can be read on its own, but not as a member of an object.
bool fitsInObject(const Json::Value &value) {
  if (!value.isArray() && !value.isObject()) {
    return true;
  }
  Json::Value again;
  return Base::JsonText::fromText("[" + Base::JsonText::toText(value) + "]", again);
}

void readOption(const Grammar::Line &option, const std::string &path, Json::Value &options) {
  const std::string key(option.key);
  const std::string text(option.value);
  Json::Value value;
  if (Base::JsonText::fromText(text, value) && fitsInObject(value)) {
    options[key] = std::move(value);
    return;
  }
  const Json::Value left; // a failed parse leaves nothing
  Log::error(kOptionModule, 508, "json load failed key(%s) value(%s) out(%s) form %s", key.c_str(),
             text.c_str(), Base::JsonText::toText(left).c_str(), path.c_str());
}

// Returns: false on a read error, which is logged.
bool readOptions(LineReader &lines, const SectionInfo &section, Json::Value &options) {
  std::string_view text;
  Read read = lines.next(text);
  while (read == Read::Line) {
    const Grammar::Line line = Grammar::parse(text);
    if (line.endsSection()) {
      return true;
    }
    if (line.kind == Grammar::LineKind::Option) {
      readOption(line, section.path, options);
    }
    read = lines.next(text);
  }
  if (read == Read::Error) {
    logReadError(515, section.path);
    return false;
  }
  return true;
}

// Returns: whether the section was found and read.
bool readSection(std::FILE *file, const SectionInfo &section, Json::Value &options) {
  LineReader lines(file);
  return findSection(lines, section) && readOptions(lines, section, options);
}

} // namespace

bool OptionMap::optSectionLoad(const std::string &path, const std::string &prefix, int id) {
  (void)optClear();
  d->bind(path, prefix, id);
  if (!d->isBound()) {
    Log::error(kOptionModule, 625, "invalid sec [%s][%s]", path.c_str(), prefix.c_str());
    return false;
  }
  FilePtr file = openForReading(path);
  Json::Value options(Json::objectValue);
  if (!file || !readSection(file.get(), d->section, options)) {
    return false; // still bound: the map can be filled and saved
  }
  file.reset();
  // Converted to text and back, so that the values are exactly what JSON text can represent.
  d->section.loaded = Base::JsonText::fromText(Base::JsonText::toText(options), d->values);
  return d->section.loaded;
}

} // namespace KOVA::Backup
