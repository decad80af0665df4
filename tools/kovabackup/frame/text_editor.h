#ifndef KOVABACKUP_TOOLS_TEXT_EDITOR_H
#define KOVABACKUP_TOOLS_TEXT_EDITOR_H

/// @file Text that the user changes with an editor.

#include "base/unique_fd.h"
#include "kovabackup/temp_manager.h"

#include <string>

namespace KOVA::Backup::Tool {

struct Context;

/// A text in a file that only the caller can read (0600), in a directory of its own (0700), where
/// the backup files of editors are private, too.
/// Owns:    the directory. The destructor removes it, unless keep was called last.
/// Errors:  throws a Failure.
class EditedText {
public:
  static constexpr const char *kFolderPrefix = "/tmp/kovabackup-edit.";
  static constexpr const char *kTextName = "section.conf";
  static constexpr const char *kSubjectName = "subject";

  /// subject is kept beside the text, so that a text that was left behind can be recognised.
  EditedText(const std::string &text, const std::string &subject);
  ~EditedText();
  EditedText(const EditedText &) = delete;
  EditedText &operator=(const EditedText &) = delete;

  /// Opens the editor and waits until it ends: VISUAL, EDITOR, or the first of sensible-editor,
  /// editor and vi that exists. It shares the terminal; with --json its output goes to standard
  /// error.
  /// Errors:  throws a Failure when the editor cannot be started or does not end with 0.
  /// Signals: SIGINT and SIGQUIT are left to the editor.
  void edit(const Context &context) const;

  std::string read() const;
  std::string path() const;

  void keep(bool kept = true) { kept_ = kept; }

  /// Whether the directory is that of an object that exists, in any process.
  static bool isOpen(int folder);

private:
  void write(const char *name, const std::string &text) const;

  ScopedTempFolder folder_;
  Base::UniqueFd lock_; ///< on the directory, while the object exists
  bool kept_ = false;
};

} // namespace KOVA::Backup::Tool

#endif
