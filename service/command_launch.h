#ifndef KOVA_SERVICE_COMMAND_LAUNCH_H
#define KOVA_SERVICE_COMMAND_LAUNCH_H

/// @file The parent's side of a launch: prepares everything, creates the child, and learns whether
/// the program was executed.

#include "service/command_create.h"
#include "service/command_streams.h"

namespace KOVA::Backup::Service {

/// Starts the command.
/// Returns: true with child set when the program was executed; else false with error set, and no
///          child is left.
/// Log:     101 or 102 on failure.
bool launch(const CommandPrivate &command, const Streams &streams, Child &child, Error &error);

/// Logs that a command could not be prepared or created.
void logNotStarted(const CommandPrivate &command, const Error &error);

/// Whether the child has not been reaped, neither by us nor by a host that ignores SIGCHLD or waits
/// for any child. Until then its number is not reused.
bool isUnreaped(const Child &child) noexcept;

/// Sends a signal to the child, never to another process that got its number.
/// Returns: false with errno set.
bool sendTo(const Child &child, int sig) noexcept;

/// Waits for the end of a child that ends soon, and reaps it.
void reapQuietly(const Child &child);

} // namespace KOVA::Backup::Service

#endif
