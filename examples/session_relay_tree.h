#ifndef KOVABACKUP_EXAMPLES_SESSION_RELAY_TREE_H
#define KOVABACKUP_EXAMPLES_SESSION_RELAY_TREE_H

/// @file Copies and compares directory trees, for session_relay. On failure the functions throw
/// std::runtime_error with a message for the user.

#include <cstdint>
#include <string>

std::string readableSize(std::uintmax_t bytes);

/// The number and size of the files that were copied or compared.
struct Tally {
  std::size_t files = 0;
  std::uintmax_t bytes = 0;

  std::string text() const; ///< "12 files, 3.4 MiB"
};

/// Copies the folders, regular files and links of tree to copy, which must not exist yet. Devices,
/// sockets and named pipes are skipped. Owners, times and the modes of folders are not kept.
/// Returns: the number and size of the files copied.
Tally copyTree(const std::string &tree, const std::string &copy);

/// Compares every regular file of tree with its counterpart in copy. Throws unless sizes and
/// contents are equal and copy holds no other regular file. Links and folders are not compared.
/// Returns: the number and size of the files compared.
Tally compareTrees(const std::string &tree, const std::string &copy);

#endif
