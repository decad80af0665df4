// Loads a section: reads the lines of a section file and the JSON text of each option.

#include "base/json_memory.h"
#include "base/json_text.h"
#include "base/open_file.h"
#include "base/section_grammar.h"
#include "base/section_reader.h"
#include "common/log.h"
#include "kovabackup/option_map.h"
#include "option/option_map_private.h"

#include <algorithm>
#include <string_view>

namespace KOVA::Backup {
namespace {

namespace Grammar = Base::SectionGrammar;
using Base::SectionReader;
using Read = SectionReader::Read;

void logReadError(int number, const std::string &path) {
  Log::error(kOptionModule, number, "getline [%s]: %m", path.c_str());
}

// Returns: whether the file has the section, whose lines come next.
bool findSection(SectionReader &file, const SectionInfo &section) {
  const Read read = file.findSection(section.name);
  if (read == Read::Error) {
    logReadError(476, section.path);
  }
  return read == Read::Line;
}

// A list may be nested so deeply that it can be read on its own, but not as a member of an object.
bool fitsInObject(const Json::Value &value) {
  if ((!value.isArray() && !value.isObject()) || Base::JsonText::isFlat(value)) {
    return true;
  }
  Json::Value again;
  return Base::JsonText::fromText("[" + Base::JsonText::toText(value) + "]", again);
}

void readOption(const Grammar::Line &option, const std::string &path, Json::Value &options) {
  const std::string key(option.key);
  Json::Value value;
  if (Base::JsonText::fromText(option.value, value) && fitsInObject(value)) {
    Base::JsonMemory::withBadAlloc([&] { options[key] = std::move(value); });
    return;
  }
  const std::string text(option.value);
  const Json::Value left; // a failed parse leaves nothing
  Log::error(kOptionModule, 508, "json load failed key(%s) value(%s) out(%s) form %s", key.c_str(),
             text.c_str(), Base::JsonText::toText(left).c_str(), path.c_str());
}

// Returns: false on a read error, which is logged.
bool readOptions(SectionReader &file, const SectionInfo &section, Json::Value &options) {
  std::string_view text;
  Read read = file.nextInSection(text);
  while (read == Read::Line) {
    const Grammar::Line line = Grammar::parse(text);
    if (line.kind == Grammar::LineKind::Option) {
      readOption(line, section.path, options);
    }
    read = file.nextInSection(text);
  }
  if (read == Read::Error) {
    logReadError(515, section.path);
  }
  return read == Read::End;
}

// Converts the options to text and back, so that they are exactly what JSON text can represent.
// Flat options already are.
bool normalise(Json::Value &options) {
  return std::all_of(options.begin(), options.end(), Base::JsonText::isFlat) ||
         Base::JsonText::fromText(Base::JsonText::toText(options), options);
}

// Returns: whether the section was found and read. A FIFO without a writer reads as an empty file.
bool readSection(const SectionInfo &section, Json::Value &options) {
  const Base::UniqueFd fd = Base::openFile(section.path.c_str(), O_RDONLY);
  if (!fd || Base::isDevice(fd.get())) {
    return false;
  }
  SectionReader file(fd.get());
  return file && findSection(file, section) && readOptions(file, section, options);
}

} // namespace

bool OptionMap::optSectionLoad(const std::string &path, const std::string &prefix, int id) {
  (void)optClear();
  d->bind(path, prefix, id);
  if (!d->isBound()) {
    Log::error(kOptionModule, 625, "invalid sec [%s][%s]", path.c_str(), prefix.c_str());
    return false;
  }
  Json::Value options(Json::objectValue);
  if (!readSection(d->section, options)) {
    return false; // still bound: the map can be filled and saved
  }
  d->section.loaded = normalise(options);
  if (d->section.loaded) {
    d->values.swap(options);
  }
  return d->section.loaded;
}

} // namespace KOVA::Backup
