#ifndef KOVABACKUP_SERVICE_SESSION_NAMES_H
#define KOVABACKUP_SERVICE_SESSION_NAMES_H

/// @file The names of sessions and of the folder that holds them.

#include "kovabackup/service/error.h"

#include <string>

namespace KOVA::Backup::Service {

constexpr const char *kLocalPrefix = "sess.";
constexpr const char *kVolumePrefix = "seln.";

/// prefix and exactly six ASCII letters or digits.
bool isSessionName(const std::string &name, const char *prefix);

std::string sessionRoot();

/// Chooses a random session name.
/// Returns: true with name set; false with error set.
bool chooseName(const char *prefix, std::string &name, Error &error);

} // namespace KOVA::Backup::Service

#endif
