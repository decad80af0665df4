#ifndef KOVABACKUP_TESTS_PLAIN_REPLACE_H
#define KOVABACKUP_TESTS_PLAIN_REPLACE_H

/// @file The plain oracle of replaceMustache, for the tests and the fuzz target.

#include <boost/function.hpp>
#include <string>

namespace KovaTest {

/// A literal transcription of the rules; every search starts from the text itself.
inline std::string
plainReplace(const std::string &text,
             const boost::function<bool(const std::string &, std::string &)> &mapper) {
  std::string out;
  std::size_t pos = 0;
  std::size_t open = text.find("{{");
  std::size_t next = text.find("{{", open + 1);
  std::size_t close = text.find("}}", open + 2);
  while (open != std::string::npos && close != std::string::npos) {
    if (next != std::string::npos && next < close) {
      open = next;
      next = text.find("{{", open + 1);
      continue;
    }
    out += text.substr(pos, open - pos);
    std::string value;
    if (mapper(text.substr(open + 2, close - open - 2), value)) {
      out += value;
    }
    pos = close + 2;
    open = text.find("{{", pos);
    next = text.find("{{", open + 1);
    close = text.find("}}", open + 2);
  }
  return out + text.substr(pos);
}

/// Different names have different results, and half of the names have no value.
inline bool tellNames(const std::string &name, std::string &value) {
  value = "<" + name + "{{a}}>";
  return name.size() % 2 == 0;
}

} // namespace KovaTest

#endif
