#ifndef KOVAPLATFORM_CORE_SZ_LIST_H
#define KOVAPLATFORM_CORE_SZ_LIST_H

/// @file The string list, of which callers see the two public fields.

#include "kovaplatform/kovacore.h"

#include <string>
#include <string_view>
#include <vector>

namespace KovaPlatform {

struct StringList : KLIBCSzList {
  std::vector<std::string> strings;
};

/// Appends all of the texts, or throws std::bad_alloc and leaves the list as it was.
void appendAll(StringList &list, const std::vector<std::string_view> &texts);

} // namespace KovaPlatform

#endif
