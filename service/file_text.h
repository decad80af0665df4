#ifndef KOVABACKUP_SERVICE_FILE_TEXT_H
#define KOVABACKUP_SERVICE_FILE_TEXT_H

/// @file The complete content of a file that another program wrote, such as one in /proc.

#include "kovabackup/service/error.h"

#include <string>

namespace KOVA::Backup::Service {

/// Reads a file to its end, or until enough bytes have been read. A FIFO is not waited for.
/// Returns: true with text set; on false error is set (open or read) and text is untouched.
bool readFileText(const std::string &path, std::string &text, Error &error,
                  std::size_t enough = std::string::npos);

} // namespace KOVA::Backup::Service

#endif
