#ifndef KOVABACKUP_TOOLS_OPTION_VIEW_H
#define KOVABACKUP_TOOLS_OPTION_VIEW_H

/// @file How the option commands present an option: as text and as JSON.

#include "tools/kovabackup/frame/cli.h"

#include <json/json.h>
#include <string>

namespace KOVA::Backup::Tool {

/// The value as JSON text on one line, as in a section file.
std::string compact(const Json::Value &value);

/// The value as `option set` accepts it: text without quotes, anything else as JSON.
std::string bare(const Json::Value &value);

/// The name of the value's type. "null", "real" and "object" are readable, but are only written by
/// hand: no section with one can be saved.
const char *typeNameOf(const Json::Value &value);

/// "a string", "an int".
std::string withArticle(const std::string &type);

/// Reports that an option has got another type.
std::string retypeRemark(const std::string &name, const Json::Value &old, const std::string &type);

/// An object with "name", "type" and "value".
Json::Value jsonOption(const std::string &name, const Json::Value &value);

} // namespace KOVA::Backup::Tool

#endif
