#include "platform/core/sz_hash.h"

#include "base/section_grammar.h"
#include "platform/support/failure.h"

#include <algorithm>
#include <memory>

using namespace KovaPlatform;

namespace {

constexpr const char *kFile = "core/sz_hash.cpp";
constexpr int kMaxReserved = 1 << 16; // the capacity is only a hint; more is not reserved

// Either stores the pair or leaves the hash unchanged. A pair that is missing from the index would
// be written to files, but could never be replaced.
void setValue(KLIBCSzHash &hash, std::string_view key, std::string_view value) {
  const auto found = hash.index.find(key);
  if (found != hash.index.end()) {
    found->second->value = value;
    return;
  }
  hash.pairs.push_back({std::string(key), std::string(value)});
  try {
    hash.index.emplace(hash.pairs.back().key, &hash.pairs.back());
  } catch (...) {
    hash.pairs.pop_back();
    throw;
  }
}

} // namespace

KLIBCSzHash *KLIBCSzHashAlloc(int capacity) {
  if (capacity < 0) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile}, nullptr);
  }
  return guarded({KLIBC_ERR_NO_MEMORY, kFile}, nullptr, [capacity] {
    auto hash = std::make_unique<KLIBCSzHash>();
    hash->index.reserve(static_cast<std::size_t>(std::min(capacity, kMaxReserved)));
    return hash.release();
  });
}

// Refuses what a section file cannot hold: here the caller still knows which pair is at fault, and
// when the file is written it does not. The interface takes the address of the handle because other
// platforms may reallocate; this hash never moves.
int KLIBCSzHashSetValue(KLIBCSzHash **hash, const char *key, const char *value) {
  if (hash == nullptr || *hash == nullptr || key == nullptr || value == nullptr) {
    return fail({KLIBC_ERR_BAD_PARAMETER, kFile});
  }
  if (!KOVA::Base::SectionGrammar::isStorableKey(key)) {
    return fail({KLIBC_ERR_BAD_KEY, kFile});
  }
  if (!KOVA::Base::SectionGrammar::isStorableValue(value)) {
    return fail({KLIBC_ERR_BAD_VALUE, kFile});
  }
  return guarded({KLIBC_ERR_NO_MEMORY, kFile}, -1, [&] {
    setValue(**hash, key, value);
    return 0;
  });
}

void KLIBCSzHashFree(KLIBCSzHash *hash) {
  delete hash;
}
