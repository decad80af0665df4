#include "tests/faults/log_lines.h"

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <map>

namespace KovaTest::Faults {
namespace {

// "module:number" -> the text up to its first value.
using Lines = std::map<std::string, std::string>;

std::string between(const std::string &line, const std::string &from, const std::string &to) {
  const std::size_t begin = line.find(from) + from.size();
  return line.substr(begin, line.rfind(to) - begin);
}

Lines readLines() {
  Lines lines;
  std::ifstream file(KOVA_TEST_SOURCE_DIR "/docs/messages.toml");
  std::string name;
  for (std::string line; std::getline(file, line);) {
    if (line.rfind("[\"", 0) == 0) {
      name = between(line, "[\"", "\"") + ":" + between(line, "\".", "]");
    } else if (line.rfind("text = \"", 0) == 0 && !name.empty()) {
      const std::string text = between(line, "text = \"", "\"");
      lines[name] = text.substr(0, text.find_first_of("%\\"));
    }
  }
  if (lines.size() < 50) {
    std::fprintf(stderr, "docs/messages.toml cannot be read\n");
    std::exit(EXIT_FAILURE);
  }
  return lines;
}

std::string withoutTag(const std::string &line) {
  for (const char *tag : {") [err] ", ") [debug] "}) {
    const std::size_t at = line.find(tag);
    if (line.rfind('(', 0) == 0 && at != std::string::npos) {
      return line.substr(at + std::string(tag).size());
    }
  }
  return line;
}

} // namespace

bool isKnownLogLine(const std::string &line) {
  static const Lines known = readLines();
  if (line.rfind("kovasdk: ", 0) == 0 || line.rfind("kovaplatform: ", 0) == 0) {
    return true;
  }
  const std::string text = withoutTag(line);
  const std::size_t space = text.find(' ');
  const auto found = known.find(text.substr(0, space));
  return found != known.end() && text.compare(space + 1, found->second.size(), found->second) == 0;
}

} // namespace KovaTest::Faults
