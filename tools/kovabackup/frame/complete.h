#ifndef KOVABACKUP_TOOLS_COMPLETE_H
#define KOVABACKUP_TOOLS_COMPLETE_H

/// @file Completion: what can follow the words that have been typed.
///
/// The completions of the shells (tools/completion) know nothing about commands. They ask:
///
///     kovabackup __complete -- WORD...     # the words after kovabackup, the last one being typed
///
/// The first line of the answer says what the last word can become:
///
///     words        one of the words that follow, one a line: WORD, a tab, an explanation
///     files [N]    the path of a file or directory, after its first N bytes
///     command N    the words from number N on (the first WORD is 0) are another command line
///
/// The words are not filtered by what has been typed so far: each shell matches in its own way.

#include "tools/kovabackup/frame/declaration.h"

namespace KOVA::Backup::Tool {

/// Declares the command __complete, which help and suggestions do not show.
void declareComplete(Declaration &root);

} // namespace KOVA::Backup::Tool

#endif
