#ifndef KOVABACKUP_TESTS_INSTALL_DECLARED_H
#define KOVABACKUP_TESTS_INSTALL_DECLARED_H

/// @file How the lists of the interface state what a header declares.

#include <type_traits>

namespace Interface {

/// Declared<type, &function> exists when the function has an overload of exactly that type.
template <typename Type, Type function>
struct Declared {};

template <typename Class>
struct IsNeitherCopiedNorMoved {
  static constexpr bool value =
      !std::is_copy_constructible<Class>::value && !std::is_copy_assignable<Class>::value &&
      !std::is_move_constructible<Class>::value && !std::is_move_assignable<Class>::value;
};

} // namespace Interface

#endif
