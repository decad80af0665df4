// The JSON form of an option map: its values, without binding or lock.

#include "base/json_text.h"
#include "kovabackup/option_map.h"
#include "option/option_map_private.h"

#include <ostream>
#include <utility>

namespace KOVA::Backup {

std::string OptionMap::optToJsonString() const {
  return Base::JsonText::toText(d->values);
}

bool OptionMap::optLoadJsonString(const std::string &text) {
  return Base::JsonText::fromText(text, d->values);
}

bool OptionMap::optAppendJsonString(const std::string &text) {
  Json::Value merged;
  // A text that is not JSON leaves null, and so nothing to merge.
  (void)Base::JsonText::fromText(text, merged);
  if (!merged.isObject()) {
    return true; // asking any other value for its members would throw
  }
  for (const std::string &key : merged.getMemberNames()) {
    d->store(key, std::move(merged[key]));
  }
  return true;
}

std::ostream &operator<<(std::ostream &os, const OptionMap &map) {
  return os << map.optToJsonString();
}

} // namespace KOVA::Backup
