#ifndef KOVABACKUP_EXAMPLES_SESSION_RELAY_TREE_H
#define KOVABACKUP_EXAMPLES_SESSION_RELAY_TREE_H

/// @file Copies and compares directory trees, for session_relay. Failures throw std::runtime_error
/// with a message for the user.

#include <cstdint>
#include <string>

std::string readableSize(std::uintmax_t bytes);

/// The number and size of the files that were copied or compared.
struct Tally {
  std::size_t files = 0;
  std::uintmax_t bytes = 0;

  std::string text() const;
};

/// Copies the folders, regular files and links of a tree into the new folder copy. Everything else
/// is omitted, because it holds no data.
Tally copyTree(const std::string &tree, const std::string &copy);

/// Compares the size and content of every regular file. Fails if a file is missing in the copy or
/// exists only there.
Tally compareTrees(const std::string &tree, const std::string &copy);

#endif
