#ifndef KOVABACKUP_TOOLS_OPTION_CHANGE_H
#define KOVABACKUP_TOOLS_OPTION_CHANGE_H

/// @file The verbs that change options: `option set` and `option unset`.

#include "tools/kovabackup/cli.h"

namespace KOVA::Backup::Tool {

/// "string", "int", "bool", "list"; "null", "real" or "object" for what only a hand can write.
const char *typeNameOf(const Json::Value &value);

void registerChangers(Family &family);

} // namespace KOVA::Backup::Tool

#endif
