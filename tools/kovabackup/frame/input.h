#ifndef KOVABACKUP_TOOLS_INPUT_H
#define KOVABACKUP_TOOLS_INPUT_H

/// @file What the command reads: files whole, JSON, and names one by one. "-" stands for standard
/// input. What cannot be read throws a Failure that says why; a missing file is "not found".

#include "base/unique_fd.h"

#include <json/json.h>
#include <string>

namespace KOVA::Backup::Tool {

/// The whole of a file.
std::string readAll(const std::string &file);

/// The JSON object that a file holds; nothing may follow it.
Json::Value readJsonObject(const std::string &file);

/// Reads records that end in a line end or in a NUL byte; the last one may lack its end.
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
