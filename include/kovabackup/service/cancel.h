#ifndef KOVABACKUP_SERVICE_CANCEL_H
#define KOVABACKUP_SERVICE_CANCEL_H

/// @file A request to stop that signal handlers and other threads can make.
///
///     Cancel cancel;                       // one for the run of a service
///     // in a handler of SIGTERM, or in another thread:
///     cancel.request();
///     // in the run, between two steps:
///     if (cancel.requested()) return false;
///
/// A request stays until the object is destroyed. A run that waits in poll(2) adds fd() to what it
/// waits for.
///
/// Owns:    an eventfd(2), close-on-exec. A forked child shares it until it runs a program.
/// Failure: the constructor throws std::system_error when no descriptor can be had.
/// Threads: any number of threads and signal handlers may call request and requested at once.
/// Process: no process-wide state.

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

class Cancel {
public:
  /// Makes an object without a request.
  /// Errors: std::system_error with eventfd(2)'s errno (EMFILE, ENFILE, ENOMEM).
  Cancel();
  ~Cancel();
  Cancel(const Cancel &) = delete;
  Cancel &operator=(const Cancel &) = delete;

  /// Makes the request. Further requests change nothing.
  /// Signals: async-signal-safe.
  /// errno:   unchanged.
  void request() noexcept;

  /// Returns: true once a request was made.
  /// Signals: async-signal-safe.
  /// errno:   unchanged.
  bool requested() const noexcept;

  /// A descriptor that is readable once a request was made, for poll(2) and its kind. Callers must
  /// neither read nor close it.
  int fd() const noexcept { return fd_; }

private:
  int fd_;
};

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
