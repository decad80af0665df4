#ifndef KOVABACKUP_EXAMPLES_SESSION_RELAY_TREE_H
#define KOVABACKUP_EXAMPLES_SESSION_RELAY_TREE_H

/// @file Copying and comparing trees of files, for session_relay. Failures are thrown as
/// std::runtime_error with a text for people.

#include <cstdint>
#include <string>

std::string readableSize(std::uintmax_t bytes);

/// What was copied or compared.
struct Tally {
  std::size_t files = 0;
  std::uintmax_t bytes = 0;

  std::string text() const;
};

/// Copies the folders, regular files and links of a tree into the new folder copy; anything else
/// is no data.
Tally copyTree(const std::string &tree, const std::string &copy);

/// Compares every regular file, size and content, both ways: nothing is missing in the copy and
/// nothing was added.
Tally compareTrees(const std::string &tree, const std::string &copy);

#endif
