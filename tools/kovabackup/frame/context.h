#ifndef KOVABACKUP_TOOLS_CONTEXT_H
#define KOVABACKUP_TOOLS_CONTEXT_H

/// @file What a command runs with: its output streams, its JSON document, exit codes and failures.

#include "tools/kovabackup/frame/output.h"

#include <functional>
#include <stdexcept>
#include <string>
#include <string_view>

namespace KOVA::Backup::Tool {

constexpr int kDone = 0;
constexpr int kFailed = 1;
constexpr int kUsage = 2;
constexpr int kNegative = 3; ///< not found, or a negative answer
constexpr int kTimedOut = 4;

/// Version of the layout of every JSON document. Members may be added without a new number.
constexpr int kSchemaVersion = 1;

/// Why a command cannot go on: the exit code and a sentence for the user.
class Failure : public std::runtime_error {
public:
  Failure(int exitCode, const std::string &message)
      : std::runtime_error(message), exitCode_(exitCode) {}
  int exitCode() const { return exitCode_; }

private:
  int exitCode_;
};

/// What every command is given: the options that all commands share, the streams, the document.
struct Context {
  bool help = false;    ///< --help was given
  bool version = false; ///< --version was given
  bool json = false;    ///< --json was given: results and errors form one JSON document
  bool noColor = false; ///< --no-color was given
  bool quiet = false;   ///< --quiet was given: no remarks
  bool verbose = false; ///< --verbose was given: log lines of the libraries are shown
  Output out{1};        ///< results
  Output messages{2};   ///< everything else
  Json::Value document; ///< results, with --json
  /// Called when the results could not be written, to undo changes that the user will not hear of.
  std::function<void()> undo;
  std::string command; ///< the words that called the command: "kovabackup session list"

  Context();

  /// Reports a failure after which the command goes on: to the stream of messages, or in the
  /// document's "errors".
  void reportError(int exitCode, const std::string &message);

  /// Reports the failure that ends the command. After wrong usage it also says where to find help.
  void fail(const Failure &failure);

  /// Writes a remark to the stream of messages, unless --quiet was given. Remarks never go into the
  /// document.
  void remark(const std::string &message);

  /// Begins the document with a list that is written while it grows, for lists too large to hold in
  /// memory. The other members of the document follow after its end.
  void beginList(const std::string &name);
  /// Writes an entry of that list, given as JSON text.
  void listEntry(std::string_view entry);

  /// Writes the document, or what is left of it after a list.
  void writeDocument();

private:
  std::string bodyOf(const std::string &message) const;

  bool listing_ = false;
  bool firstEntry_ = true;
};

} // namespace KOVA::Backup::Tool

#endif
