#ifndef KOVA_BASE_JSON_REALS_H
#define KOVA_BASE_JSON_REALS_H

/// @file Reads the reals of a JSON text separately from the rest of the text.
///
/// The JSON library reads a real through a stream that has the global C++ locale. Where the decimal
/// point of that locale is a comma, the library refuses 1.5 and reads 1.500 as 1500. When memory
/// runs out in the stream, the library reports a malformed text. So the library gets the text with
/// an integer in place of each real, and the reals are put into the value that it read:
///
///     const JsonReals reals(text);
///     if (parse(reals.masked(), value)) reals.restore(value);
///
/// Removal: this class can go as soon as the oldest jsoncpp that we build with reads reals under
///          the classic locale and throws std::bad_alloc when memory runs out there. The tests
///          JsonFromText.ReadsNumbersUnderEveryLocaleAlike and
///          JsonFromText.IsReadOrThrowsWhenMemoryRunsOut then pass without it.
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

  /// The text with each real replaced by 0 or -0 and spaces; everything else keeps its position.
  /// What strtod(3) does not accept as a number, or finds too large, stays: the JSON library
  /// refuses it.
  const std::string &masked() const { return reals_.empty() ? text_ : masked_; }

  /// Puts the reals into the value that the JSON library read from the masked text. They are found
  /// by the offsets that the library records in each value.
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
  std::vector<Real> reals_; // in text order
};

} // namespace KOVA::Base

#endif
