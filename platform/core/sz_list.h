#ifndef KOVAPLATFORM_CORE_SZ_LIST_H
#define KOVAPLATFORM_CORE_SZ_LIST_H

/// @file The string list, of which callers see the two public fields.

#include "kovaplatform/kovacore.h"

#include <functional>
#include <string>
#include <vector>

namespace KovaPlatform {

struct StringList : KLIBCSzList {
  std::vector<std::string> strings;
};

/// Appends the texts that add appends to the strings. If it returns false or throws, the list is as
/// it was before.
/// Returns: what add returns.
bool appendAll(StringList &list, const std::function<bool(std::vector<std::string> &)> &add);

} // namespace KovaPlatform

#endif
