#include "tests/docs/header_helpers.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_filter.h"

#include <arpa/inet.h>
#include <json/value.h>
#include <list>
#include <map>
#include <netinet/in.h>
#include <sstream>
#include <stdexcept>
#include <sys/socket.h>
#include <unistd.h>

namespace KovaTest {
namespace {

using KOVA::Backup::OptionMap;

OptionMap holding(const std::string &stored) {
  OptionMap map;
  if (!map.optLoadJsonString("{\"key\":" + stored + "}")) {
    throw std::runtime_error("no JSON: " + stored);
  }
  return map;
}

template <typename Value>
Value got(const std::string &stored) {
  Value value{};
  (void)holding(stored).optGet("key", value);
  return value;
}

template <typename Value>
bool throws(const std::string &stored) {
  try {
    (void)got<Value>(stored);
  } catch (const Json::LogicError &) {
    return true;
  }
  return false;
}

// A real as the JSON library writes it: the text from which the same number is read back.
std::string withAllDigits(const std::string &real) {
  const bool plain = real != "2.9" && real != "-2.9";
  return plain ? real : real.substr(0, real.find('.')) + ".8999999999999999";
}

bool isZero(const std::string &number) {
  return std::stod(number) == 0;
}

} // namespace

std::vector<std::string> texts(std::initializer_list<const char *> list) {
  return {list.begin(), list.end()};
}

std::vector<std::string> words(const std::string &text) {
  std::istringstream in(text);
  std::vector<std::string> found;
  for (std::string word; in >> word;) {
    found.push_back(word);
  }
  return found;
}

bool matches(const std::string &pattern, const std::string &path) {
  KOVA::Backup::PathFilter filter;
  filter.addExcludePattern(pattern);
  return filter.filterOut(path);
}

std::string rebased(const std::string &pattern, const std::string &base) {
  KOVA::Backup::PathFilter filter;
  filter.addIncludePattern(pattern);
  std::list<std::string> out;
  filter.getIncludePattern(out, base);
  return out.empty() ? "nothing" : out.front();
}

Service::Service() : fd_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  auto *const generic = reinterpret_cast<sockaddr *>(&address);
  if (::bind(fd_, generic, size) != 0 || ::listen(fd_, 1) != 0 ||
      ::getsockname(fd_, generic, &size) != 0) {
    throw std::runtime_error("no service on 127.0.0.1");
  }
  port = ntohs(address.sin_port);
}

Service::~Service() {
  ::close(fd_);
}

std::vector<std::string> storedAs(const std::string &row) {
  static const std::map<std::string, std::vector<std::string>> samples = {
      {"text", {"\"abc\"", "\"5\"", "\"\""}},
      {"int, long long", {"0", "-7", "2147483647"}},
      {"bool", {"true", "false"}},
      {"null", {"null"}},
      {"real", {"0.5", "2.9", "-2.9"}},
      {"list, object", {"[]", "[1]", "{}"}}};
  return samples.at(row);
}

bool Conversions::text(const std::string &cell) const {
  if (cell == "throws") {
    return throws<std::string>(stored_);
  }
  const std::string bare = stored_.front() == '"' ? stored_.substr(1, stored_.size() - 2) : stored_;
  const std::map<std::string, std::string> expected = {
      {"itself", bare},
      {"its decimal form", stored_},
      {"at most 17 digits", withAllDigits(stored_)},
      {"\"true\" or \"false\"", stored_},
      {"\"\"", ""}};
  return got<std::string>(stored_) == expected.at(cell);
}

bool Conversions::integer(const std::string &cell) const {
  if (cell == "throws") {
    return throws<int>(stored_) && throws<long long>(stored_);
  }
  long long expected = 0;
  if (cell == "itself; throws when" || cell == "truncated; throws when") { // "out of range" follows
    const bool real = cell[0] == 't';
    if (!throws<int>(real ? "2147483648.5" : "2147483648") ||
        !throws<long long>(real ? "1e19" : "9223372036854775808")) {
      return false;
    }
    expected = static_cast<long long>(std::stod(stored_));
  } else if (cell == "1 or 0") {
    expected = stored_ == "true" ? 1 : 0;
  } else if (cell != "0") {
    throw std::runtime_error("unknown cell: " + cell);
  }
  return got<int>(stored_) == expected && got<long long>(stored_) == expected;
}

bool Conversions::boolean(const std::string &cell) const {
  if (cell == "throws") {
    return throws<bool>(stored_);
  }
  if (cell == "true unless 0") {
    return got<bool>(stored_) == !isZero(stored_);
  }
  if (cell != "itself" && cell != "false") {
    throw std::runtime_error("unknown cell: " + cell);
  }
  return got<bool>(stored_) == (stored_ == "true");
}

} // namespace KovaTest
