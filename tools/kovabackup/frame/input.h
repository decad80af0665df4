#ifndef KOVABACKUP_TOOLS_INPUT_H
#define KOVABACKUP_TOOLS_INPUT_H

/// @file What the command reads: entire files, JSON objects, and names one by one. "-" is standard
/// input.
///
/// Failure: a Failure with the reason is thrown; a missing file counts as "not found".

#include "base/unique_fd.h"

#include <json/json.h>
#include <string>

namespace KOVA::Backup::Tool {

/// The contents of a file.
std::string readAll(const std::string &file);

/// The JSON object that a file contains. Nothing may follow it.
Json::Value readJsonObject(const std::string &file);

/// Reads records that end in a line feed or in a NUL byte. The last one may lack it.
class RecordReader {
public:
  RecordReader(const std::string &file, bool null);

  /// Returns: false at the end of the input; record is then unchanged.
  bool next(std::string &record);

private:
  bool fill();

  std::string file_;
  KOVA::Base::UniqueFd fd_; ///< none for standard input
  char end_;
  std::string buffer_;
  std::size_t begin_ = 0;
  bool atEnd_ = false;
};

} // namespace KOVA::Backup::Tool

#endif
