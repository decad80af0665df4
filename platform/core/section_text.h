#ifndef KOVAPLATFORM_CORE_SECTION_TEXT_H
#define KOVAPLATFORM_CORE_SECTION_TEXT_H

/// @file The names in a section file, and changes of its text. Opening and replacing the file is
/// left to the callers.
///
/// base/section_grammar.h defines what a line means. Only a header with its ']' counts as one here.

#include "base/section_reader.h"
#include "platform/core/sz_hash.h"

#include <string>
#include <string_view>
#include <vector>

namespace KovaPlatform {

/// Reads the names of all sections, in the order of their headers. Names that contain a NUL are
/// left out, because C callers would see other names. Returns: false when the file cannot be read
/// further; errno says why.
bool readNames(KOVA::Base::SectionReader &file, std::vector<std::string> &names);

/// A text split into what is above a section, the section itself and what is below it.
struct SectionParts {
  bool found = false;

  /// Whether a broken header, "[name" and one other character, precedes the section, or occurs
  /// anywhere when the section is not found. Readers take that line for the header, so what is
  /// written to the section itself would never be read.
  bool hidden = false;

  std::string_view before; ///< all above the header; the complete text if not found
  std::string_view header; ///< the line of the header
  std::string_view body;   ///< the lines of the section
  std::string_view after;  ///< from the line of the next section on
};

/// Finds the first section of this name, which is the one that readers use.
SectionParts findSection(std::string_view text, std::string_view name);

/// Header and lines of the section in parts, which must be found, with its options replaced by the
/// pairs.
std::string rewriteSection(std::string_view text, const SectionParts &parts,
                           const KLIBCSzHash &pairs);

/// What to append to the text to give it a new section at its end.
std::string newSection(std::string_view text, std::string_view name, const KLIBCSzHash &pairs);

} // namespace KovaPlatform

#endif
