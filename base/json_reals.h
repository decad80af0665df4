#ifndef KOVA_BASE_JSON_REALS_H
#define KOVA_BASE_JSON_REALS_H

/// @file The reals of a JSON text, read apart from the rest of it.
///
/// The JSON library reads a real through a stream. Under a global C++ locale whose decimal point is
/// a comma that refuses 1.5 and takes 1.500 for 1500; and where the stream finds no memory, the
/// library calls the text bad. So the library gets the text with a whole number in place of each
/// real, and the reals are put into what it made of that:
///
///     const JsonReals reals(text);
///     if (parse(reals.masked(), value)) reals.restore(value);
///
/// Failure: std::bad_alloc.
/// Threads: any.

#include <cstddef>
#include <json/value.h>
#include <string>
#include <vector>

namespace KOVA::Base {

class JsonReals {
public:
  /// text must outlive this object.
  explicit JsonReals(const std::string &text);

  /// The text with 0 or -0 and blanks for each real; all else stands where it stood. What is no
  /// number to strtod(3), or too large for it, stays: the JSON library refuses it.
  const std::string &masked() const { return reals_.empty() ? text_ : masked_; }

  /// Puts the reals into the value that the JSON library read from the masked text. It knows the
  /// places by the offsets that the library notes in what it reads.
  void restore(Json::Value &value) const;

private:
  struct Real {
    std::ptrdiff_t begin;
    double value;
  };

  void takeNumber(std::size_t begin, std::size_t end);
  void restoreIn(Json::Value &value) const;

  const std::string &text_;
  std::string masked_;
  std::vector<Real> reals_; // in the order of the text
};

} // namespace KOVA::Base

#endif
