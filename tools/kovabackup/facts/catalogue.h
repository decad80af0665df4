#ifndef KOVABACKUP_TOOLS_CATALOGUE_H
#define KOVABACKUP_TOOLS_CATALOGUE_H

/// @file The log lines of the libraries and what they mean. The build translates docs/messages.toml
/// into the command, so nothing has to be installed beside it.

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

struct LogMessage {
  /// Module and number, as log lines have it: "session:126". The lines of the platform's stand-ins
  /// have none; theirs is a library and a word: "kovasdk:size".
  std::string id;
  std::string text;                 ///< the format; %m is the system's reason
  std::string from;                 ///< the functions that can write it
  std::string meaning;              ///< what happened
  std::string action;               ///< what to do about it
  std::string priority = "LOG_ERR"; ///< of syslog(3)
  bool plain = false;               ///< without process ID and tag

  std::string module() const { return id.substr(0, id.find(':')); }
};

/// All messages, in the order of the modules and their numbers.
const std::vector<LogMessage> &allMessages();

/// Returns: null when there is none with that id.
const LogMessage *findMessage(const std::string &id);

/// Finds the message that a log line is, whatever the system's logger has put before it; or takes
/// the text for an id.
/// Returns: the first id of a module that exists, known or not; "" when there is none.
std::string messageIdIn(const std::string &line);

/// Finds the platform's error code in a log line, as in "[0x0900 file:12]", or in a message of this
/// command, as in "platform error 0x0900", or reads one that is all of the text: "0x0900".
/// Returns: the code; -1 when there is none.
int platformCodeIn(const std::string &line);

} // namespace KOVA::Backup::Tool

#endif
