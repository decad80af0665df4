#ifndef KOVABACKUP_TOOLS_COMPLETIONS_H
#define KOVABACKUP_TOOLS_COMPLETIONS_H

/// @file What shells offer for the arguments and options that several commands share. Each function
/// is given the arguments before the one to complete.
/// Errors: may throw a Failure; then nothing is offered.

#include "tools/kovabackup/frame/declaration.h"

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

std::vector<Candidate> sessionIds(const std::vector<std::string> &arguments);

/// The directories of lost sessions.
std::vector<Candidate> lostSessions(const std::vector<std::string> &arguments);

/// The sections of the file that is the first argument.
std::vector<Candidate> sectionNames(const std::vector<std::string> &arguments);

/// The options in the section that is the second argument.
std::vector<Candidate> optionNames(const std::vector<std::string> &arguments);

std::vector<Candidate> optionTypes(const std::vector<std::string> &arguments);
std::vector<Candidate> lockTokens(const std::vector<std::string> &arguments);
std::vector<Candidate> volumeRules(const std::vector<std::string> &arguments);
/// The log messages that `kovabackup explain` knows.
std::vector<Candidate> messageIds(const std::vector<std::string> &arguments);
std::vector<Candidate> ages(const std::vector<std::string> &arguments);

} // namespace KOVA::Backup::Tool

#endif
