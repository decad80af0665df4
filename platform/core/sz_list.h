#ifndef KOVAPLATFORM_CORE_SZ_LIST_H
#define KOVAPLATFORM_CORE_SZ_LIST_H

/// @file What stands behind the two public fields of a string list.

#include "kovaplatform/kovacore.h"

#include <string>
#include <string_view>
#include <vector>

namespace KovaPlatform {

struct StringList : KLIBCSzList {
  std::vector<std::string> strings;
};

/// Appends all of the texts, or nothing when memory runs out (then std::bad_alloc).
void appendAll(StringList &list, const std::vector<std::string_view> &texts);

} // namespace KovaPlatform

#endif
