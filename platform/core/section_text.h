#ifndef KOVAPLATFORM_CORE_SECTION_TEXT_H
#define KOVAPLATFORM_CORE_SECTION_TEXT_H

/// @file The text of section files, without the files.
///
/// What a line means is defined in base/section_grammar.h. A header needs its ']' here.

#include "platform/core/sz_hash.h"

#include <string>
#include <string_view>
#include <vector>

namespace KovaPlatform {

/// The names of all sections, in the order of their headers. Left out are those that hold a NUL:
/// as C strings they would be other names.
std::vector<std::string_view> sectionNames(std::string_view text);

/// A text in three parts, of which the one between is edited.
struct SectionParts {
  bool found = false;

  /// A line before the section, or anywhere when there is none, that readers take for its header
  /// though it is none: "[name" and one more character. What is written to the section would not
  /// be read.
  bool hidden = false;

  std::string_view before; ///< all above the header; the whole text when there is no such section
  std::string_view header; ///< the header's line
  std::string_view body;   ///< the section's lines
  std::string_view after;  ///< from the next section's line on
};

/// Finds the first section of the name: the one that readers take.
SectionParts findSection(std::string_view text, std::string_view name);

/// Header and lines of a section that is found, with the pairs in place of its options.
std::string rewriteSection(std::string_view text, const SectionParts &parts,
                           const KLIBCSzHash &pairs);

/// What is to follow the text for it to have a new section at its end.
std::string newSection(std::string_view text, std::string_view name, const KLIBCSzHash &pairs);

} // namespace KovaPlatform

#endif
