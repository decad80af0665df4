#ifndef KOVA_SERVICE_COMMAND_PRIVATE_H
#define KOVA_SERVICE_COMMAND_PRIVATE_H

/// @file What a Command describes.

#include "kovabackup/service/command.h"

#include <array>
#include <map>

namespace KOVA::Backup::Service {

/// Where a standard stream that the command writes goes.
struct StreamTarget {
  enum class Kind { Fd, File, Capture, Lines };
  Kind kind = Kind::Fd;
  int fd = -1;           // of Fd; negative for /dev/null
  std::string path;      // of File
  int mode = 0;          // of File; 0 to leave the mode alone
  std::size_t limit = 0; // of Capture, and of a line
  std::function<void(std::string_view)> line;

  bool readByUs() const { return kind == Kind::Capture || kind == Kind::Lines; }
};

struct CommandPrivate {
  std::vector<std::string> args;
  std::map<std::string, std::string> envs;
  bool textInput = false;
  std::string inputText;
  int inputFd = -1; // negative for /dev/null
  std::array<StreamTarget, 2> targets;
  std::map<int, int> passed; // target -> source
  Millis limit{-1};
  Millis grace{5000};
  bool ownGroup = false;
  bool diesWithUs = true;
  Millis interval{-1};
  std::function<void()> tick;
  Cancel *cancel = nullptr;

  const char *program() const { return args.empty() ? "" : args.front().c_str(); }
};

} // namespace KOVA::Backup::Service

#endif
