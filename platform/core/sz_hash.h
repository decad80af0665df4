#ifndef KOVAPLATFORM_CORE_SZ_HASH_H
#define KOVAPLATFORM_CORE_SZ_HASH_H

/// @file What stands behind the opaque string hash: pairs in the order in which their keys were
/// first set, found by key at once.

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

  std::deque<Pair> pairs; // whose elements never move, so that the index may refer to their keys
  std::unordered_map<std::string_view, Pair *> index;
};

#endif
