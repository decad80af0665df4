#ifndef KOVABACKUP_TOOLS_SECTION_EDITOR_H
#define KOVABACKUP_TOOLS_SECTION_EDITOR_H

/// @file One section of a section file, to look at and to change.
///
///     SectionEditor editor(context, file, section, token);   // locks, then loads
///     editor.map().optSet("retries", 3);
///     editor.save();                                         // writes, then unlocks
///
/// Errors are thrown as Failures: a missing file or section is "not found".

#include "kovabackup/option_map.h"
#include "tools/kovabackup/frame/cli.h"

#include <json/json.h>
#include <set>
#include <string>

namespace KOVA::Backup::Tool {

/// Throws a Failure unless the file is there and can be read.
void requireSectionFile(const std::string &file);

/// Loads a section by its full name.
void loadSection(OptionMap &map, const std::string &file, const std::string &section);

/// All options of a map as one JSON object.
Json::Value valuesOf(const OptionMap &map);

/// The options that stand in a section of a file without being among its values: what they hold is
/// no JSON.
std::set<std::string> unreadNames(const std::string &file, const std::string &section,
                                  const Json::Value &values);

/// Throws a Failure (wrong usage) for a name that a section file could not give back.
void requireOptionName(const std::string &name);
void requireSectionName(const std::string &name);

enum class Missing { Refuse, Make };

/// Holds the lock of the token, if there is one, from before the load until after the save.
class SectionEditor {
public:
  /// With Missing::Make a missing file or section counts as empty and is made by save.
  SectionEditor(Context &context, const std::string &file, const std::string &section,
                const std::optional<std::string> &token, Missing missing);
  ~SectionEditor();
  SectionEditor(const SectionEditor &) = delete;
  SectionEditor &operator=(const SectionEditor &) = delete;

  OptionMap &map() { return map_; }

  /// True when the section was not there.
  bool isNew() const { return isNew_; }

  /// Removes an option, also one whose value cannot be read. Returns: false when there is none.
  bool remove(const std::string &name);

  /// Writes all options. Refuses when an option that stands in the file could not be written back.
  void save();

private:
  void lock(Context &context, const std::string &token);
  void requireNothingLost() const;

  std::string file_;
  std::string section_;
  OptionMap map_;
  std::set<std::string> removed_;
  bool locked_ = false;
  bool isNew_ = false;
};

} // namespace KOVA::Backup::Tool

#endif
