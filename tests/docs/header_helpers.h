#ifndef KOVABACKUP_TESTS_HEADER_HELPERS_H
#define KOVABACKUP_TESTS_HEADER_HELPERS_H

/// @file Helpers for the tests of the examples in the headers; header_examples.toml calls them.

#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

namespace KovaTest {

/// The elements of a list in braces.
std::vector<std::string> texts(std::initializer_list<const char *> list);

/// The words of a text, split at white space.
std::vector<std::string> words(const std::string &text);

/// Whether a filter's pattern matches the path.
bool matches(const std::string &pattern, const std::string &path);

/// The pattern relative to base; "nothing" when it does not apply there.
std::string rebased(const std::string &pattern, const std::string &base);

/// A service that listens on a free port of this machine.
struct Service {
  Service();
  ~Service();
  Service(const Service &) = delete;
  Service &operator=(const Service &) = delete;

  int port = 0;

private:
  int fd_;
};

/// Values as JSON texts for a row of the table of conversions: "text", "real", ...
std::vector<std::string> storedAs(const std::string &row);

/// Compares what the getters return for a stored value with a cell of the table.
class Conversions {
public:
  explicit Conversions(std::string stored) : stored_(std::move(stored)) {}
  bool text(const std::string &cell) const;
  bool integer(const std::string &cell) const;
  bool boolean(const std::string &cell) const;

private:
  std::string stored_;
};

} // namespace KovaTest

#endif
