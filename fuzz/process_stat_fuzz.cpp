// What the kernel writes in /proc/PID/stat. Any text is read as its plain rules say. A line that is
// written as the kernel does, for a process of any name, state and start, is read as it was meant.
//
// Input: the byte 0 and a text, or another byte and the state in one byte, the start in eight and
// the name.

#include "service/process_facts.h"

#include "fuzz/support.h"

#include <optional>
#include <vector>

namespace {

using KOVA::Backup::Service::ProcessFacts;
using KOVA::Backup::Service::readProcessFacts;
using KovaFuzz::require;

// Words with spaces between them, however many.
std::vector<std::string> wordsOf(const std::string &text) {
  std::vector<std::string> words;
  bool inWord = false;
  for (const char byte : text) {
    if (byte != ' ' && !inWord) {
      words.emplace_back();
    }
    inWord = byte != ' ';
    if (inWord) {
      words.back() += byte;
    }
  }
  return words;
}

std::optional<std::uint64_t> numberIn(const std::string &word) {
  std::uint64_t number = 0;
  for (const char byte : word) {
    const auto digit = static_cast<unsigned>(static_cast<unsigned char>(byte)) - '0';
    if (digit > 9 || number > (UINT64_MAX - digit) / 10) {
      return std::nullopt;
    }
    number = number * 10 + digit;
  }
  return word.empty() ? std::nullopt : std::optional<std::uint64_t>(number);
}

// The name is between the first "(" and the last ")". The state is the first word after that, the
// start the 20th.
std::optional<ProcessFacts> readPlainly(const std::string &text) {
  const std::size_t open = text.find('(');
  const std::size_t close = text.rfind(')');
  if (open == std::string::npos || close == std::string::npos || close < open) {
    return std::nullopt;
  }
  const std::vector<std::string> words = wordsOf(text.substr(close + 1));
  if (words.size() < 20 || words[0] == "Z" || words[0] == "X" || !numberIn(words[19])) {
    return std::nullopt;
  }
  ProcessFacts facts;
  facts.command = text.substr(open + 1, close - open - 1);
  facts.start = *numberIn(words[19]);
  return facts;
}

void checkText(const std::string &text) {
  const std::optional<ProcessFacts> expected = readPlainly(text);
  ProcessFacts facts;
  facts.command = "before";
  facts.start = 1;
  require(readProcessFacts(text, facts) == expected.has_value());
  require(facts.command == (expected ? expected->command : "before"));
  require(facts.start == (expected ? expected->start : 1));
}

void checkWritten(char state, std::uint64_t start, const std::string &name) {
  std::string line = "4711 (" + name + ") " + state;
  for (int word = 4; word < 22; ++word) {
    line += word == 8 ? " -1" : " 4194304";
  }
  line += " " + std::to_string(start) + " 2048 50 18446744073709551615 1 1 0\n";
  ProcessFacts facts;
  const bool lives = state != 'Z' && state != 'X';
  require(readProcessFacts(line, facts) == lives);
  require(!lives || (facts.command == name && facts.start == start));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  if (input.byte() == 0) {
    checkText(input.rest());
    return 0;
  }
  const auto state = static_cast<char>('A' + input.byte() % 26);
  std::uint64_t start = 0;
  for (unsigned bits = 0; bits < 64; bits += 8) {
    start |= static_cast<std::uint64_t>(input.byte()) << bits;
  }
  checkWritten(state, start, input.rest());
  return 0;
}
