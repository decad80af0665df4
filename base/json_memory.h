#ifndef KOVA_BASE_JSON_MEMORY_H
#define KOVA_BASE_JSON_MEMORY_H

/// @file Memory that runs out in the JSON library.
///
/// The library allocates the bytes of texts and keys with malloc and throws Json::RuntimeError when
/// that fails. A caller that is prepared for std::bad_alloc would not catch it:
///
///     JsonMemory::withBadAlloc([&] { values[key] = text; });
///
/// Failure: std::bad_alloc, and whatever else the call throws.
/// Threads: any.

#include <json/value.h>
#include <new>
#include <string_view>

namespace KOVA::Base::JsonMemory {

/// Whether the library reports that memory ran out. It uses the same type for a text that is nested
/// too deeply; only the message distinguishes them.
inline bool ranOut(const Json::Exception &error) {
  return std::string_view(error.what()).find("Failed to allocate") != std::string_view::npos;
}

/// Returns what call returns. Throws std::bad_alloc when the library reports that memory ran out.
template <typename Call>
decltype(auto) withBadAlloc(Call call) {
  try {
    return call();
  } catch (const Json::RuntimeError &error) {
    if (ranOut(error)) {
      throw std::bad_alloc();
    }
    throw;
  }
}

} // namespace KOVA::Base::JsonMemory

#endif
