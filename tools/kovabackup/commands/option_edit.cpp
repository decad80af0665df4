#include "tools/kovabackup/commands/option_edit.h"

#include "kovabackup/option_map.h"
#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/edited_section.h"
#include "tools/kovabackup/commands/lock_options.h"
#include "tools/kovabackup/commands/option_view.h"
#include "tools/kovabackup/facts/kept_edits.h"
#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/frame/prompt.h"
#include "tools/kovabackup/frame/text.h"
#include "tools/kovabackup/frame/text_editor.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct EditOptions {
  std::string file;
  std::string section;
  bool retype = false;
  LockOptions lock;
};

// As they would be written, so that 5.0 in a file is not a change of 5 in the edited text.
Json::Value writtenValues(const OptionMap &map) {
  Json::Value values = valuesOf(map);
  for (Json::Value &value : values) {
    value = asWritten(value);
  }
  return values;
}

// What the user sees of the section.
ShownSection readSection(const EditOptions &options) {
  OptionMap map;
  loadSection(map, options.file, options.section);
  requireWritable(options.file); // before the user edits for nothing
  return {sectionLines(options.file, options.section), writtenValues(map)};
}

// The options of a section, those that services cannot read as null: an edited text holds no null.
Json::Value allOptions(const EditOptions &options, Json::Value values) {
  for (const std::string &name : unreadNames(options.file, options.section, values)) {
    values[name] = Json::Value();
  }
  return values;
}

std::string joined(const std::vector<std::string> &lines) {
  std::string text;
  for (const std::string &line : lines) {
    text += line + '\n';
  }
  return text;
}

/// One call of the command: what was shown, and the file in which it is edited.
class Editing {
public:
  Editing(Context &context, const EditOptions &options)
      : context_(&context),
        options_(&options),
        shown_(readSection(options)),
        subject_(textSubject(options.file, options.section)),
        instructions_(instructionsFor(options.file, options.section) + aboutEarlier()),
        original_(instructions_ + joined(shown_.lines)),
        text_(original_, subject_) {}

  const ShownSection &shown() const { return shown_; }
  /// The file with the text is not needed any more.
  void discard() { text_.keep(false); }

  // Returns: nullopt when the user left the text as it was.
  std::optional<EditedSection> untilReadable() {
    for (;;) {
      runEditor();
      const std::string text = text_.read();
      if (text == original_) {
        return std::nullopt;
      }
      text_.keep(); // before anything can fail
      try {
        return readEdited(text, instructions_, shown_, options_->retype);
      } catch (const Failure &failure) {
        askAgain(failure);
      }
    }
  }

  // The lock is not held while the user edits, so that no service waits for a person. What was
  // shown is compared instead.
  void save(const EditedSection &edited) {
    LockRequest request = lockRequest(options_->lock);
    request.beforeWait = fmt::format("until then {}", place());
    try {
      SectionEditor editor(*context_, options_->file, options_->section, request, Missing::Refuse);
      if (sectionLines(options_->file, options_->section) != shown_.lines) {
        throw Failure(kFailed, fmt::format("another process changed section '{}' of {} meanwhile; "
                                           "nothing was written",
                                           options_->section, options_->file));
      }
      editor.replaceAll(edited.values);
      editor.save();
    } catch (const Failure &failure) {
      throw Failure(failure.exitCode(), withPlace(failure));
    }
  }

private:
  // Both in a remark and, since editors clear the screen, as a comment of the text.
  std::string aboutEarlier() const {
    std::string comments;
    for (const KeptEdit &edit : keptEdits()) {
      if (edit.subject == subject_) {
        const std::string earlier = fmt::format("a text of this section that was edited {} ago was "
                                                "not saved: {}",
                                                humanAge(edit.age), edit.file);
        if (!context_->json) {
          context_->remark(earlier);
        }
        comments += fmt::format("# {}\n", earlier);
      }
    }
    return comments.empty() ? "" : comments + "\n";
  }

  std::string place() const { return fmt::format("the edited text is kept in {}", text_.path()); }

