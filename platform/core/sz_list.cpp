#include "platform/core/sz_list.h"

#include "platform/support/failure.h"

#include <cstddef>
#include <memory>

using namespace KovaPlatform;

namespace {

constexpr const char *kFile = "core/sz_list.cpp";

// The public fields repeat what the vector holds, so every change of the vector ends here.
void publish(StringList &list) {
  list.capacity = static_cast<int32_t>(list.strings.capacity());
  list.count = static_cast<int32_t>(list.strings.size());
}

} // namespace

namespace KovaPlatform {

// A list with some of the texts would pass for the complete one.
bool appendAll(StringList &list, const std::function<bool(std::vector<std::string> &)> &add) {
  const std::size_t before = list.strings.size();
  bool added = false;
  try {
    added = add(list.strings);
  } catch (...) {
    list.strings.resize(before);
    publish(list);
    throw;
  }
  if (!added) {
    list.strings.resize(before);
  }
  publish(list);
  return added;
}

} // namespace KovaPlatform

// Callers read the capacity, so all of it is reserved; one that cannot be had fails the call.
KLIBCSzList *KLIBCSzListAlloc(int capacity) {
  if (capacity < 0) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile}, nullptr);
  }
  return guarded({KLIBC_ERR_NO_MEMORY, kFile}, nullptr, [capacity]() -> KLIBCSzList * {
    auto list = std::make_unique<StringList>();
    list->strings.reserve(static_cast<std::size_t>(capacity));
    publish(*list);
    return list.release();
  });
}

const char *KLIBCSzListGet(const KLIBCSzList *list, int index) {
  const auto *const own = static_cast<const StringList *>(list);
  if (own == nullptr || index < 0 || static_cast<std::size_t>(index) >= own->strings.size()) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile}, nullptr);
  }
  return own->strings[static_cast<std::size_t>(index)].c_str();
}

void KLIBCSzListFree(KLIBCSzList *list) {
  delete static_cast<StringList *>(list);
}
