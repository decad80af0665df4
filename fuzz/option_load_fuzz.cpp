// Any bytes as a section file: the options that are loaded from them are the same when they are
// read again from their JSON form, and from a section file that is written from it.

#include "base/json_text.h"
#include "kovabackup/option_map.h"

#include <cstdint>
#include <cstdlib>
#include <string>
#include <sys/mman.h>
#include <syslog.h>
#include <unistd.h>

using KOVA::Backup::OptionMap;
namespace JsonText = KOVA::Base::JsonText;

// A line for each value that is not JSON would flood the system log. Weak: where tests replay the
// corpus, their own definition is used.
extern "C" {
__attribute__((weak)) void syslog(int, const char *, ...) {}
__attribute__((weak)) void __syslog_chk(int, int, const char *, ...) {}
}

namespace {

void check(bool holds) {
  if (!holds) {
    std::abort();
  }
}

// A file in memory, named by its descriptor.
class MemoryFile {
public:
  explicit MemoryFile(const std::string &content) : fd_(::memfd_create("conf", MFD_CLOEXEC)) {
    check(::write(fd_, content.data(), content.size()) == static_cast<ssize_t>(content.size()));
  }
  ~MemoryFile() { ::close(fd_); }
  MemoryFile(const MemoryFile &) = delete;
  MemoryFile &operator=(const MemoryFile &) = delete;

  std::string path() const { return "/proc/self/fd/" + std::to_string(fd_); }

private:
  int fd_;
};

bool load(OptionMap &map, const std::string &content) {
  const MemoryFile file(content);
  return map.optSectionLoad(file.path(), "task", 1);
}

// Every key that was read can be written: it is trimmed and contains no '=', and it begins with
// neither '[' nor '#', because such a line is not an option.
std::string asSectionFile(const std::string &json) {
  Json::Value options;
  check(JsonText::fromText(json, options));
  std::string content = "# a comment\n[other]\nkey=0\n[task1]\n";
  for (const std::string &key : options.getMemberNames()) {
    content += key + "=" + JsonText::toText(options[key]) + "\n";
  }
  return content + "[task1]\nkey=1\n";
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  OptionMap map;
  if (!load(map, std::string(data, data + size))) {
    check(!map.optIsLoaded() && map.optToJsonString() == "null");
    return 0;
  }
  const std::string json = map.optToJsonString();
  OptionMap other;
  check(other.optLoadJsonString(json) && other.optToJsonString() == json);
  check(load(other, asSectionFile(json)) && other.optToJsonString() == json);
  return 0;
}
