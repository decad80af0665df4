// Any bytes as a section file: the options that are loaded from them are the same when they are
// read again from their JSON form, and from a section file that is written from it.

#include "base/json_text.h"
#include "kovabackup/option_map.h"

#include "fuzz/memory_file.h"
#include "fuzz/silent_log.h"
#include "fuzz/support.h"

using KOVA::Backup::OptionMap;
using KovaFuzz::require;
namespace JsonText = KOVA::Base::JsonText;

namespace {

const KovaFuzz::MemoryFile file;

bool load(OptionMap &map, const std::string &content) {
  file.write(content);
  return map.optSectionLoad(file.path(), "task", 1);
}

// Every key that was read can be written: it is trimmed and contains no '=', and it begins with
// neither '[' nor '#', because such a line is not an option.
std::string asSectionFile(const std::string &json) {
  Json::Value options;
  require(JsonText::fromText(json, options));
  std::string content = "# a comment\n[other]\nkey=0\n[task1]\n";
  for (const std::string &key : options.getMemberNames()) {
    content += key + "=" + JsonText::toText(options[key]) + "\n";
  }
  return content + "[task1]\nkey=1\n";
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  OptionMap map;
  if (!load(map, KovaFuzz::Input(data, size).rest())) {
    require(!map.optIsLoaded() && map.optToJsonString() == "null");
    return 0;
  }
  const std::string json = map.optToJsonString();
  OptionMap other;
  require(other.optLoadJsonString(json) && other.optToJsonString() == json);
  require(load(other, asSectionFile(json)) && other.optToJsonString() == json);
  return 0;
}