  std::string withPlace(const Failure &failure) const {
    return fmt::format("{}; {}", failure.what(), place());
  }

  // An editor may fail after it has saved.
  void runEditor() {
    try {
      text_.edit(*context_);
    } catch (const Failure &failure) {
      if (text_.read() == original_) {
        text_.keep(false); // an earlier round may have changed it
        throw Failure(kFailed, fmt::format("{}; nothing was changed", failure.what()));
      }
      text_.keep();
      throw Failure(kFailed, withPlace(failure));
    }
  }

  // The place is named before the question, at which the user may also interrupt the command.
  void askAgain(const Failure &failure) {
    if (context_->json || !canAsk(*context_)) {
      throw Failure(kFailed, withPlace(failure));
    }
    context_->reportError(kFailed, withPlace(failure));
    if (!confirm(*context_, "Edit it again?")) {
      throw Failure(kFailed, "nothing was changed");
    }
  }

  Context *context_;
  const EditOptions *options_;
  ShownSection shown_;
  std::string subject_;
  std::string instructions_;
  std::string original_;
  EditedText text_;
};

// The names of the options that have another value, or none, or are new.
Json::Value changedNames(const Json::Value &before, const Json::Value &after) {
  Json::Value all = before;
  for (const std::string &name : after.getMemberNames()) {
    all[name] = after[name];
  }
  Json::Value names(Json::arrayValue);
  for (const std::string &name : all.getMemberNames()) {
    if (!before.isMember(name) || !after.isMember(name) || before[name] != after[name]) {
      names.append(jsonName(name));
    }
  }
  return names;
}

void report(Context &context, const EditOptions &options, const Json::Value &before,
            const Json::Value &after) {
  context.document["file"] = jsonName(options.file);
  context.document["section"] = jsonName(options.section);
  context.document["changed"] = changedNames(before, after);
}

void remarkOn(Context &context, const EditedSection &edited, const Json::Value &before) {
  if (context.json) {
    return;
  }
  if (edited.commentsDiffer) {
    context.remark("changes to comments are not saved; the comments in the file remain");
  }
  for (const std::string &name : edited.retyped) {
    context.remark(retypeRemark(name, before[name], typeNameOf(edited.values[name])));
  }
}

int edit(Context &context, const EditOptions &options) {
  (void)lockRequest(options.lock); // wrong usage is reported before the user edits
  Editing editing(context, options);
  const Json::Value before = allOptions(options, editing.shown().values);
  const std::optional<EditedSection> edited = editing.untilReadable();
  const bool changed = edited && edited->values != before;
  if (changed) {
    editing.save(*edited);
  }
  editing.discard();
  report(context, options, before, edited ? edited->values : before);
  if (edited) {
    remarkOn(context, *edited, before);
  }
  if (!changed && !context.json) {
    context.remark("no option was changed; nothing was written");
  }
  return kDone;
}

} // namespace

void registerEdit(CommandGroup &group) {
  auto options = std::make_shared<EditOptions>();
  Command command = group.command("edit", "Change the options of a section in an editor");
  command.argument(options->file, "FILE", "the section file")
      .completes(Completes::Files)
      .argument(options->section, "SECTION", "the section's full name, id included")
      .completes(sectionNames)
      .flag(options->retype, "--retype", "allow options to get another type");
  declareLock(command, options->lock);
  command
      .note("Opens VISUAL, EDITOR, or the system's editor on the section as it is in the file, "
            "secrets as their cipher text. The lock is not held meanwhile: it is taken when the "
            "editor has ended, and nothing is written when the section has changed since it was "
            "shown.")
      .note("Text that could not be read back is refused; the message names the line, and on a "
            "terminal the editor can be opened again. Unless it was saved, the edited text is kept "
            "in the private file that the message names. Ends with 0 when nothing was changed, and "
            "with 3 when there is no such file or section.")
      .example("kovabackup option edit /etc/backup/task.conf task12 --lock task.conf")
      .example("EDITOR='emacs -nw' kovabackup option edit task.conf task12 --retype")
      .action([options](Context &c) { return edit(c, *options); });
}

} // namespace KOVA::Backup::Tool
