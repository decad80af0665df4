#ifndef KOVABACKUP_TOOLS_EDITED_SECTION_H
#define KOVABACKUP_TOOLS_EDITED_SECTION_H

/// @file Reads the text of a section that a person has edited.
///
/// Services pass over what they cannot read in a section file, and the next save loses it. Text
/// that has just been edited is therefore read strictly, and a message names the line that is
/// wrong.

#include <json/json.h>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// A section as it was shown to the user.
struct ShownSection {
  std::vector<std::string> lines; ///< as in the file, without the header
  Json::Value values;             ///< of the options that services can read
};

struct EditedSection {
  Json::Value values = Json::Value(Json::objectValue); ///< of all options
  std::vector<std::string> retyped;                    ///< the options that have another type now
  bool commentsDiffer = false; ///< a comment was changed, which no section can take over
};

/// The explanation above the options of a section, as comments. Its lines do not count as changes.
std::string instructionsFor(const std::string &file, const std::string &section);

/// Reads what an editor left.
/// Errors: throws a Failure that names the first line that is not an option or a comment, repeats a
///         name, or has a value that no section can hold or, unless retype is given, that has
///         another type than before; and one for a text that is empty, as a failed save leaves it.
EditedSection readEdited(const std::string &text, const std::string &instructions,
                         const ShownSection &shown, bool retype);

} // namespace KOVA::Backup::Tool

#endif
