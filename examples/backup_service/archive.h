#pragma once

/// @file Archives: tar, zstd, and age or gpg, connected by pipes, so that nothing but the finished
/// archive is ever written to a disk. Failures throw std::runtime_error with the message of the
/// program that caused them.

#include "support.h"

#include <kovabackup/service/cancel.h>
#include <string_view>

/// The request to stop all that the process does, which a signal makes. It counts as a failure.
KOVA::Backup::Service::Cancel &stop();

using LineAction = std::function<void(std::string_view line)>;

/// Makes an archive in the file with the descriptor archive. makeList is called when all programs
/// are known to be installed; it returns the paths to store, relative to "/" and each followed by
/// NUL. warn is called for each
/// line of tar about a path, tick at short intervals.
void writeArchive(const KOVA::Backup::OptionMap &task, int archive,
                  const std::function<File()> &makeList, const LineAction &warn,
                  const std::function<void()> &tick);

/// What decrypts an archive; an archive of another kind does not need it.
struct Key {
  std::string identity;   ///< path of a file with an identity of age
  std::string passphrase; ///< for gpg
};

/// Reads an archive to its end and prints the number of its entries. Throws unless it is complete
/// and undamaged.
void checkArchive(const std::string &path, const Key &key);

/// Extracts an archive into a folder, which is created if necessary. Each of the paths selects an
/// entry and everything below it. Without paths everything is extracted.
void restoreArchive(const std::string &path, const Key &key, const std::vector<std::string> &paths,
                    const std::string &folder);
