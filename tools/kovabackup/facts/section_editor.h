#ifndef KOVABACKUP_TOOLS_SECTION_EDITOR_H
#define KOVABACKUP_TOOLS_SECTION_EDITOR_H

/// @file Reads and changes one section of a section file.
///
///     SectionEditor editor(context, file, section, token);   // locks, then loads
///     editor.map().optSet("retries", 3);
///     editor.save();                                         // writes, then unlocks
///
/// Errors are thrown as Failures: a missing file or section is "not found".

#include "kovabackup/option_map.h"
#include "kovabackup/service/run_lock.h"
#include "tools/kovabackup/frame/cli.h"

#include <json/json.h>
#include <list>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// Throws a Failure unless the file exists, is a regular file and can be read.
void requireSectionFile(const std::string &file);

/// Throws a Failure when it can be known that the file could not be changed.
void requireWritable(const std::string &file);

/// The names of the sections of a file, in its order.
std::list<std::string> sectionsOf(const std::string &file);

/// The lines of a section, without its header and without their line feeds, as they are in the
/// file. None for a section that does not exist.
std::vector<std::string> sectionLines(const std::string &file, const std::string &section);

/// The options that are written in a section of a file, as the texts of their values, whether or
/// not services can read them. None for a section that does not exist.
std::map<std::string, std::string> writtenOptions(const std::string &file,
                                                  const std::string &section);

/// Loads a section by its full name.
void loadSection(OptionMap &map, const std::string &file, const std::string &section);

/// All options of a map as one JSON object.
Json::Value valuesOf(const OptionMap &map);

/// The options that are written in a section of a file but are not among the values loaded from it,
/// because their values are not JSON.
std::set<std::string> unreadNames(const std::string &file, const std::string &section,
                                  const Json::Value &values);

/// Throws a Failure (wrong usage) for a name that readers of section files would not find again.
void requireOptionName(const std::string &name);
void requireSectionName(const std::string &name);

/// Whether a section can hold the value: text, booleans, integers of limited size, lists.
bool canBeWritten(const Json::Value &value);

/// The value as a section would hold it: of a real that is an integer, such as 5.0, the integer.
Json::Value asWritten(const Json::Value &value);

enum class Missing { Refuse, Make };

/// The lock to hold, if any, and how long to wait for it.
struct LockRequest {
  std::optional<std::string> token;
  Service::Millis limit{-1}; ///< negative: without limit
  /// What the user should read before a wait, which may be interrupted.
  std::string beforeWait = {};
};

/// Holds the lock of the token, if one is given, from before loading until after saving.
class SectionEditor {
public:
  /// With Missing::Make a missing file or section counts as empty, and save creates it.
  SectionEditor(Context &context, const std::string &file, const std::string &section,
                const LockRequest &request, Missing missing);

  OptionMap &map() { return map_; }

  /// True if the section did not exist.
  bool isNew() const { return isNew_; }

  /// Removes an option, even one whose value cannot be read.
  /// Returns: false if the section has no such option.
  bool remove(const std::string &name);

  /// Replaces all options, even those whose values cannot be read.
  void replaceAll(const Json::Value &values);

  /// Writes all options. Throws a Failure if that would lose an option of the file.
  void save();

private:
  void lock(Context &context, const LockRequest &request);
  void requireNothingLost() const;

  std::string file_;
  std::string section_;
  OptionMap map_;
  std::set<std::string> removed_;
  std::optional<Service::RunLock> lock_;
  bool isNew_ = false;
};

} // namespace KOVA::Backup::Tool

#endif
