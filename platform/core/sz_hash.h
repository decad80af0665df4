#ifndef KOVAPLATFORM_CORE_SZ_HASH_H
#define KOVAPLATFORM_CORE_SZ_HASH_H

/// @file The string hash that is opaque to callers: pairs in the order in which their keys were
/// first set, with an index by key.

#include "kovaplatform/kovacore.h"

#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>

struct KLIBCSzHash {
  struct Pair {
    std::string key;
    std::string value;
  };

  std::deque<Pair> pairs; // its elements never move, so the index may refer to their keys
  std::unordered_map<std::string_view, Pair *> index;
};

#endif
