#ifndef KOVA_SERVICE_COMMAND_STREAMS_H
#define KOVA_SERVICE_COMMAND_STREAMS_H

/// @file What a command's standard streams are connected to, made in the parent before the child.

#include "base/unique_fd.h"
#include "service/command_private.h"

#include <array>
#include <list>

namespace KOVA::Backup::Service {

/// Descriptors of a pipeline that replace what the command says; -1 for none.
struct Plumbing {
  int in = -1;
  int out = -1;
};

struct Streams {
  std::array<int, 3> standard{-1, -1, -1};     // what becomes descriptors 0 to 2
  std::array<Base::UniqueFd, 2> readEnds;      // of the streams that we read, non-blocking
  std::list<Base::UniqueFd> ownedUntilStarted; // what was opened for the child
};

/// Opens what the command says. All descriptors are close-on-exec and above 2, so that connecting
/// 0 to 2 overwrites none of them.
/// Returns: false with the failed step in error.
bool openStreams(const CommandPrivate &command, const Plumbing &plumbing, Streams &streams,
                 Error &error);

/// Makes a pipe as openStreams does, both ends blocking.
bool openPipe(Base::UniqueFd &readEnd, Base::UniqueFd &writeEnd, Error &error);

/// Makes a pipe that we read: its read end is non-blocking. The write end is another open file
/// description, so it is not.
bool openReadPipe(Base::UniqueFd &readEnd, Base::UniqueFd &writeEnd, Error &error);

} // namespace KOVA::Backup::Service

#endif
